#include "platform/linux/extract/document_fields.h"

#include <cstring>

namespace corvlumex {
namespace platform {
namespace extract {
namespace {

struct ContentField {
  const char* name;
  FieldType type;
};

// Types as the index mappings declare them.
constexpr ContentField kContentFields[] = {
    {kFieldTextContent, FieldType::kText},
    {kFieldMediaTypes, FieldType::kString},
    {kFieldTitle, FieldType::kText},
    {kFieldAuthors, FieldType::kText},
    {kFieldCreator, FieldType::kText},
    {kFieldDescription, FieldType::kText},
    {kFieldKeywords, FieldType::kString},
    {kFieldIdentifier, FieldType::kText},
    {kFieldContentCreationDate, FieldType::kInt},
    {kFieldContentModificationDate, FieldType::kInt},
    {kFieldAlbum, FieldType::kText},
    {kFieldComposer, FieldType::kText},
    {kFieldGenre, FieldType::kText},
    {kFieldComment, FieldType::kText},
    {kFieldTrackNumber, FieldType::kInt},
    {kFieldRecordingYear, FieldType::kInt},
    {kFieldDuration, FieldType::kDouble},
    {kFieldAudioBitRate, FieldType::kInt},
    {kFieldVideoBitRate, FieldType::kInt},
    {kFieldTotalBitRate, FieldType::kInt},
    {kFieldSampleRate, FieldType::kInt},
    {kFieldChannelCount, FieldType::kInt},
    {kFieldCodecs, FieldType::kText},
    {kFieldMake, FieldType::kText},
    {kFieldModel, FieldType::kText},
    {kFieldISOSpeed, FieldType::kInt},
    {kFieldExposureTime, FieldType::kString},
    {kFieldAperture, FieldType::kString},
    {kFieldResolutionWidthDPI, FieldType::kInt},
    {kFieldResolutionHeightDPI, FieldType::kInt},
    {kFieldPixelWidth, FieldType::kInt},
    {kFieldPixelHeight, FieldType::kInt},
};

}  // namespace

bool ContentFieldType(const std::string& name, FieldType* type) {
  for (const ContentField& field : kContentFields) {
    if (name == field.name) {
      *type = field.type;
      return true;
    }
  }
  return false;
}

bool ValueFitsType(const Json::Value& value, FieldType type) {
  switch (type) {
    case FieldType::kString:
    case FieldType::kText:
      return value.isString();
    case FieldType::kInt:
      return value.isInt64() || (value.isUInt64() && value.asUInt64() <= INT64_MAX);
    case FieldType::kDouble:
      return value.isNumeric() && !value.isBool();
    case FieldType::kBool:
      return value.isBool();
  }
  return false;
}

void SetPixelSize(Json::Value& fields, long width, long height) {
  if (width <= 0 || height <= 0) return;
  fields[kFieldPixelWidth] = static_cast<Json::Int64>(width);
  fields[kFieldPixelHeight] = static_cast<Json::Int64>(height);
}

}  // namespace extract
}  // namespace platform
}  // namespace corvlumex
