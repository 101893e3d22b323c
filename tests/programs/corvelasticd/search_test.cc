// The "search" command in-process over two indexes: merged order, paging,
// the fields and snippets it returns, and the request members it refuses.
#include <gtest/gtest.h>

#include "programs/corvelasticd/daemon_error.h"
#include "programs/corvelasticd/search.h"
#include "tests/support/sandbox.h"

namespace corvlumex {
namespace elasticd {
namespace {

using testing_support::JsonOf;
class SearchTest : public ::testing::Test {
 protected:
  SearchTest() {
    registry_.Start();
    const Json::Value mappings = JsonOf(R"({"property_id": "path", "properties": {
        "path": {"analyzer": "keyword", "_all": false}, "size": {"type": "int"}, "secret": {"stored": false},
        "CORVMDTextContent": {"type": "text"}}})");
    for (const auto& [id, sizes] : {std::pair<std::string, std::vector<int>>{"one", {5, 1, 3}}, {"two", {4, 2}}}) {
      registry_.Create(id, root_.path() + "/" + id, mappings, Json::Value(Json::objectValue), Json::Value());
      WriterTurn turn(registry_.Get(id), true, 8);
      for (const int size : sizes) {
        const std::string path = "/" + id + "/" + std::to_string(size);
        turn.store().Upsert(path, JsonOf(R"({"path": ")" + path + R"(", "size": )" + std::to_string(size) +
                                         R"(, "secret": "s", "CORVMDTextContent": "a long text about size )" +
                                         std::to_string(size) + R"( and more"})"));
      }
      turn.store().Commit();
    }
  }
  ~SearchTest() override { registry_.Shutdown(); }

  Json::Value Run(const std::string& data) { return RunSearch(registry_, JsonOf(data), AccessFilter(root_peer_)); }
  std::vector<std::string> HitIds(const std::string& data) {
    std::vector<std::string> ids;
    const Json::Value answer = Run(data);  // alive while its hits are read
    for (const Json::Value& hit : answer["hits"]) ids.push_back(hit["doc_id"].asString());
    return ids;
  }

  testing_support::Sandbox root_{false};
  IndexRegistry registry_{root_.path() + "/registry.json", 0};
  PeerIdentity root_peer_{0, 0, 0, {}};
};

using Ids = std::vector<std::string>;

TEST_F(SearchTest, HitsOfSeveralIndexesMergeIntoOneOrderAndPage) {
  const std::string both = R"("ids": ["one", "two", "one"])";
  EXPECT_EQ(HitIds("{" + both + R"(, "sort": {"field": "size", "order": "desc"}})"), (Ids{"/one/5", "/two/4", "/one/3", "/two/2", "/one/1"}));
  EXPECT_EQ(HitIds("{" + both + R"(, "sort": "size", "from": 1, "size": 2})"), (Ids{"/two/2", "/one/3"}));
  EXPECT_EQ(HitIds(R"({"sort": ["_key"], "size": 3})"), (Ids{"/one/1", "/one/3", "/one/5"}));
  // Equal scores (texts of one length) come in key order, on every page.
  EXPECT_EQ(HitIds(R"({"id": "one", "query": {"qsl": {"match": {"_all": "text"}}},
                       "from": 1, "size": 2})"),
            (Ids{"/one/3", "/one/5"}));
  // An index named 100,000 times is searched once.
  std::string many_ids = R"({"ids": [)";
  for (int i = 0; i < 100000; ++i) many_ids += R"("two", )";
  EXPECT_EQ(HitIds(many_ids + R"("two"], "sort": "_key"})"), (Ids{"/two/2", "/two/4"}));
  EXPECT_EQ(HitIds(R"({"id": "two", "query": {"qsl": {"range": {"size": {"gte": 3}}}}})"), Ids{"/two/4"});
  const Json::Value answer = Run(R"({"id": "one", "size": 1, "load_field": ["size", "secret"], "track_total": true,
                                     "query": {"qsl": {"match": {"CORVMDTextContent": "size 3"}}},
                                     "highlight": {"size": 20, "pre": "[", "post": "]"}})");
  EXPECT_EQ(answer["total"], 1);
  EXPECT_TRUE(answer["total_exact"].asBool());
  EXPECT_EQ(answer["hits"][0]["index"], "one");
  EXPECT_EQ(answer["hits"][0]["fields"], JsonOf(R"({"size": 3})"));  // unstored fields never leave
  EXPECT_NE(answer["hits"][0]["highlight"].asString().find("[size] [3]"), std::string::npos) << answer;
}

TEST_F(SearchTest, BadMembersAreRefusedByName) {
  std::string many_fields;
  for (int i = 0; i < 257; ++i) many_fields += std::string(i > 0 ? ", " : "") + "\"f" + std::to_string(i) + "\"";
  const std::pair<std::string, std::string> cases[] = {
      {R"({"size": -1})", "\"size\" must be 0..1000 and \"from\" at least 0"},
      {R"({"size": 1001})", "\"size\" must be 0..1000 and \"from\" at least 0"},
      {R"({"from": -1})", "\"size\" must be 0..1000 and \"from\" at least 0"},
      {R"({"from": 9223372036854775807, "size": 10})", "\"from\" + \"size\" must not exceed 100000"},
      {R"({"from": 99995, "size": 10})", "\"from\" + \"size\" must not exceed 100000"},
      {R"({"size": "10"})", "\"size\" must be an integer"},
      {R"({"size": 1e300})", "\"size\" must be an integer"},
      {R"({"sort": {"field": "size", "order": "up"}})", "\"order\" must be \"asc\" or \"desc\""},
      {R"({"sort": {"field": "size", "order": []}})", "\"order\" must be \"asc\" or \"desc\""},
      {R"({"sort": 5})", "\"sort\" must be a field name or {\"field\", \"order\"}"},
      {R"({"sort": "nope"})", "Cannot sort by the unknown field \"nope\""},
      {R"({"ids": "one"})", "\"ids\" must be an array of index ids"},
      {R"({"ids": ["one", 2]})", "\"ids\" must be an array of index ids"},
      {R"({"id": 5})", "\"id\" must be a string"},
      {R"({"query": "x"})", "\"query\" must be an object {\"qsl\": ...}"},
      {R"({"highlight": 5})", "\"highlight\" must be true or {\"field\", \"size\", \"pre\", \"post\"}"},
      {R"({"highlight": {"pre": ")" + std::string(65, '<') + R"("}})", "\"pre\" and \"post\" may be 64 bytes at most"},
      {R"({"load_field": [)" + many_fields + "]}", "\"load_field\" names more than 256 fields"},
  };
  for (const auto& [data, message] : cases) {
    try {
      Run(data);
      ADD_FAILURE() << "accepted: " << data;
    } catch (const DaemonError& error) {
      EXPECT_EQ(error.code(), kCodeBadArgument) << data;
      EXPECT_EQ(error.what(), message) << data;
    }
  }
  try {
    Run(R"({"id": "three"})");
    ADD_FAILURE() << "an unknown index was searched";
  } catch (const DaemonError& error) {
    EXPECT_EQ(error.code(), kCodeIndexNotFound);
  }
}

}  // namespace
}  // namespace elasticd
}  // namespace corvlumex
