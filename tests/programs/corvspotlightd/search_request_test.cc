// The two body shapes Samba sends, byte for byte, and bodies that must be
// refused with a reason.
#include "programs/corvspotlightd/search_request.h"

#include <gtest/gtest.h>

#include <fstream>
#include <sstream>

namespace corvlumex {
namespace spotlightd {
namespace {

TEST(SearchRequestTest, ReadsSambasOldShapeByteForByte) {
  // Debian 12's Samba 4.17 for *=="samba*" on a share at /srv/share.
  const std::string body =
      "{    \"from\": 0,    \"size\": 50,    \"_source\": [\"path.real\"],    \"query\": {        \"query_string\": {"
      "            \"query\": \"(samba*) AND path.real.fulltext:\\\"/srv/share\\\"\"        }    }}";
  const SearchRequest request = ParseSearchRequest(body);
  EXPECT_EQ(request.from, 0);
  EXPECT_EQ(request.size, 50);
  EXPECT_EQ(request.query, "(samba*) AND path.real.fulltext:\"/srv/share\"");
  EXPECT_TRUE(request.fields.empty());
  EXPECT_EQ(request.scope, "");
}

TEST(SearchRequestTest, ReadsTheNewerBoolShape) {
  const SearchRequest request = ParseSearchRequest(R"({"from": 50, "size": 50, "_source": ["path.real"],
      "query": {"bool": {"filter": [{"prefix": {"path.real": "/srv/share/"}}],
                         "must": [{"query_string": {"query": "samba*", "fields": ["CORVMDFSName", "CORVMDTextContent"]}}]}}})");
  EXPECT_EQ(request.from, 50);
  EXPECT_EQ(request.query, "samba*");
  EXPECT_EQ(request.fields, (std::vector<std::string>{"CORVMDFSName", "CORVMDTextContent"}));
  EXPECT_EQ(request.scope, "/srv/share/");
}

TEST(SearchRequestTest, RefusesWhatSambaNeverSends) {
  const std::string deep = std::string(5000, '[') + std::string(5000, ']');
  const struct {
    std::string body;
    const char* named;
  } cases[] = {
      {"", "not valid JSON"},
      {"{\"query\": ", "not valid JSON"},
      {deep, "not valid JSON"},
      {"[1]", "must be a JSON object"},
      {R"({"from": 0})", "has no \"query\""},
      {R"({"query": {"match_all": {}}})", "not \"match_all\""},
      {R"({"query": {"query_string": {}}})", "has no \"query\""},
      {R"({"query": {"query_string": {"query": 5}}})", "must be a string"},
      {R"({"size": 1001, "query": {"query_string": {"query": "a"}}})", "\"size\" must be an integer from 0 to 1000"},
      {R"({"from": -1, "query": {"query_string": {"query": "a"}}})", "\"from\""},
      {R"({"from": "0", "query": {"query_string": {"query": "a"}}})", "\"from\""},
      {R"({"from": 99990, "size": 50, "query": {"query_string": {"query": "a"}}})", "must not pass 100000"},
      {R"({"query": {"bool": {"should": []}}})", "\"bool.should\" is not supported"},
      {R"({"query": {"bool": {"must": [{"query_string": {"query": "a"}}, {"query_string": {"query": "b"}}]}}})",
       "exactly one clause"},
      {R"({"query": {"bool": {"must": [{"query_string": {"query": "a", "fields": "x"}}]}}})", "list of field names"},
      {R"({"query": {"bool": {"must": [{"query_string": {"query": "a"}}], "filter": [{"prefix": {"path.real": "x"}}]}}})",
       "absolute folder"},
      {R"({"query": {"query_string": {"query": "a"}}, "query": {}})", "not valid JSON"},
  };
  for (const auto& test : cases) {
    try {
      ParseSearchRequest(test.body);
      ADD_FAILURE() << test.body.substr(0, 80) << " was accepted";
    } catch (const SearchRequestError& error) {
      EXPECT_NE(std::string(error.what()).find(test.named), std::string::npos)
          << test.body.substr(0, 80) << ": " << error.what();
    }
  }
}

}  // namespace
}  // namespace spotlightd
}  // namespace corvlumex
