// The Samba include of the Spotlight switch: what Samba is told, and what the
// switch reads back from it.
#include "platform/linux/spotlight_config.h"

#include <gtest/gtest.h>

namespace corvlumex {
namespace platform {
namespace {

std::string IndexOf(const std::string& share) { return "fileindex_" + share; }

TEST(SpotlightConfigTest, OnNamesTheResponderOurMappingsAndEachIndexedShare) {
  const std::string text = WriteSpotlightConfig(SpotlightConfig{true, {"music", "photo"}}, IndexOf);
  for (const char* line :
       {"[global]\n\tspotlight backend = elasticsearch\n", "\telasticsearch:address = 127.0.0.1\n",
        "\telasticsearch:port = 9210\n", "\telasticsearch:mappings = /",
        "[photo]\n\tspotlight = yes\n\tspotlight backend = elasticsearch\n\telasticsearch:index = fileindex_photo\n",
        "[music]\n\tspotlight = yes\n"}) {
    EXPECT_NE(text.find(line), std::string::npos) << line << " is missing from\n" << text;
  }
  EXPECT_NE(text.find("spotlight_mappings.json\n"), std::string::npos);
  const SpotlightConfig read = ReadSpotlightConfig(text);
  EXPECT_TRUE(read.enabled);
  EXPECT_EQ(read.shares, (std::vector<std::string>{"music", "photo"}));
}

TEST(SpotlightConfigTest, OffKeepsTheSharesWithSpotlightOff) {
  const std::string text = WriteSpotlightConfig(SpotlightConfig{false, {"photo"}}, IndexOf);
  EXPECT_NE(text.find("[global]\n\tspotlight backend = noindex\n"), std::string::npos);
  EXPECT_NE(text.find("[photo]\n\tspotlight = no\n\tspotlight backend = noindex\n"), std::string::npos);
  const SpotlightConfig read = ReadSpotlightConfig(text);
  EXPECT_FALSE(read.enabled);
  EXPECT_EQ(read.shares, std::vector<std::string>{"photo"});
}

TEST(SpotlightConfigTest, ReadsWhatAnAdministratorMayHaveWritten) {
  EXPECT_FALSE(ReadSpotlightConfig("").enabled);
  EXPECT_FALSE(ReadSpotlightConfig("[global]\n  spotlight = yes\n").enabled);
  EXPECT_TRUE(ReadSpotlightConfig("[Global]\n  Spotlight  Backend =  ElasticSearch \n").enabled);
  EXPECT_FALSE(ReadSpotlightConfig("[photo]\n spotlight backend = elasticsearch\n").enabled);
}

TEST(SpotlightConfigTest, IndexNamesAreSafeInSambasUrl) {
  EXPECT_EQ(SpotlightIndexName("fileindex_photo-2.x"), "fileindex_photo-2.x");
  EXPECT_EQ(SpotlightIndexName("fileindex_my photos"), "_all");
  EXPECT_EQ(SpotlightIndexName("fileindex_a/b"), "_all");
  EXPECT_EQ(SpotlightIndexName(""), "_all");
  EXPECT_TRUE(CanBeSectionName("my photos"));
  EXPECT_FALSE(CanBeSectionName("a]b"));
  EXPECT_FALSE(CanBeSectionName("a\nb"));
  EXPECT_FALSE(CanBeSectionName("global"));
  EXPECT_FALSE(CanBeSectionName(" padded"));
}

}  // namespace
}  // namespace platform
}  // namespace corvlumex
