// One index in-process: what the writer sees before a commit and readers
// after it, key moves, refused documents that leave nothing behind, the order
// and count of search hits, and suggestions.
#include <gtest/gtest.h>

#include "programs/corvelasticd/daemon_error.h"
#include "programs/corvelasticd/index_store.h"
#include "tests/support/sandbox.h"

namespace corvlumex {
namespace elasticd {
namespace {

using testing_support::JsonOf;
class IndexStoreTest : public ::testing::Test {
 protected:
  IndexStoreTest()
      : store_(IndexStore::Create(root_.path() + "/index", JsonOf(R"({"property_id": "path", "properties": {
            "path": {"analyzer": "keyword", "required": true, "_all": false}, "kind": {"analyzer": "keyword", "_all": false},
            "name": {"type": "text", "preprocess": ["tolower", "ngram"]}, "body": {"type": "text"},
            "size": {"type": "int"}, "isdir": {"type": "bool", "_all": false}}})"),
                                  Json::Value(Json::objectValue))) {}

  Query Q(const std::string& qsl) const { return Query::Parse(JsonOf(qsl), store_->schema()); }
  void Put(const std::string& path, const std::string& extra = "{}") {
    Json::Value document = JsonOf(extra);
    document["path"] = path;
    document["name"] = path.substr(path.rfind('/') + 1);
    store_->Upsert(path, document);
  }
  std::vector<std::string> WriterKeys(const std::string& qsl = R"({"match_all": {}})") {
    std::vector<std::string> keys;
    for (const Json::Value& document : store_->GetByQuery(Q(qsl), {"path"})) keys.push_back(document["path"].asString());
    return keys;
  }
  SearchResult Find(const std::string& qsl, SortSpec sort = {}, size_t want = 10, size_t budget = 100,
                    const ReadableFilter& readable = nullptr) {
    return store_->Search(Q(qsl), sort, want, budget, readable);
  }
  static std::vector<std::string> HitKeys(const SearchResult& result) {
    std::vector<std::string> keys;
    for (const Hit& hit : result.hits) keys.push_back(hit.key);
    return keys;
  }
  // The DaemonError code and message of `action`.
  template <typename Action>
  static std::pair<int, std::string> Refusal(Action action) {
    try {
      action();
    } catch (const DaemonError& error) {
      return {error.code(), error.what()};
    }
    return {0, "accepted"};
  }

  testing_support::Sandbox root_{false};
  std::unique_ptr<IndexStore> store_;
};

using Keys = std::vector<std::string>;

TEST_F(IndexStoreTest, TheWriterSeesItsOwnWritesReadersOnlyCommittedOnes) {
  Put("/s/b");
  Put("/s/a");
  EXPECT_EQ(WriterKeys(), (Keys{"/s/a", "/s/b"}));
  EXPECT_EQ(Find(R"({"match_all": {}})").total, 0);
  const CommitChanges changes = store_->Commit();
  EXPECT_EQ(changes.upserted, (Keys{"/s/a", "/s/b"}));
  EXPECT_TRUE(changes.deleted.empty());
  EXPECT_EQ(HitKeys(Find(R"({"match_all": {}})")), (Keys{"/s/a", "/s/b"}));
  EXPECT_TRUE(store_->Commit().upserted.empty());  // each change is reported once
  // What is dropped at close never reaches the disk; what was committed stays.
  Put("/s/c");
  store_->Close(false);
  store_ = IndexStore::Open(root_.path() + "/index");
  EXPECT_EQ(WriterKeys(), (Keys{"/s/a", "/s/b"}));
}

TEST_F(IndexStoreTest, WordQueriesSeeUncommittedChangesInOrderAndAnUpsertReplacesAll) {
  // Word-index rows wait for the commit; queries through the writer and the
  // commit itself must still see every change, in the order it was made.
  Put("/s/a", R"({"body": "alpha beta", "size": 5})");
  Put("/s/b", R"({"body": "alpha"})");
  EXPECT_EQ(WriterKeys(R"({"match": {"body": "alpha"}})"), (Keys{"/s/a", "/s/b"}));
  EXPECT_EQ(Refusal([&] { store_->SetById("/s/a", JsonOf(R"({"size": "big"})")); }).first,
            kCodeBadDocument);
  Put("/s/a", R"({"body": "gamma"})");  // the whole document: its old words and size go
  EXPECT_EQ(store_->DeleteByQuery(Q(R"({"match": {"body": "alpha"}})")), 1);
  Put("/s/c", R"({"body": "beta gamma"})");
  store_->Commit();
  EXPECT_EQ(HitKeys(Find(R"({"match": {"body": "gamma"}})")), (Keys{"/s/a", "/s/c"}));
  EXPECT_EQ(HitKeys(Find(R"({"match": {"body": "beta"}})")), Keys{"/s/c"});
  EXPECT_EQ(Find(R"({"match": {"body": "alpha"}})").total, 0);
  EXPECT_EQ(Find(R"({"term": {"size": 5}})").total, 0);
}

TEST_F(IndexStoreTest, SetByIdMergesAndMovesAKeyOverAnExistingDocument) {
  Put("/s/a", R"({"size": 1, "body": "alpha"})");
  Put("/s/b", R"({"size": 2})");
  store_->Commit();
  store_->SetById("/s/a", JsonOf(R"({"path": "/s/b", "kind": "moved"})"));
  const Json::Value moved = store_->GetByQuery(Q(R"({"match_all": {}})"), {});
  ASSERT_EQ(moved.size(), 1u);
  EXPECT_EQ(moved[0]["path"], "/s/b");
  EXPECT_EQ(moved[0]["size"], 1);  // the moved document, not the one it replaced
  EXPECT_EQ(moved[0]["kind"], "moved");
  // Its words follow it: the old key's index entries are gone.
  EXPECT_EQ(WriterKeys(R"({"match": {"body": "alpha"}})"), Keys{"/s/b"});
  const CommitChanges changes = store_->Commit();
  EXPECT_EQ(changes.upserted, Keys{"/s/b"});
  EXPECT_EQ(changes.deleted, Keys{"/s/a"});
  EXPECT_FALSE(store_->DeleteById("/s/a"));
  EXPECT_TRUE(store_->DeleteById("/s/b"));
  EXPECT_EQ(Refusal([&] { store_->SetById("/s/x", JsonOf("{}")); }),
            std::make_pair(static_cast<int>(kCodeDocumentNotFound), std::string("No document with the id /s/x")));
}

TEST_F(IndexStoreTest, RefusedDocumentsNameTheFieldAndLeaveNothingBehind) {
  Put("/s/kept", R"({"size": 1})");
  const std::pair<std::string, std::string> cases[] = {
      {"[]", "\"data\" must be a JSON object"},
      {R"({"path": ""})", "the key field \"path\" must be a non-empty string"},
      {R"({"path": "/s/n", "size": "big"})", "the field \"size\" must be a number"},
      {R"({"path": "/s/n", "size": [1, true]})", "the field \"size\" must be a number"},
      {R"({"path": "/s/n", "isdir": 1})", "the field \"isdir\" must be true or false"},
      {R"({"path": "/s/n", "body": {"x": 1}})", "the field \"body\" must be a string or an array of strings"},
  };
  for (const auto& [document, message] : cases) {
    const auto [code, text] = Refusal([&] { store_->Upsert("/s/n", JsonOf(document)); });
    EXPECT_EQ(code, kCodeBadDocument) << document;
    EXPECT_NE(text.find(message), std::string::npos) << text;
  }
  EXPECT_EQ(Refusal([&] { store_->SetById("/s/kept", JsonOf(R"({"size": "big"})")); }).first, kCodeBadDocument);
  EXPECT_EQ(store_->GetByQuery(Q(R"({"match_all": {}})"), {}), JsonOf(R"([{"path": "/s/kept", "name": "kept", "size": 1}])"));
}

TEST_F(IndexStoreTest, HitsAreSortedPagedFilteredAndCounted) {
  const char* const sizes[] = {"3", "1", "2", "5", "4"};
  for (int i = 0; i < 5; ++i) Put("/s/" + std::string(1, static_cast<char>('a' + i)), std::string(R"({"size": )") + sizes[i] + "}");
  store_->Commit();
  SortSpec by_size;
  by_size.by = SortSpec::By::kField;
  by_size.code = store_->schema().Find("size")->code;
  by_size.descending = true;
  SortSpec key_down;
  key_down.descending = true;
  const std::string all = R"({"match_all": {}})";
  EXPECT_EQ(HitKeys(Find(all, by_size)), (Keys{"/s/d", "/s/e", "/s/a", "/s/c", "/s/b"}));
  EXPECT_EQ(HitKeys(Find(all, key_down, 2)), (Keys{"/s/e", "/s/d"}));
  EXPECT_EQ(HitKeys(Find(R"({"range": {"size": {"gte": 2, "lt": 4}}})")), (Keys{"/s/a", "/s/c"}));
  // Unreadable hits are dropped before paging and are not counted.
  const ReadableFilter not_d = [](const Keys& keys) {
    std::vector<bool> readable;
    for (const std::string& key : keys) readable.push_back(key != "/s/d");
    return readable;
  };
  const SearchResult filtered = Find(all, by_size, 2, 100, not_d);
  EXPECT_EQ(HitKeys(filtered), (Keys{"/s/e", "/s/a"}));
  EXPECT_EQ(filtered.total, 4);
  EXPECT_TRUE(filtered.total_exact);
  EXPECT_EQ(store_->DeleteByQuery(Q(R"({"range": {"size": {"gt": 3}}})")), 2);
  EXPECT_EQ(WriterKeys(), (Keys{"/s/a", "/s/b", "/s/c"}));
  // Checked hits are counted up to the budget past the page, and the count says so; hits readable to
  // all are counted exactly.
  for (int i = 0; i < 100; ++i) Put("/t/" + std::to_string(i));
  store_->Commit();
  const SearchResult budgeted = Find(all, {}, 1, 2, [](const Keys& keys) { return std::vector<bool>(keys.size(), true); });
  EXPECT_LT(budgeted.total, 103);
  EXPECT_FALSE(budgeted.total_exact);
  EXPECT_EQ(Find(all, {}, 1, 2).total, 103);
}

// Words found in the name rank first (the whole name before a name that
// merely holds the words), then words of the content; a phrase ranks the
// same way, and a filter beside the words changes nothing.
TEST_F(IndexStoreTest, WordSearchesRankExactNamesThenNamesThenContent) {
  Put("/s/notes.txt", R"({"body": "we buy cat food"})");
  Put("/s/cat food.txt");
  Put("/s/b/food cat");  // the same words, first by key, but not the name searched for
  Put("/s/Cat");
  Put("/s/dog");
  store_->Commit();
  SortSpec by_score;
  by_score.by = SortSpec::By::kScore;
  const Keys cat = {"/s/Cat", "/s/b/food cat", "/s/cat food.txt", "/s/notes.txt"};
  const struct {
    const char* qsl;
    Keys expected;
  } cases[] = {
      {R"({"match": {"_all": "cat"}})", cat},
      {R"({"bool": {"must": [{"match": {"_all": "cat"}}, {"prefix": {"path": "/s/"}}]}})", cat},
      {R"({"match": {"_all": "cat food"}})", {"/s/cat food.txt", "/s/b/food cat", "/s/notes.txt"}},
      {R"({"match_phrase": {"_all": "cat food"}})", {"/s/cat food.txt", "/s/notes.txt"}},
      {R"({"match": {"name": "at fo"}})", {"/s/cat food.txt"}},
  };
  for (const auto& c : cases) EXPECT_EQ(HitKeys(Find(c.qsl, by_score)), c.expected) << c.qsl;
}

TEST_F(IndexStoreTest, SuggestionsAreFoldedPrefixesByFrequency) {
  Put("/s/a", R"({"kind": "Photo"})");
  Put("/s/b", R"({"kind": "photo"})");
  Put("/s/c", R"({"kind": "Phone"})");
  Put("/s/d", R"({"kind": "music"})");
  store_->UpdateSuggestions("kind");
  store_->Commit();
  std::vector<std::pair<std::string, int64_t>> got;
  for (const Suggestion& suggestion : store_->Suggest("kind", "PH", 10)) got.emplace_back(suggestion.term, suggestion.frequency);
  EXPECT_EQ(got, (std::vector<std::pair<std::string, int64_t>>{{"photo", 2}, {"phone", 1}}));
  EXPECT_EQ(store_->Suggest("kind", "ph", 1).size(), 1u);
  EXPECT_EQ(Refusal([&] { store_->UpdateSuggestions("size"); }),
            std::make_pair(static_cast<int>(kCodeBadArgument),
                           std::string("Suggestions need a text or keyword field; \"size\" is not one")));
}

}  // namespace
}  // namespace elasticd
}  // namespace corvlumex
