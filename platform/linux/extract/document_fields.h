// The fields of an extracted document: their names and value types as the
// search index stores them. One table, so the library and the worker agree,
// and so a value of the wrong type never reaches the index.
#pragma once

#include <json/json.h>

#include <string>

namespace corvlumex {
namespace platform {
namespace extract {

enum class FieldType { kString, kText, kInt, kDouble, kBool };

// File-system fields, filled by the calling process from the file's status.
constexpr const char kFieldPath[] = "CORVMDPath";
constexpr const char kFieldParent[] = "CORVMDParent";
constexpr const char kFieldFSName[] = "CORVMDFSName";
constexpr const char kFieldDisplayName[] = "CORVMDDisplayName";
constexpr const char kFieldKind[] = "CORVMDKind";
constexpr const char kFieldExtension[] = "CORVMDExtension";
constexpr const char kFieldIsDir[] = "CORVMDIsDir";
constexpr const char kFieldPrivilege[] = "CORVMDPrivilege";
constexpr const char kFieldOwnerUserID[] = "CORVMDOwnerUserID";
constexpr const char kFieldOwnerGroupID[] = "CORVMDOwnerGroupID";
constexpr const char kFieldFSSize[] = "CORVMDFSSize";
constexpr const char kFieldLogicalSize[] = "CORVMDLogicalSize";
constexpr const char kFieldPhysicalSize[] = "CORVMDPhysicalSize";
constexpr const char kFieldContentChangeDate[] = "CORVMDFSContentChangeDate";
// Set when the file's content could not be read (parse error, time-out,
// crash): the document then holds the file-system fields only, so the file
// stays findable by name, path and metadata, and the reason is kept.
constexpr const char kFieldExtractionFailed[] = "CORVMDExtractionFailed";
constexpr const char kFieldExtractionError[] = "CORVMDExtractionError";
constexpr const char kFieldAttributeChangeDate[] = "CORVMDAttributeChangeDate";
constexpr const char kFieldCreationDate[] = "CORVMDFSCreationDate";
constexpr const char kFieldLastUsedDate[] = "CORVMDLastUsedDate";

// Content fields, filled by the extraction worker.
constexpr const char kFieldTextContent[] = "CORVMDTextContent";
constexpr const char kFieldMediaTypes[] = "CORVMDMediaTypes";
constexpr const char kFieldTitle[] = "CORVMDTitle";
constexpr const char kFieldAuthors[] = "CORVMDAuthors";
constexpr const char kFieldCreator[] = "CORVMDCreator";
constexpr const char kFieldDescription[] = "CORVMDDescription";
constexpr const char kFieldKeywords[] = "CORVMDKeywords";
constexpr const char kFieldIdentifier[] = "CORVMDIdentifier";
constexpr const char kFieldContentCreationDate[] = "CORVMDContentCreationDate";
constexpr const char kFieldContentModificationDate[] = "CORVMDContentModificationDate";
constexpr const char kFieldAlbum[] = "CORVMDAlbum";
constexpr const char kFieldComposer[] = "CORVMDComposer";
constexpr const char kFieldGenre[] = "CORVMDMusicalGenre";
constexpr const char kFieldComment[] = "CORVMDComment";
constexpr const char kFieldTrackNumber[] = "CORVMDAudioTrackNumber";
constexpr const char kFieldRecordingYear[] = "CORVMDRecordingYear";
constexpr const char kFieldDuration[] = "CORVMDDurationSecond";
constexpr const char kFieldAudioBitRate[] = "CORVMDAudioBitRate";
constexpr const char kFieldVideoBitRate[] = "CORVMDVideoBitRate";
constexpr const char kFieldTotalBitRate[] = "CORVMDTotalBitRate";
constexpr const char kFieldSampleRate[] = "CORVMDAudioSampleRate";
constexpr const char kFieldChannelCount[] = "CORVMDAudioChannelCount";
constexpr const char kFieldCodecs[] = "CORVMDCodecs";
constexpr const char kFieldMake[] = "CORVMDAcquisitionMake";
constexpr const char kFieldModel[] = "CORVMDAcquisitionModel";
constexpr const char kFieldISOSpeed[] = "CORVMDISOSpeed";
constexpr const char kFieldExposureTime[] = "CORVMDExposureTimeString";
constexpr const char kFieldAperture[] = "CORVMDAperture";
constexpr const char kFieldResolutionWidthDPI[] = "CORVMDResolutionWidthDPI";
constexpr const char kFieldResolutionHeightDPI[] = "CORVMDResolutionHeightDPI";
constexpr const char kFieldPixelWidth[] = "CORVMDPixelWidth";
constexpr const char kFieldPixelHeight[] = "CORVMDPixelHeight";

// True and `type` set when `name` is a field the worker may return.
bool ContentFieldType(const std::string& name, FieldType* type);

// True when `value` fits a field of `type` (an int field takes any integer
// that fits in 64 bits, a double field any number).
bool ValueFitsType(const Json::Value& value, FieldType type);

// Sets the picture's width and height in pixels when both are known (a
// format that does not say gives 0).
void SetPixelSize(Json::Value& fields, long width, long height);

}  // namespace extract
}  // namespace platform
}  // namespace corvlumex
