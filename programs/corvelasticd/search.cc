#include "programs/corvelasticd/search.h"

#include <algorithm>
#include <chrono>
#include <map>

#include "common/index_fields.h"
#include "programs/corvelasticd/daemon_error.h"
#include "programs/corvelasticd/highlight.h"
#include "programs/corvelasticd/request_args.h"

namespace corvlumex {
namespace elasticd {
namespace {

constexpr int64_t kDefaultSize = 20;
constexpr int64_t kMaxSize = 1000;
constexpr int64_t kMaxWindow = 100000;          // from + size
constexpr size_t kDefaultCheckBudget = 1000;     // candidates checked past the page for the total
constexpr size_t kSuggestCheckBudget = 200;
constexpr int64_t kMaxSuggestions = 100;
constexpr size_t kMaxLoadFields = 256;       // an index has a few dozen fields
constexpr size_t kMaxMarkBytes = 64;         // highlight marks: "<em>", a terminal's bold
// How long a search naming no index waits for indexes still opening after a
// start (usually milliseconds) before it answers 1401 rather than leave one out.
constexpr std::chrono::milliseconds kOpeningWait{2000};

struct SortRequest {
  std::string field = kSortByScore;
  bool descending = true;
  bool given = false;
};

SortRequest ParseSort(const Json::Value& sort) {
  SortRequest request;
  if (sort.isNull()) return request;
  const Json::Value& first = sort.isArray() ? (sort.empty() ? Json::Value() : sort[0]) : sort;
  if (first.isNull()) return request;
  request.given = true;
  if (first.isString()) {
    request.field = first.asString();
    request.descending = request.field == kSortByScore;
  } else if (first.isObject() && first["field"].isString()) {
    request.field = first["field"].asString();
    const Json::Value& given = first["order"];
    if (!given.isNull() && !given.isString()) throw DaemonError(kCodeBadArgument, "\"order\" must be \"asc\" or \"desc\"");
    const std::string order = given.isNull() ? (request.field == kSortByScore ? "desc" : "asc") : given.asString();
    if (order != "asc" && order != "desc") throw DaemonError(kCodeBadArgument, "\"order\" must be \"asc\" or \"desc\"");
    request.descending = order == "desc";
  } else {
    throw DaemonError(kCodeBadArgument, "\"sort\" must be a field name or {\"field\", \"order\"}");
  }
  return request;
}

SortSpec SortFor(const SortRequest& request, const IndexSchema& schema) {
  SortSpec field_def;
  field_def.descending = request.descending;
  if (request.field == kSortByScore) {
    field_def.by = SortSpec::By::kScore;
  } else if (request.field == kSortByKey || request.field == schema.property_id()) {
    field_def.by = SortSpec::By::kKey;
  } else {
    const FieldSpec* field = schema.Find(request.field);
    if (field == nullptr) throw DaemonError(kCodeBadArgument, "Cannot sort by the unknown field \"" + request.field + "\"");
    field_def.by = SortSpec::By::kField;
    field_def.code = field->code;
    field_def.text = field->kind != FieldKind::kNumber && field->kind != FieldKind::kBool;
  }
  return field_def;
}

std::vector<std::shared_ptr<IndexHandle>> TargetIndexes(const IndexRegistry& registry, const Json::Value& data) {
  std::vector<std::string> ids;
  if (data.isMember("ids")) {
    if (!data["ids"].isArray()) throw DaemonError(kCodeBadArgument, "\"ids\" must be an array of index ids");
    for (const Json::Value& id : data["ids"]) {
      if (!id.isString()) throw DaemonError(kCodeBadArgument, "\"ids\" must be an array of index ids");
      // Each index once, however often it is named.
      if (std::find(ids.begin(), ids.end(), id.asString()) == ids.end()) ids.push_back(id.asString());
    }
  } else if (data.isMember("id")) {
    ids.push_back(RequiredString(data, "id"));
  } else {
    return registry.AllForSearch(kOpeningWait);  // no index named: every index
  }
  std::vector<std::shared_ptr<IndexHandle>> handles;
  for (const std::string& id : ids) handles.push_back(registry.Get(id));
  return handles;
}

// Orders values of one sort column: numbers before text, nulls last.
int CompareValues(const SqlValue& a, const SqlValue& b) {
  auto rank = [](const SqlValue& v) { return std::holds_alternative<std::nullptr_t>(v) ? 2 : std::holds_alternative<std::string>(v) ? 1 : 0; };
  if (rank(a) != rank(b)) return rank(a) < rank(b) ? -1 : 1;
  if (rank(a) == 2) return 0;
  if (rank(a) == 1) return std::get<std::string>(a).compare(std::get<std::string>(b));
  auto number = [](const SqlValue& v) { return std::holds_alternative<int64_t>(v) ? static_cast<double>(std::get<int64_t>(v)) : std::get<double>(v); };
  const double x = number(a), y = number(b);
  return x < y ? -1 : x > y ? 1 : 0;
}

ReadableFilter FilterFor(const AccessFilter& filter) {
  if (filter.SeesAll()) return nullptr;
  return [&filter](const std::vector<std::string>& keys) { return filter.Readable(keys); };
}

}  // namespace

Json::Value RunSearch(const IndexRegistry& registry, const Json::Value& data, const AccessFilter& filter) {
  const int64_t from = OptionalInt(data, "from", 0);
  const int64_t size = OptionalInt(data, "size", kDefaultSize);
  if (from < 0 || size < 0 || size > kMaxSize) throw DaemonError(kCodeBadArgument, "\"size\" must be 0.." + std::to_string(kMaxSize) + " and \"from\" at least 0");
  // Compared without adding: a huge "from" must not overflow.
  if (from > kMaxWindow - size) throw DaemonError(kCodeBadArgument, "\"from\" + \"size\" must not exceed " + std::to_string(kMaxWindow));
  const SortRequest sort = ParseSort(data["sort"]);
  const std::vector<std::string> load_fields = OptionalStrings(data, "load_field");
  if (load_fields.size() > kMaxLoadFields) {
    throw DaemonError(kCodeBadArgument, "\"load_field\" names more than " + std::to_string(kMaxLoadFields) + " fields");
  }
  const bool track_total = OptionalBool(data, "track_total", false);
  Json::Value clause;
  if (data.isMember("query")) {
    if (!data["query"].isObject()) throw DaemonError(kCodeBadArgument, "\"query\" must be an object {\"qsl\": ...}");
    clause = data["query"]["qsl"];
  }
  HighlightStyle style;
  std::string highlight_field;
  const Json::Value& highlight = data["highlight"];
  if (highlight.isBool() && highlight.asBool()) {
    highlight_field = kFieldTextContent;
  } else if (highlight.isObject()) {
    highlight_field = OptionalString(highlight, "field", kFieldTextContent);
    style.size = static_cast<size_t>(std::clamp<int64_t>(OptionalInt(highlight, "size", 160), 20, 2000));
    style.pre = OptionalString(highlight, "pre", style.pre);
    style.post = OptionalString(highlight, "post", style.post);
    // They are written around every word found in every hit.
    if (style.pre.size() > kMaxMarkBytes || style.post.size() > kMaxMarkBytes) {
      throw DaemonError(kCodeBadArgument, "\"pre\" and \"post\" may be " + std::to_string(kMaxMarkBytes) + " bytes at most");
    }
  } else if (!highlight.isNull() && !highlight.isBool()) {
    throw DaemonError(kCodeBadArgument, "\"highlight\" must be true or {\"field\", \"size\", \"pre\", \"post\"}");
  }

  struct Found {
    size_t index;
    std::string index_id;
    Hit hit;
    std::string snippet;
    Json::Value fields;
  };
  std::vector<Found> found;
  int64_t total = 0;
  bool exact = true;
  const auto handles = TargetIndexes(registry, data);
  const ReadableFilter readable = FilterFor(filter);
  for (size_t i = 0; i < handles.size(); ++i) {
    const std::shared_ptr<IndexStore> store = handles[i]->Store();
    const Query query = Query::Parse(clause, store->schema());
    SortSpec field_def = SortFor(sort, store->schema());
    if (field_def.by == SortSpec::By::kScore && !query.HasRankedClause()) field_def.by = SortSpec::By::kKey, field_def.descending = false;
    SearchResult result = store->Search(query, field_def, static_cast<size_t>(from + size),
                                        track_total ? static_cast<size_t>(-1) : kDefaultCheckBudget, readable);
    total += result.total;
    exact = exact && result.total_exact;
    for (Hit& hit : result.hits) {
      Found entry{i, handles[i]->id(), std::move(hit), std::string(), Json::Value()};
      if (!highlight_field.empty()) {
        std::string text;
        const Json::Value& value = entry.hit.document[highlight_field];
        if (value.isString()) text = value.asString();
        entry.snippet = Highlight(text, query.HighlightTokens(), style);
      }
      entry.fields = store->VisibleFields(entry.hit.document, load_fields);
      found.push_back(std::move(entry));
    }
  }
  // Each index gave its hits in order; merge them into one order.
  std::stable_sort(found.begin(), found.end(), [&](const Found& a, const Found& b) {
    int order = 0;
    if (sort.field == kSortByScore) {
      order = a.hit.score > b.hit.score ? -1 : a.hit.score < b.hit.score ? 1 : 0;
      if (!sort.descending) order = -order;
    } else if (!std::holds_alternative<std::nullptr_t>(a.hit.sort_value) || !std::holds_alternative<std::nullptr_t>(b.hit.sort_value)) {
      order = CompareValues(a.hit.sort_value, b.hit.sort_value);
      if (sort.descending) order = -order;
    } else {
      order = a.hit.key.compare(b.hit.key);
      if (sort.descending && sort.field != kSortByScore) order = -order;
    }
    if (order != 0) return order < 0;
    return a.index < b.index;
  });
  Json::Value out(Json::objectValue);
  out["total"] = static_cast<Json::Int64>(total);
  out["total_exact"] = exact;
  out["hits"] = Json::Value(Json::arrayValue);
  for (size_t i = static_cast<size_t>(from); i < found.size() && i < static_cast<size_t>(from + size); ++i) {
    Json::Value hit(Json::objectValue);
    hit["index"] = found[i].index_id;
    hit["doc_id"] = found[i].hit.key;
    hit["score"] = found[i].hit.score;
    hit["fields"] = found[i].fields;
    if (!found[i].snippet.empty()) hit["highlight"] = found[i].snippet;
    out["hits"].append(hit);
  }
  return out;
}

Json::Value RunSuggest(const IndexRegistry& registry, const Json::Value& data, const AccessFilter& filter) {
  const std::string field = RequiredString(data, "field");
  const std::string text = OptionalString(data, "text", "");
  const int64_t size = OptionalInt(data, "size", 10);
  if (size < 1 || size > kMaxSuggestions) throw DaemonError(kCodeBadArgument, "\"size\" must be 1.." + std::to_string(kMaxSuggestions));
  const ReadableFilter readable = FilterFor(filter);
  std::map<std::string, int64_t> merged;
  for (const auto& handle : TargetIndexes(registry, data)) {
    const std::shared_ptr<IndexStore> store = handle->Store();
    if (store->schema().Find(field) == nullptr) continue;
    // Ask for more than needed: some may be dropped by the access check.
    for (const Suggestion& suggestion : store->Suggest(field, text, static_cast<size_t>(readable ? size * 3 : size))) {
      if (readable) {
        // Only words of documents the user may read are suggested.
        Json::Value clause;
        clause["term"][field] = suggestion.term;
        const Query query = Query::Parse(clause, store->schema());
        SortSpec key_order;
        if (store->Search(query, key_order, 1, kSuggestCheckBudget, readable).hits.empty()) continue;
      }
      merged[suggestion.term] += suggestion.frequency;
    }
  }
  std::vector<std::pair<std::string, int64_t>> ordered(merged.begin(), merged.end());
  std::stable_sort(ordered.begin(), ordered.end(), [](const auto& a, const auto& b) { return a.second > b.second; });
  Json::Value out(Json::objectValue);
  out["suggestions"] = Json::Value(Json::arrayValue);
  for (size_t i = 0; i < ordered.size() && i < static_cast<size_t>(size); ++i) {
    Json::Value entry(Json::objectValue);
    entry["term"] = ordered[i].first;
    // Counts span every document, readable or not: only root sees them.
    if (!readable) entry["freq"] = static_cast<Json::Int64>(ordered[i].second);
    out["suggestions"].append(entry);
  }
  return out;
}

}  // namespace elasticd
}  // namespace corvlumex
