// The vocabulary of a search document: the names of the fields the index
// stores for every file, folder and extracted content. The library writes
// them, the extraction worker fills them, corvelasticd ranks and highlights
// by some of them and the front ends ask for them by name, so each name is
// spelled once, here. The mappings sent when an index is created
// (fileindex/elastic/schema.cc) list them all with their types; the
// extraction worker's table of value types is platform/linux/extract/document_fields.h.
#pragma once

#include <json/json.h>

#include <string>

#include "common/export.h"

CORVLUMEX_API_BEGIN

namespace corvlumex {

// File-system fields, filled by the indexing process from the file's status.
inline constexpr char kFieldPath[] = "CORVMDPath";  // the full path: the document's key
inline constexpr char kFieldParent[] = "CORVMDParent";
inline constexpr char kFieldFSName[] = "CORVMDFSName";
// The name again, for substring searches (an n-gram field).
inline constexpr char kFieldSearchFileName[] = "CORVMDSearchFileName";
inline constexpr char kFieldDisplayName[] = "CORVMDDisplayName";
inline constexpr char kFieldKind[] = "CORVMDKind";
inline constexpr char kFieldExtension[] = "CORVMDExtension";
inline constexpr char kFieldIsDir[] = "CORVMDIsDir";
inline constexpr char kFieldPrivilege[] = "CORVMDPrivilege";
inline constexpr char kFieldOwnerUserID[] = "CORVMDOwnerUserID";
inline constexpr char kFieldOwnerGroupID[] = "CORVMDOwnerGroupID";
inline constexpr char kFieldFSSize[] = "CORVMDFSSize";
inline constexpr char kFieldLogicalSize[] = "CORVMDLogicalSize";
inline constexpr char kFieldPhysicalSize[] = "CORVMDPhysicalSize";
inline constexpr char kFieldContentChangeDate[] = "CORVMDFSContentChangeDate";
inline constexpr char kFieldAttributeChangeDate[] = "CORVMDAttributeChangeDate";
inline constexpr char kFieldCreationDate[] = "CORVMDFSCreationDate";
inline constexpr char kFieldLastUsedDate[] = "CORVMDLastUsedDate";
// "<device>:<inode>" of a file: the names of one file (hard links) share it.
inline constexpr char kFieldFileID[] = "CORVMDFSFileID";
// Set when the file's content could not be read (parse error, time-out,
// crash): the document then holds the file-system fields only, so the file
// stays findable by name, path and metadata, and the reason is kept.
inline constexpr char kFieldExtractionFailed[] = "CORVMDExtractionFailed";
inline constexpr char kFieldExtractionError[] = "CORVMDExtractionError";

// Content fields, filled by the extraction worker.
inline constexpr char kFieldTextContent[] = "CORVMDTextContent";
inline constexpr char kFieldMediaTypes[] = "CORVMDMediaTypes";
inline constexpr char kFieldTitle[] = "CORVMDTitle";
inline constexpr char kFieldAuthors[] = "CORVMDAuthors";
inline constexpr char kFieldCreator[] = "CORVMDCreator";
inline constexpr char kFieldDescription[] = "CORVMDDescription";
inline constexpr char kFieldKeywords[] = "CORVMDKeywords";
inline constexpr char kFieldIdentifier[] = "CORVMDIdentifier";
inline constexpr char kFieldContentCreationDate[] = "CORVMDContentCreationDate";
inline constexpr char kFieldContentModificationDate[] = "CORVMDContentModificationDate";
inline constexpr char kFieldAlbum[] = "CORVMDAlbum";
inline constexpr char kFieldComposer[] = "CORVMDComposer";
inline constexpr char kFieldGenre[] = "CORVMDMusicalGenre";
inline constexpr char kFieldComment[] = "CORVMDComment";
inline constexpr char kFieldTrackNumber[] = "CORVMDAudioTrackNumber";
inline constexpr char kFieldRecordingYear[] = "CORVMDRecordingYear";
inline constexpr char kFieldDuration[] = "CORVMDDurationSecond";
inline constexpr char kFieldAudioBitRate[] = "CORVMDAudioBitRate";
inline constexpr char kFieldVideoBitRate[] = "CORVMDVideoBitRate";
inline constexpr char kFieldTotalBitRate[] = "CORVMDTotalBitRate";
inline constexpr char kFieldSampleRate[] = "CORVMDAudioSampleRate";
inline constexpr char kFieldChannelCount[] = "CORVMDAudioChannelCount";
inline constexpr char kFieldCodecs[] = "CORVMDCodecs";
inline constexpr char kFieldMake[] = "CORVMDAcquisitionMake";
inline constexpr char kFieldModel[] = "CORVMDAcquisitionModel";
inline constexpr char kFieldISOSpeed[] = "CORVMDISOSpeed";
inline constexpr char kFieldExposureTime[] = "CORVMDExposureTimeString";
inline constexpr char kFieldAperture[] = "CORVMDAperture";
inline constexpr char kFieldResolutionWidthDPI[] = "CORVMDResolutionWidthDPI";
inline constexpr char kFieldResolutionHeightDPI[] = "CORVMDResolutionHeightDPI";
inline constexpr char kFieldPixelWidth[] = "CORVMDPixelWidth";
inline constexpr char kFieldPixelHeight[] = "CORVMDPixelHeight";

// Names a query uses besides the stored fields: the catch-all field (every
// field whose mapping has "_all" true), and the two orders a search may be
// sorted by that are not fields (relevance, and the document key).
inline constexpr char kFieldAll[] = "_all";
inline constexpr char kSortByScore[] = "_score";
inline constexpr char kSortByKey[] = "_key";

// Sets the fields a document takes from its full path alone: the path, the
// parent folder, the name (stored and shown) and the lower-case extension,
// which is also the kind. The extraction writes them with the other
// file-system fields and a rename writes them on their own, through this one
// function, so a document reads the same however it was last touched.
void SetNameFields(const std::string& path, Json::Value& document);

}  // namespace corvlumex

CORVLUMEX_API_END
