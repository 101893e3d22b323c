// Proof that searching the index finds exactly what it should: a generated
// corpus is indexed by the real daemon, and for hundreds of queries of each
// kind, typed in the people's syntax (fileindex/query/user_query.h), the set
// of hits must equal what a direct scan of the corpus computes with the same
// word rules (text_analysis.h). Where the two must differ is written down in
// docs/search.md ("Proof against a scan").
#include <gtest/gtest.h>

#include <algorithm>
#include <functional>
#include <random>
#include <set>
#include <string>
#include <vector>

#include "fileindex/query/user_query.h"
#include "programs/corvelasticd/text_analysis.h"
#include "tests/programs/corvelasticd/daemon_harness.h"

namespace corvlumex {
namespace elasticd_test {
namespace {

using elasticd::Analyze;
using elasticd::Analyzer;
using elasticd::Fold;
using elasticd::FoldMode;

constexpr int kDocuments = 3000;
constexpr int kQueriesPerKind = 200;
constexpr long long kNow = 1767225600;  // 2026-01-01

// Words with accents, CJK, and punctuation inside words, beside plain ones.
const std::vector<std::string>& Vocabulary() {
  static const std::vector<std::string> words = [] {
    std::vector<std::string> list = {"café",    "crème",      "naïve",  "Über",     "résumé", "東京",
                                     "大阪",    "京都",       "foo_bar", "e-mail",  "C++",    "readFileSync",
                                     "pthread_mutex_lock", "XMLParser", "ac-3", "état", "Straße", "smörgåsbord",
                                     "copyright", "holder",  "saffron", "rice",    "budget", "budgets"};
    const char* stems[] = {"alpha", "bravo", "delta", "echo", "golf", "hotel", "india", "kilo", "lima", "mike",
                           "oscar", "papa", "romeo", "sierra", "tango", "victor", "whisky", "yankee", "zulu", "nova"};
    for (const char* stem : stems) {
      for (const char* ending : {"", "s", "ing", "er", "ed"}) list.push_back(std::string(stem) + ending);
    }
    return list;
  }();
  return words;
}

struct Doc {
  std::string path, name, extension, content;
  long long size = 0, date = 0;
  std::vector<std::string> content_tokens, name_tokens;
};

class Corpus {
 public:
  explicit Corpus(unsigned seed) : random_(seed) {
    const auto& words = Vocabulary();
    // Skewed word frequencies, as in real text: a few words are everywhere.
    std::vector<double> weights;
    for (size_t i = 0; i < words.size(); ++i) weights.push_back(1.0 / (1.0 + static_cast<double>((i * 7) % words.size())));
    std::discrete_distribution<size_t> pick(weights.begin(), weights.end());
    const char* extensions[] = {"txt", "md", "c", "PDF", "html"};
    for (int i = 0; i < kDocuments; ++i) {
      Doc doc;
      // A number first keeps the paths apart; it is part of the name, as any word.
      doc.name = std::to_string(i);
      const int name_words = 1 + Uniform(3);
      for (int w = 0; w < name_words; ++w) doc.name += (Uniform(2) ? " " : "-") + words[pick(random_)];
      doc.extension = extensions[Uniform(5)];
      doc.name += "." + doc.extension;
      doc.path = "/v/share/d" + std::to_string(i % 17) + "/" + doc.name;
      const int content_words = Uniform(40);
      for (int w = 0; w < content_words; ++w) {
        doc.content += (w > 0 ? (Uniform(10) == 0 ? ", " : " ") : "") + words[pick(random_)];
      }
      doc.size = Uniform(1 << 24);
      doc.date = kNow - Uniform(400) * 86400LL - Uniform(86400);
      Analyze(Analyzer::kStandard, doc.content, &doc.content_tokens);
      Analyze(Analyzer::kStandard, doc.name, &doc.name_tokens);
      docs_.push_back(std::move(doc));
    }
  }

  int Uniform(int n) { return std::uniform_int_distribution<int>(0, n - 1)(random_); }
  const std::string& Word() { return Vocabulary()[static_cast<size_t>(Uniform(static_cast<int>(Vocabulary().size())))]; }
  const Doc& AnyDoc() { return docs_[static_cast<size_t>(Uniform(kDocuments))]; }
  const std::vector<Doc>& docs() const { return docs_; }

  std::set<std::string> Where(const std::function<bool(const Doc&)>& keep) const {
    std::set<std::string> out;
    for (const Doc& doc : docs_) {
      if (keep(doc)) out.insert(doc.path);
    }
    return out;
  }

 private:
  std::mt19937 random_;
  std::vector<Doc> docs_;
};

// The tokens occur next to each other in this order; with `prefix` the last
// one only has to begin the token found there.
bool HasRun(const std::vector<std::string>& tokens, const std::vector<std::string>& run, bool prefix) {
  if (run.empty() || run.size() > tokens.size()) return false;
  for (size_t start = 0; start + run.size() <= tokens.size(); ++start) {
    bool all = true;
    for (size_t i = 0; i < run.size() && all; ++i) {
      const bool last = i + 1 == run.size();
      all = prefix && last ? tokens[start + i].compare(0, run[i].size(), run[i]) == 0 : tokens[start + i] == run[i];
    }
    if (all) return true;
  }
  return false;
}

// A word or phrase of the people's syntax, as the scan reads it: its tokens
// in one field, the content or the name.
bool Matches(const Doc& doc, const std::string& text, bool prefix) {
  std::vector<std::string> run;
  Analyze(Analyzer::kStandard, text, &run);
  return HasRun(doc.content_tokens, run, prefix) || HasRun(doc.name_tokens, run, prefix);
}

class CorpusScanTest : public DaemonTest {
 protected:
  void IndexCorpus(const Corpus& corpus) {
    for (const Doc& doc : corpus.docs()) {
      Json::Value data;
      data["doc_id"] = doc.path;
      data["data"] = FileDocument(doc.path, doc.content, doc.size);
      data["data"]["CORVMDExtension"] = doc.extension;
      data["data"]["CORVMDFSContentChangeDate"] = static_cast<Json::Int64>(doc.date);
      ASSERT_TRUE(Run("document_upsert_by_id", data)["success"].asBool());
    }
    Commit();
  }

  // Every hit of what a person typed, whatever the order.
  std::set<std::string> Hits(const std::string& typed) {
    std::set<std::string> out;
    Json::Value data(Json::objectValue);
    data["query"] = fileindex::UserQueryToSearch(typed, kNow);
    data["size"] = 1000;
    data["sort"] = "_key";
    data["load_field"].append("CORVMDPath");
    for (int from = 0;; from += 1000) {
      data["from"] = from;
      const Json::Value answer = Run("search", data);
      EXPECT_TRUE(answer["success"].asBool()) << typed << ": " << answer.toStyledString();
      for (const Json::Value& hit : answer["data"]["hits"]) out.insert(hit["doc_id"].asString());
      if (answer["data"]["hits"].size() < 1000) break;
    }
    return out;
  }

  // Runs `count` queries made by `make` and compares each with the scan.
  void Compare(const char* kind, int count, const std::function<std::pair<std::string, std::set<std::string>>()>& make) {
    int wrong = 0, nonempty = 0;
    for (int i = 0; i < count; ++i) {
      const auto [typed, expected] = make();
      const std::set<std::string> found = Hits(typed);
      nonempty += expected.empty() ? 0 : 1;
      if (found == expected) continue;
      if (++wrong <= 3) {
        std::vector<std::string> missing, extra;
        std::set_difference(expected.begin(), expected.end(), found.begin(), found.end(), std::back_inserter(missing));
        std::set_difference(found.begin(), found.end(), expected.begin(), expected.end(), std::back_inserter(extra));
        ADD_FAILURE() << kind << " query [" << typed << "]: " << missing.size() << " missing (first: "
                      << (missing.empty() ? "-" : missing[0]) << "), " << extra.size() << " extra (first: "
                      << (extra.empty() ? "-" : extra[0]) << ")";
      }
    }
    EXPECT_EQ(wrong, 0) << kind;
    // Queries that find nothing prove little: most must find something.
    EXPECT_GT(nonempty, count / 2) << kind;
  }
};

TEST_F(CorpusScanTest, EveryKindOfQueryFindsExactlyWhatAScanFinds) {
  Corpus corpus(20260101);
  IndexCorpus(corpus);
  Compare("word", kQueriesPerKind, [&] {
    const std::string word = corpus.Word();
    return std::make_pair(word, corpus.Where([&](const Doc& d) { return Matches(d, word, false); }));
  });
  Compare("two words", kQueriesPerKind, [&] {
    const std::string a = corpus.Word(), b = corpus.Word();
    return std::make_pair(a + " " + b, corpus.Where([&](const Doc& d) { return Matches(d, a, false) && Matches(d, b, false); }));
  });
  Compare("phrase", kQueriesPerKind, [&] {
    // Two or three words in a row from a document's content, or any two.
    const Doc& source = corpus.AnyDoc();
    std::string phrase;
    if (source.content_tokens.size() >= 3 && corpus.Uniform(4) != 0) {
      const size_t at = static_cast<size_t>(corpus.Uniform(static_cast<int>(source.content_tokens.size()) - 2));
      const size_t length = 2 + static_cast<size_t>(corpus.Uniform(2));
      for (size_t i = at; i < at + length; ++i) phrase += (i > at ? " " : "") + source.content_tokens[i];
    } else {
      phrase = corpus.Word() + " " + corpus.Word();
    }
    return std::make_pair("\"" + phrase + "\"", corpus.Where([&](const Doc& d) { return Matches(d, phrase, false); }));
  });
  Compare("prefix", kQueriesPerKind, [&] {
    std::vector<std::string> tokens;
    Analyze(Analyzer::kStandard, corpus.Word(), &tokens);
    const std::string& token = tokens.front();
    // A prefix of one to all of the token's bytes, cut at a character boundary.
    size_t length = 1 + static_cast<size_t>(corpus.Uniform(static_cast<int>(token.size())));
    while (length < token.size() && (static_cast<unsigned char>(token[length]) & 0xC0) == 0x80) ++length;
    const std::string prefix = token.substr(0, length);
    return std::make_pair(prefix + "*", corpus.Where([&](const Doc& d) { return Matches(d, prefix, true); }));
  });
  Compare("OR", kQueriesPerKind, [&] {
    const std::string a = corpus.Word(), b = corpus.Word(), c = corpus.Word();
    return std::make_pair(a + " (" + b + " OR \"" + c + "\")", corpus.Where([&](const Doc& d) {
                            return Matches(d, a, false) && (Matches(d, b, false) || Matches(d, c, false));
                          }));
  });
  Compare("NOT", kQueriesPerKind, [&] {
    const std::string a = corpus.Word(), b = corpus.Word();
    return std::make_pair(a + " -" + b, corpus.Where([&](const Doc& d) { return Matches(d, a, false) && !Matches(d, b, false); }));
  });
  Compare("name fragment", kQueriesPerKind, [&] {
    // Part of a real name: one to eight characters from somewhere inside it.
    const Doc& source = corpus.AnyDoc();
    const std::string folded_name = Fold(source.name, FoldMode::kSearch);
    std::vector<size_t> starts;
    for (size_t i = 0; i < folded_name.size(); ++i) {
      if ((static_cast<unsigned char>(folded_name[i]) & 0xC0) != 0x80) starts.push_back(i);
    }
    starts.push_back(folded_name.size());
    const size_t from = static_cast<size_t>(corpus.Uniform(static_cast<int>(starts.size()) - 1));
    const size_t to = std::min(starts.size() - 1, from + 1 + static_cast<size_t>(corpus.Uniform(8)));
    std::string fragment = folded_name.substr(starts[from], starts[to] - starts[from]);
    // Blanks and quotes would need quoting; the parser's own tests cover that.
    fragment.erase(std::remove_if(fragment.begin(), fragment.end(), [](char c) { return c == ' ' || c == '"' || c == '(' || c == ')'; }),
                   fragment.end());
    if (fragment.empty() || fragment.back() == '*') fragment = "a";
    return std::make_pair("name:" + fragment, corpus.Where([&](const Doc& d) {
                            return Fold(d.name, FoldMode::kSearch).find(Fold(fragment, FoldMode::kSearch)) != std::string::npos;
                          }));
  });
  Compare("filters", kQueriesPerKind, [&] {
    const std::string word = corpus.Word();
    const char* extensions[] = {"txt", "md", "c", "pdf", "HTML"};
    const std::string ext = extensions[corpus.Uniform(5)];
    const long long megabytes = 1 + corpus.Uniform(15);
    const int days = 1 + corpus.Uniform(300);
    switch (corpus.Uniform(3)) {
      case 0:
        return std::make_pair(word + " ext:" + ext, corpus.Where([&](const Doc& d) {
                                return Matches(d, word, false) && Fold(d.extension, FoldMode::kCase) == Fold(ext, FoldMode::kCase);
                              }));
      case 1:
        return std::make_pair(word + " size:>" + std::to_string(megabytes) + "M", corpus.Where([&](const Doc& d) {
                                return Matches(d, word, false) && d.size > (megabytes << 20);
                              }));
      default:
        return std::make_pair(word + " modified:<" + std::to_string(days) + "d", corpus.Where([&](const Doc& d) {
                                return Matches(d, word, false) && d.date > kNow - days * 86400LL;
                              }));
    }
  });
}

}  // namespace
}  // namespace elasticd_test
}  // namespace corvlumex
