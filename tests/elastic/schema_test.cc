#include "fileindex/elastic/schema.h"

#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "tests/support/log_capture.h"

namespace corvlumex {
namespace fileindex {
namespace elastic {
namespace {

struct Field {
  const char* name;
  const char* type;      // nullptr: the default "string"
  const char* analyzer;  // nullptr: the default "corvstandard"
  bool in_all;
};

// Every field in its fixed order, with what differs from the defaults.
const std::vector<Field>& ExpectedFields() {
  static const std::vector<Field> fields = {
      {"CORVMDPath", nullptr, "keyword", false},
      {"CORVMDFSName", nullptr, "keyword", false},
      {"CORVMDPrivilege", nullptr, "keyword", false},
      {"CORVMDIsDir", "bool", nullptr, false},
      {"CORVMDOwnerUserID", nullptr, "keyword", false},
      {"CORVMDOwnerGroupID", nullptr, "keyword", false},
      {"CORVMDFSSize", "int", nullptr, true},
      {"CORVMDFSContentChangeDate", "int", nullptr, true},
      {"CORVMDAttributeChangeDate", "int", nullptr, true},
      {"CORVMDFSCreationDate", "int", nullptr, true},
      {"CORVMDContentModificationDate", "int", nullptr, true},
      {"CORVMDLastUsedDate", "int", nullptr, true},
      {"CORVMDContentCreationDate", "int", nullptr, true},
      {"CORVMDAuthors", "text", "white space", true},
      {"CORVMDTitle", "text", nullptr, true},
      {"CORVMDAlbum", "text", nullptr, true},
      {"CORVMDIdentifier", "text", "keyword", false},
      {"CORVMDAudioTrackNumber", "int", nullptr, true},
      {"CORVMDRecordingYear", "int", nullptr, true},
      {"CORVMDCreator", "text", "white space", true},
      {"CORVMDMusicalGenre", "text", nullptr, true},
      {"CORVMDComposer", "text", "white space", true},
      {"CORVMDComment", "text", nullptr, true},
      {"CORVMDDurationSecond", "double", nullptr, true},
      {"CORVMDAudioBitRate", "int", nullptr, true},
      {"CORVMDTotalBitRate", "int", nullptr, true},
      {"CORVMDVideoBitRate", "int", nullptr, true},
      {"CORVMDAudioSampleRate", "int", nullptr, true},
      {"CORVMDAudioChannelCount", "int", nullptr, true},
      {"CORVMDISOSpeed", "int", nullptr, true},
      {"CORVMDCodecs", "text", "white space", true},
      {"CORVMDDescription", "text", nullptr, true},
      {"CORVMDAcquisitionMake", "text", "white space", true},
      {"CORVMDAcquisitionModel", "text", "white space", true},
      {"CORVMDExposureTimeString", nullptr, "keyword", true},
      {"CORVMDAperture", nullptr, "keyword", true},
      {"CORVMDResolutionWidthDPI", "int", nullptr, true},
      {"CORVMDResolutionHeightDPI", "int", nullptr, true},
      {"CORVMDMediaTypes", nullptr, "keyword", true},
      {"CORVMDParent", nullptr, "keyword", false},
      {"CORVMDExtension", nullptr, "keyword", false},
      {"CORVMDTextContent", "text", nullptr, true},
      {"CORVMDKeywords", nullptr, nullptr, true},
      {"CORVMDFinderLabel", "int", nullptr, true},
      {"CORVMDGroupId", nullptr, "keyword", true},
      {"CORVMDFinderOpenDate", "int", nullptr, true},
      {"CORVMDLogicalSize", "int", nullptr, true},
      {"CORVMDPhysicalSize", "int", nullptr, true},
      {"CORVMDDateAdded", "int", nullptr, true},
      {"CORVMDSearchFileName", "text", "white space", true},
      {"CORVMDStarRating", nullptr, "keyword", true},
      {"_CORVMDUserTags", "text", nullptr, true},
      {"CORVMDSpotlightBoost", "text", "white space", true},
  };
  return fields;
}

TEST(SchemaTest, MappingsHaveKeyFieldAndDefaults) {
  const Json::Value mappings = GetFileIndexMappings();
  EXPECT_EQ(mappings["property_id"].asString(), "CORVMDPath");
  Json::Value defaults(Json::objectValue);
  defaults["type"] = "string";
  defaults["analyzer"] = "corvstandard";
  defaults["required"] = false;
  defaults["stored"] = true;
  defaults["_all"] = true;
  EXPECT_EQ(mappings["default"], defaults);
  EXPECT_EQ(mappings.size(), 3u);
}

TEST(SchemaTest, EveryFieldHoldsOnlyWhatDiffersFromTheDefault) {
  const Json::Value properties = GetFileIndexMappings()["properties"];
  ASSERT_EQ(properties.size(), 53u);
  for (const Field& field : ExpectedFields()) {
    SCOPED_TRACE(field.name);
    ASSERT_TRUE(properties.isMember(field.name));
    Json::Value expected(Json::objectValue);
    if (field.type) expected["type"] = field.type;
    if (field.analyzer) expected["analyzer"] = field.analyzer;
    if (!field.in_all) expected["_all"] = false;
    if (std::string(field.name) == "CORVMDPath") expected["required"] = true;
    if (std::string(field.name) == "CORVMDSearchFileName") {
      // Lower-case first, then split into n-grams, so names match inside.
      expected["preprocess"].append("tolower");
      expected["preprocess"].append("ngram");
    }
    EXPECT_EQ(properties[field.name], expected);
  }
}

TEST(SchemaTest, SourceTextKeepsTheFieldOrder) {
  const std::string text = kFileIndexMappingsText;
  EXPECT_LT(text.find("\"property_id\""), text.find("\"default\""));
  size_t position = text.find("\"properties\"");
  ASSERT_NE(position, std::string::npos);
  for (const Field& field : ExpectedFields()) {
    const size_t found = text.find("\"" + std::string(field.name) + "\"", position);
    ASSERT_NE(found, std::string::npos) << field.name;
    position = found;
  }
  EXPECT_NE(text.find("\n\t\"default\""), std::string::npos) << "tab-indented";
}

TEST(SchemaTest, SettingsAreAnEmptyObject) {
  const Json::Value settings = GetFileIndexSettings();
  EXPECT_TRUE(settings.isObject());
  EXPECT_EQ(settings.size(), 0u);
}

TEST(SchemaTest, EventHandlerPathFollowsTheSystemRoot) {
  testing_support::SandboxRoot root;
  const Json::Value handler = GetFileIndexEventHandler();
  EXPECT_EQ(handler.size(), 1u);
  EXPECT_EQ(handler["lib_path"].asString(),
            root.path() + "/var/packages/CorvLumex/target/handler/fileindex_event_handler.so");
}

TEST(SchemaTest, EachCallReturnsAFreshValue) {
  Json::Value first = GetFileIndexMappings();
  first["properties"].removeMember("CORVMDPath");
  EXPECT_TRUE(GetFileIndexMappings()["properties"].isMember("CORVMDPath"));
}

}  // namespace
}  // namespace elastic
}  // namespace fileindex
}  // namespace corvlumex
