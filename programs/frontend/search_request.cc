#include "programs/frontend/search_request.h"

#include "common/index_fields.h"
#include "fileindex/elastic/elastic_control.h"
#include "fileindex/elastic/schema.h"
#include "fileindex/paths/file_type.h"

namespace corvlumex {
namespace frontend {
namespace {

namespace elastic = fileindex::elastic;

Json::Value Range(const char* field, const std::optional<long long>& low, const std::optional<long long>& high) {
  Json::Value clause(Json::objectValue);
  if (low) clause["range"][field]["gte"] = static_cast<Json::Int64>(*low);
  if (high) clause["range"][field]["lte"] = static_cast<Json::Int64>(*high);
  return clause;
}

}  // namespace

const std::vector<std::string>& HitFields() {
  static const std::vector<std::string> fields = {kFieldPath, kFieldIsDir, kFieldFSSize,
                                                  kFieldContentChangeDate};
  return fields;
}

Json::Value IndexIds(const std::vector<std::string>& shares) {
  Json::Value ids(Json::arrayValue);
  for (const std::string& share : shares) ids.append(elastic::GetFileIndexID(share));
  return ids;
}

Json::Value SearchRequest(const SearchParams& params) {
  Json::Value filters(Json::arrayValue);
  if (!params.category.empty()) {
    Json::Value extensions(Json::arrayValue);
    for (const std::string& ext : fileindex::GetExtensionsByCategory(params.category)) extensions.append(ext);
    Json::Value terms(Json::objectValue);
    terms["terms"][kFieldExtension] = extensions;
    filters.append(terms);
  }
  if (params.modified_from || params.modified_to) filters.append(Range(kFieldContentChangeDate, params.modified_from, params.modified_to));
  if (params.size_min || params.size_max) filters.append(Range(kFieldFSSize, params.size_min, params.size_max));

  Json::Value qsl = params.qsl;
  if (!filters.empty()) {
    Json::Value combined(Json::objectValue);
    if (!params.qsl.isNull()) combined["bool"]["must"].append(params.qsl);
    combined["bool"]["filter"] = filters;
    qsl = combined;
  }
  Json::Value data(Json::objectValue);
  if (!params.shares.empty()) data["ids"] = IndexIds(params.shares);
  if (!qsl.isNull()) data["query"]["qsl"] = qsl;
  data["from"] = params.from;
  data["size"] = params.size;
  data["track_total"] = params.track_total;
  for (const std::string& field : HitFields()) data["load_field"].append(field);
  if (params.highlight) {
    data["highlight"]["size"] = static_cast<Json::UInt64>(params.highlight_size);
    data["highlight"]["pre"] = params.highlight_pre;
    data["highlight"]["post"] = params.highlight_post;
  }
  if (!params.as_user.empty()) data["as_user"] = params.as_user;
  Json::Value request(Json::objectValue);
  request["command"] = "search";
  request["data"] = data;
  return request;
}

Json::Value SuggestRequest(const std::vector<std::string>& shares, const std::string& text, unsigned size,
                           const std::string& as_user) {
  Json::Value request(Json::objectValue);
  request["command"] = "suggest";
  if (!shares.empty()) request["data"]["ids"] = IndexIds(shares);
  request["data"]["field"] = kFieldSearchFileName;
  request["data"]["text"] = text;
  request["data"]["size"] = size;
  if (!as_user.empty()) request["data"]["as_user"] = as_user;
  return request;
}

Json::Value PathsPageRequest(const std::string& share, const Json::Value& qsl, unsigned from, unsigned size) {
  Json::Value request(Json::objectValue);
  request["command"] = "search";
  request["data"]["ids"].append(elastic::GetFileIndexID(share));
  request["data"]["query"]["qsl"] = qsl;
  request["data"]["sort"] = "_key";
  request["data"]["from"] = from;
  request["data"]["size"] = size;
  request["data"]["load_field"].append(kFieldPath);
  return request;
}

}  // namespace frontend
}  // namespace corvlumex
