#include "fileindex/elastic/schema.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <map>
#include <string>
#include <vector>

#include "tests/support/sandbox.h"

namespace corvlumex {
namespace fileindex {
namespace elastic {
namespace {

// Every field in its fixed order.
const std::vector<std::string> kFields = {
    "CORVMDPath", "CORVMDFSName", "CORVMDPrivilege", "CORVMDIsDir", "CORVMDOwnerUserID", "CORVMDOwnerGroupID",
    "CORVMDFSSize", "CORVMDFSContentChangeDate", "CORVMDAttributeChangeDate", "CORVMDFSCreationDate",
    "CORVMDContentModificationDate", "CORVMDLastUsedDate", "CORVMDContentCreationDate", "CORVMDAuthors", "CORVMDTitle",
    "CORVMDAlbum", "CORVMDIdentifier", "CORVMDAudioTrackNumber", "CORVMDRecordingYear", "CORVMDCreator",
    "CORVMDMusicalGenre", "CORVMDComposer", "CORVMDComment", "CORVMDDurationSecond", "CORVMDAudioBitRate",
    "CORVMDTotalBitRate", "CORVMDVideoBitRate", "CORVMDAudioSampleRate", "CORVMDAudioChannelCount", "CORVMDISOSpeed",
    "CORVMDCodecs", "CORVMDDescription", "CORVMDAcquisitionMake", "CORVMDAcquisitionModel", "CORVMDExposureTimeString",
    "CORVMDAperture", "CORVMDResolutionWidthDPI", "CORVMDResolutionHeightDPI", "CORVMDMediaTypes", "CORVMDParent",
    "CORVMDExtension", "CORVMDTextContent", "CORVMDKeywords", "CORVMDFinderLabel", "CORVMDGroupId",
    "CORVMDFinderOpenDate", "CORVMDLogicalSize", "CORVMDPhysicalSize", "CORVMDDateAdded", "CORVMDSearchFileName",
    "CORVMDStarRating", "_CORVMDUserTags", "CORVMDSpotlightBoost", "CORVMDFSFileID",
    // Added after the original set: marks a file whose content could not be read.
    "CORVMDExtractionFailed", "CORVMDExtractionError",
    // Picture and film sizes in pixels, asked for by Finder searches.
    "CORVMDPixelWidth", "CORVMDPixelHeight"};

// What differs from the defaults, by kind: the type, the analyzer, and
// whether the field is left out of the catch-all "_all".
const std::map<std::string, std::vector<std::string>> kTypes = {
    {"bool", {"CORVMDIsDir", "CORVMDExtractionFailed"}},
    {"double", {"CORVMDDurationSecond"}},
    {"int", {"CORVMDFSSize", "CORVMDFSContentChangeDate", "CORVMDAttributeChangeDate", "CORVMDFSCreationDate",
             "CORVMDContentModificationDate", "CORVMDLastUsedDate", "CORVMDContentCreationDate", "CORVMDAudioTrackNumber",
             "CORVMDRecordingYear", "CORVMDAudioBitRate", "CORVMDTotalBitRate", "CORVMDVideoBitRate",
             "CORVMDAudioSampleRate", "CORVMDAudioChannelCount", "CORVMDISOSpeed", "CORVMDResolutionWidthDPI",
             "CORVMDResolutionHeightDPI", "CORVMDFinderLabel", "CORVMDFinderOpenDate", "CORVMDLogicalSize",
             "CORVMDPhysicalSize", "CORVMDDateAdded", "CORVMDPixelWidth", "CORVMDPixelHeight"}},
    {"text", {"CORVMDAuthors", "CORVMDTitle", "CORVMDAlbum", "CORVMDIdentifier", "CORVMDCreator", "CORVMDMusicalGenre",
              "CORVMDComposer", "CORVMDComment", "CORVMDCodecs", "CORVMDDescription", "CORVMDAcquisitionMake",
              "CORVMDAcquisitionModel", "CORVMDTextContent", "CORVMDSearchFileName", "_CORVMDUserTags",
              "CORVMDSpotlightBoost"}}};
const std::map<std::string, std::vector<std::string>> kAnalyzers = {
    {"keyword", {"CORVMDPath", "CORVMDFSName", "CORVMDPrivilege", "CORVMDOwnerUserID", "CORVMDOwnerGroupID",
                 "CORVMDIdentifier", "CORVMDExposureTimeString", "CORVMDAperture", "CORVMDMediaTypes", "CORVMDParent",
                 "CORVMDExtension", "CORVMDGroupId", "CORVMDStarRating", "CORVMDFSFileID",
                 "CORVMDExtractionError"}},
    {"white space", {"CORVMDAuthors", "CORVMDCreator", "CORVMDComposer", "CORVMDCodecs", "CORVMDAcquisitionMake",
                     "CORVMDAcquisitionModel", "CORVMDSearchFileName", "CORVMDSpotlightBoost"}}};
const std::vector<std::string> kNotInAll = {"CORVMDPath", "CORVMDFSName", "CORVMDPrivilege", "CORVMDIsDir",
                                            "CORVMDOwnerUserID", "CORVMDOwnerGroupID", "CORVMDIdentifier",
                                            "CORVMDParent", "CORVMDExtension", "CORVMDFSFileID",
                                            "CORVMDExtractionFailed", "CORVMDExtractionError"};

bool Has(const std::vector<std::string>& names, const std::string& name) {
  return std::find(names.begin(), names.end(), name) != names.end();
}

TEST(SchemaTest, MappingsHaveKeyFieldAndDefaultsSettingsAreEmptyAndTheHandlerFollowsTheRoot) {
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
  EXPECT_EQ(GetFileIndexSettings(), Json::Value(Json::objectValue));
  // Each call returns a fresh value.
  Json::Value changed = GetFileIndexMappings();
  changed["properties"].removeMember("CORVMDPath");
  EXPECT_TRUE(GetFileIndexMappings()["properties"].isMember("CORVMDPath"));
  // The event handler's path follows the system root.
  testing_support::Sandbox root;
  EXPECT_EQ(GetFileIndexEventHandler()["lib_path"],
            root.path() + "/var/packages/CorvLumex/target/handler/fileindex_event_handler.so");
  EXPECT_EQ(GetFileIndexEventHandler().size(), 1u);
}

TEST(SchemaTest, EveryFieldHoldsOnlyWhatDiffersFromTheDefault) {
  const Json::Value properties = GetFileIndexMappings()["properties"];
  ASSERT_EQ(properties.size(), kFields.size());
  for (const std::string& name : kFields) {
    SCOPED_TRACE(name);
    ASSERT_TRUE(properties.isMember(name));
    Json::Value expected(Json::objectValue);
    for (const auto& [type, names] : kTypes) {
      if (Has(names, name)) expected["type"] = type;
    }
    for (const auto& [analyzer, names] : kAnalyzers) {
      if (Has(names, name)) expected["analyzer"] = analyzer;
    }
    if (Has(kNotInAll, name)) expected["_all"] = false;
    if (name == "CORVMDPath") expected["required"] = true;
    if (name == "CORVMDSearchFileName") {
      // Lower-case first, then split into n-grams, so names match inside.
      expected["preprocess"].append("tolower");
      expected["preprocess"].append("ngram");
    }
    EXPECT_EQ(properties[name], expected);
  }
}

TEST(SchemaTest, SourceTextKeepsTheFieldOrder) {
  const std::string text = kFileIndexMappingsText;
  EXPECT_LT(text.find("\"property_id\""), text.find("\"default\""));
  size_t position = text.find("\"properties\"");
  ASSERT_NE(position, std::string::npos);
  for (const std::string& name : kFields) {
    const size_t found = text.find("\"" + name + "\"", position);
    ASSERT_NE(found, std::string::npos) << name;
    position = found;
  }
  EXPECT_NE(text.find("\n\t\"default\""), std::string::npos) << "tab-indented";
}

}  // namespace
}  // namespace elastic
}  // namespace fileindex
}  // namespace corvlumex
