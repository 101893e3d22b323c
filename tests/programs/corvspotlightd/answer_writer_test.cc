// The answer Samba reads: exact total, _source.path.real only, never over
// the 409,600 bytes its HTTP client accepts, always valid UTF-8.
#include "programs/corvspotlightd/answer_writer.h"

#include <gtest/gtest.h>

#include "common/json_util.h"
#include "tests/support/sandbox.h"

namespace corvlumex {
namespace spotlightd {
namespace {

using testing_support::JsonOf;

TEST(AnswerWriterTest, CarriesTheTotalAndEachPath) {
  const Json::Value answer =
      JsonOf(WriteSearchAnswer("fileindex_share", 7, {"/srv/share/a.txt", "/srv/share/sub/b c.pdf"}, 3));
  EXPECT_EQ(answer["hits"]["total"]["value"].asInt64(), 7);
  EXPECT_EQ(answer["hits"]["total"]["relation"].asString(), "eq");
  ASSERT_EQ(answer["hits"]["hits"].size(), 2u);
  EXPECT_EQ(answer["hits"]["hits"][1]["_source"]["path"]["real"].asString(), "/srv/share/sub/b c.pdf");
  EXPECT_EQ(answer["hits"]["hits"][0]["_source"].getMemberNames(), std::vector<std::string>{"path"});
}

TEST(AnswerWriterTest, APageStaysUnderSambasBodyLimit) {
  // Control characters are written as \u00XX: six bytes each.
  const std::vector<std::string> paths(50, "/srv/share/" + std::string(4000, '\x01'));
  const std::string text = WriteSearchAnswer("fileindex_share", 50, paths, 1);
  EXPECT_LE(text.size(), kMaxAnswerBytes);
  const Json::Value answer = JsonOf(text);
  EXPECT_GT(answer["hits"]["hits"].size(), 0u);
  EXPECT_LT(answer["hits"]["hits"].size(), 50u);
  EXPECT_EQ(answer["hits"]["total"]["value"].asInt64(), 50);
}

TEST(AnswerWriterTest, LeavesOutPathsThatAreNotUtf8) {
  const std::vector<std::string> paths = {"/s/caf\xc3\xa9", "/s/latin1-\xe9", "/s/overlong-\xc0\xaf",
                                          "/s/surrogate-\xed\xa0\x80", "/s/\xf0\x9f\x93\x84.txt"};
  const Json::Value answer = JsonOf(WriteSearchAnswer("i", 5, paths, 0));
  ASSERT_EQ(answer["hits"]["hits"].size(), 2u);
  EXPECT_EQ(answer["hits"]["hits"][0]["_source"]["path"]["real"].asString(), paths[0]);
  EXPECT_EQ(answer["hits"]["hits"][1]["_source"]["path"]["real"].asString(), paths[4]);
}

}  // namespace
}  // namespace spotlightd
}  // namespace corvlumex
