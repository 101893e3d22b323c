#include "programs/corvelasticd/search_ranking.h"

#include <vector>

#include "common/index_fields.h"
#include "programs/corvelasticd/text_analysis.h"

namespace corvlumex {
namespace elasticd {
namespace {

// A word in the name outweighs one in a title or tag, which outweighs one
// in the content (long texts would otherwise bury short names).
constexpr double kNameWeight = 5.0;
constexpr double kMetadataWeight = 2.0;
constexpr double kContentWeight = 1.0;
// Names that begin with the words are checked one by one; a word every
// name begins with is not an exact match worth this many reads.
constexpr size_t kMaxExactChecks = 10000;

// The name consists of the words, or of the words and an extension.
bool IsExactName(const std::string& name, const std::vector<std::string>& words) {
  std::vector<std::string> tokens;
  Analyze(Analyzer::kStandard, name, &tokens);
  if (tokens == words) return true;
  const size_t dot = name.rfind('.');
  if (dot == std::string::npos || tokens.size() != words.size() + 1) return false;
  std::vector<std::string> extension;
  Analyze(Analyzer::kStandard, name.substr(dot + 1), &extension);
  return extension.size() == 1 && extension[0] == tokens.back() &&
         std::equal(words.begin(), words.end(), tokens.begin());
}

}  // namespace

NameTiers NameTiers::Find(Database& reader, const Query& query, const IndexSchema& schema) {
  NameTiers tiers;
  if (!query.HasRankedClause() || query.RankedNameExpression().empty()) return tiers;
  tiers.name_expression_ = query.RankedNameExpression();
  {
    Statement& named = reader.Cached("SELECT rowid FROM fts_text WHERE fts_text MATCH ?");
    named.BindText(1, tiers.name_expression_);
    while (named.Step()) tiers.named_.insert(named.Int(0));
    named.Reset();
  }
  const std::vector<std::string>& words = query.ExactNameTokens();
  if (words.empty() || tiers.named_.empty()) return tiers;
  for (const FieldSpec* field : schema.NgramFields()) {
    if (!field->in_all) continue;
    // Names that begin with the words; whether nothing but an extension
    // follows is read from the name itself.
    auto begins = reader.Prepare("SELECT d.rowid, corv_field(d.key, d.doc, " + std::to_string(field->code) +
                                 ") FROM docs d WHERE d.rowid IN (SELECT rowid FROM fts_text WHERE fts_text MATCH ?) LIMIT " +
                                 std::to_string(kMaxExactChecks));
    begins->BindText(1, "{" + field->Column() + "} : ^ " + FtsPhrase(words));
    while (begins->Step()) {
      if (IsExactName(begins->Text(1), words)) tiers.exact_.insert(begins->Int(0));
    }
  }
  return tiers;
}

int NameTiers::Tier(int64_t rowid) const {
  if (exact_.count(rowid) != 0) return 0;
  return named_.count(rowid) != 0 ? 1 : 2;
}

namespace {

// ", w1, w2, ...)": the weights of the word index's columns, and the call's end.
std::string ColumnWeights(const IndexSchema& schema) {
  std::string out;
  const std::vector<const FieldSpec*> fields = schema.TextFields();
  for (const FieldSpec* field : fields) {
    const double weight = field->kind == FieldKind::kNgram        ? kNameWeight
                          : field->name == kFieldTextContent      ? kContentWeight
                                                                  : kMetadataWeight;
    out += ", " + std::to_string(weight);
  }
  if (fields.empty()) out += ", 1.0";  // the placeholder column
  return out + ")";
}

}  // namespace

std::string WeightedRank(const IndexSchema& schema) { return "bm25(fts_text" + ColumnWeights(schema); }

std::string WeightedRankWithLengths(const IndexSchema& schema, int lengths) {
  return "corv_bm25(fts_text, ?" + std::to_string(lengths) + ColumnWeights(schema);
}

int RecencyCode(const IndexSchema& schema) {
  const FieldSpec* field = schema.Find(kFieldContentChangeDate);
  return field != nullptr && field->kind == FieldKind::kNumber ? field->code : -1;
}

}  // namespace elasticd
}  // namespace corvlumex
