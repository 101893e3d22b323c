#include "fileindex/elastic/schema.h"

#include <gtest/gtest.h>

#include <string>

#include "common/json_util.h"
#include "tests/support/child_process.h"
#include "tests/support/sandbox.h"

namespace corvlumex {
namespace fileindex {
namespace elastic {
namespace {

// The mappings are a contract with corvelasticd and with indexes built by
// earlier versions: every field, its type, analyzer and "_all", in a fixed
// order so that two builds send the same text. data/file_index_mappings.json
// is that text; a change to it is a change of the index format.
TEST(SchemaTest, MappingsAreTheAgreedTextSettingsAreEmptyAndTheHandlerFollowsTheRoot) {
  const std::string golden = testing_support::ReadFileText(
      FILEINDEX_SOURCE_DIR "/tests/fileindex/elastic/data/file_index_mappings.json");
  EXPECT_EQ(std::string(kFileIndexMappingsText) + "\n", golden);
  Json::Value parsed;
  ASSERT_TRUE(JsonFromString(parsed, golden));
  EXPECT_EQ(GetFileIndexMappings(), parsed);
  EXPECT_EQ(GetFileIndexSettings(), Json::Value(Json::objectValue));
  // Each call returns a fresh value.
  Json::Value changed = GetFileIndexMappings();
  changed["properties"].removeMember("CORVMDPath");
  EXPECT_TRUE(GetFileIndexMappings()["properties"].isMember("CORVMDPath"));
  // The event handler's path follows the system root.
  testing_support::Sandbox root;
  const std::string handler = "/var/packages/CorvLumex/target/handler/fileindex_event_handler.so";
  EXPECT_EQ(GetFileIndexEventHandler(),
            testing_support::JsonOf(R"({"lib_path": ")" + root.path() + handler + R"("})"));
}

}  // namespace
}  // namespace elastic
}  // namespace fileindex
}  // namespace corvlumex
