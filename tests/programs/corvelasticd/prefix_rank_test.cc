// Ranked searches whose scores tie: a word or prefix found once in each of
// many equal documents. Past the page the daemon counts readable hits on a
// budget without ordering them; the page, and the candidates the count
// stops among, must still follow the order rule (name matches first, then
// newer first, then key order) and the count must cover the same hits.
#include <gtest/gtest.h>

#include <algorithm>
#include <functional>
#include <map>

#include "programs/corvelasticd/index_store.h"
#include "tests/support/sandbox.h"

namespace corvlumex {
namespace elasticd {
namespace {

using testing_support::JsonOf;
using Keys = std::vector<std::string>;

// Three runs of tied scores: the same word once in texts of 1, 2 and 3
// words. The first fills a window of candidates of its own, so the later
// runs are read after the page is full, and a budget may end inside one.
constexpr int kGroupSizes[] = {64, 30, 150};
constexpr const char* kGroupBodies[] = {"alpha", "alpha beta", "alpha beta gamma"};
// The named document matches "alp" in its name only; "alpha" not at all.
constexpr char kNamed[] = "/n/alphabet soup.txt";

struct Tied {
  std::string key;
  int group = 0;
  int date = 0;  // two documents share each date, so key order decides between them
};

std::vector<Tied> TiedDocuments() {
  std::vector<Tied> out;
  for (int group = 0; group < 3; ++group) {
    const int size = kGroupSizes[group];
    for (int i = 0; i < size; ++i) {
      const std::string number = std::to_string(i);
      out.push_back({"/s/g" + std::to_string(group) + "/f" + std::string(3 - number.size(), '0') + number, group,
                     1000 + (i * 97 % size) / 2});
    }
  }
  return out;
}

// Which tied documents the asking user may read: a third of each group
// is hidden, the oldest or the newest or every third by key.
enum class Readers { kAll, kNotOldest, kNotNewest, kNotEveryThird };

bool MayRead(Readers readers, const Tied& doc) {
  const int third = 1000 + kGroupSizes[doc.group] / 6;
  const int two_thirds = 1000 + kGroupSizes[doc.group] / 3;
  switch (readers) {
    case Readers::kAll: return true;
    case Readers::kNotOldest: return doc.date >= third;
    case Readers::kNotNewest: return doc.date < two_thirds;
    case Readers::kNotEveryThird: return std::stoi(doc.key.substr(doc.key.size() - 3)) % 3 != 0;
  }
  return false;
}

class PrefixRankTest : public ::testing::Test {
 protected:
  PrefixRankTest()
      : store_(IndexStore::Create(root_.path() + "/index", JsonOf(R"({"property_id": "path", "properties": {
            "path": {"analyzer": "keyword", "required": true, "_all": false},
            "name": {"type": "text", "preprocess": ["tolower", "ngram"]}, "body": {"type": "text"},
            "CORVMDFSContentChangeDate": {"type": "int"}}})"),
                                  Json::Value(Json::objectValue))) {
    // Written out of key order, so that the order of rows cannot pass for key order.
    for (size_t i = 0; i < tied_.size(); ++i) {
      const Tied& doc = tied_[i * 37 % tied_.size()];
      Json::Value document;
      document["path"] = doc.key;
      document["name"] = "x";
      document["body"] = kGroupBodies[doc.group];
      document["CORVMDFSContentChangeDate"] = doc.date;
      store_->Upsert(doc.key, document);
    }
    store_->Upsert(kNamed, JsonOf(R"({"path": "/n/alphabet soup.txt", "name": "alphabet soup.txt", "body": "soup",
                                      "CORVMDFSContentChangeDate": 1})"));
    store_->Commit();
  }

  SearchResult Find(const std::string& qsl, size_t want, size_t budget, Readers readers) {
    SortSpec by_score;
    by_score.by = SortSpec::By::kScore;
    std::map<std::string, const Tied*> by_key;
    for (const Tied& doc : tied_) by_key[doc.key] = &doc;
    const ReadableFilter readable = [&](const Keys& keys) {
      std::vector<bool> out;
      for (const std::string& key : keys) out.push_back(key == kNamed || MayRead(readers, *by_key.at(key)));
      return out;
    };
    return store_->Search(Query::Parse(JsonOf(qsl), store_->schema()), by_score, want, budget, readable);
  }

  // The readable hits by the order rule itself: the named document (for the
  // prefix), then the runs best first, each newest first, then by key.
  Keys ByTheRule(bool prefix, Readers readers) const {
    Keys out;
    if (prefix) out.push_back(kNamed);
    std::vector<Tied> readable;
    for (const Tied& doc : tied_) {
      if (MayRead(readers, doc)) readable.push_back(doc);
    }
    std::sort(readable.begin(), readable.end(), [](const Tied& a, const Tied& b) {
      if (a.group != b.group) return a.group < b.group;
      return a.date != b.date ? a.date > b.date : a.key < b.key;
    });
    for (const Tied& doc : readable) out.push_back(doc.key);
    return out;
  }

  testing_support::Sandbox root_{false};
  std::unique_ptr<IndexStore> store_;
  const std::vector<Tied> tied_ = TiedDocuments();
};

Keys KeysOf(const SearchResult& result) {
  Keys keys;
  for (const Hit& hit : result.hits) keys.push_back(hit.key);
  return keys;
}

TEST_F(PrefixRankTest, TiedScoresArePagedByTheRuleAndCountedOverTheSameHitsAsWithAFilter) {
  // The same clause beside a filter every document passes is ordered whole
  // by SQL: its count, taken over the first candidates in that order, is
  // the reference for the lone clause's.
  const char* const clauses[] = {R"({"match": {"_all": "alpha"}})", R"({"prefix": {"_all": "alp"}})"};
  const size_t wants[] = {1, 11, 70, 100, 300};
  const size_t budgets[] = {0, 10, 60, 100, 150, 1000};
  const Readers readers_list[] = {Readers::kAll, Readers::kNotOldest, Readers::kNotNewest, Readers::kNotEveryThird};
  int inexact = 0;
  for (const char* clause : clauses) {
    const bool prefix = std::string(clause).find("prefix") != std::string::npos;
    const std::string filtered = std::string(R"({"bool": {"must": [)") + clause + R"(], "filter": [{"prefix": {"path": "/"}}]}})";
    for (const Readers readers : readers_list) {
      Keys rule = ByTheRule(prefix, readers);
      for (const size_t want : wants) {
        for (const size_t budget : budgets) {
          SCOPED_TRACE(std::string(clause) + " want " + std::to_string(want) + " budget " + std::to_string(budget) +
                       " readers " + std::to_string(static_cast<int>(readers)));
          const SearchResult lone = Find(clause, want, budget, readers);
          const SearchResult reference = Find(filtered, want, budget, readers);
          Keys page = rule;
          page.resize(std::min(page.size(), want));
          EXPECT_EQ(KeysOf(lone), page);
          EXPECT_EQ(KeysOf(reference), page);
          EXPECT_EQ(lone.total, reference.total);
          EXPECT_EQ(lone.total_exact, reference.total_exact);
          inexact += lone.total_exact ? 0 : 1;
        }
      }
    }
  }
  EXPECT_GT(inexact, 20);  // budgets that end inside the runs were tried
}

// Scores take each row's length from memory, kept from the build of the
// key directory: a document changed since (updated under the same key,
// renamed, replaced, new) must score what the index itself says, as the
// same clause beside a filter, scored by FTS5's bm25, does.
TEST_F(PrefixRankTest, ScoresFollowTheLengthsOfDocumentsChangedAfterTheFirstSearch) {
  const auto put = [&](const std::string& key, const std::string& body) {
    Json::Value document;
    document["path"] = key;
    document["name"] = "x";
    document["body"] = body;
    store_->Upsert(key, document);
  };
  put("/o/a", "omega");
  put("/o/b", "omega beta");
  put("/o/c", "omega beta gamma delta");
  store_->Commit();
  struct Step {
    const char* what;
    std::function<void()> change;
  };
  const Step steps[] = {
      {"nothing changed", [] {}},
      {"updated longer under the same key", [&] { put("/o/a", "omega one two three four five six"); }},
      {"updated shorter under the same key", [&] { put("/o/c", "omega"); }},
      {"changed by set", [&] { store_->SetById("/o/b", JsonOf(R"({"body": "omega beta gamma delta epsilon"})")); }},
      {"renamed", [&] { store_->SetById("/o/a", JsonOf(R"({"path": "/o/z", "body": "omega two"})")); }},
      {"deleted and a new one", [&] {
         store_->DeleteById("/o/c");
         put("/o/d", "omega omega");
       }},
  };
  const std::string lone = R"({"match": {"_all": "omega"}})";
  const std::string filtered = R"({"bool": {"must": [{"match": {"_all": "omega"}}], "filter": [{"prefix": {"path": "/"}}]}})";
  SortSpec by_score;
  by_score.by = SortSpec::By::kScore;
  for (const Step& step : steps) {
    SCOPED_TRACE(step.what);
    step.change();
    store_->Commit();
    const SearchResult scored = store_->Search(Query::Parse(JsonOf(lone), store_->schema()), by_score, 10, 100, nullptr);
    const SearchResult reference = store_->Search(Query::Parse(JsonOf(filtered), store_->schema()), by_score, 10, 100, nullptr);
    ASSERT_EQ(KeysOf(scored), KeysOf(reference));
    ASSERT_EQ(scored.hits.size(), 3u);
    for (size_t i = 0; i < scored.hits.size(); ++i) EXPECT_EQ(scored.hits[i].score, reference.hits[i].score) << scored.hits[i].key;
  }
}

}  // namespace
}  // namespace elasticd
}  // namespace corvlumex
