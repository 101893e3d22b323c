#include "programs/frontend/search_request.h"

#include "fileindex/elastic/elastic_control.h"
#include "fileindex/elastic/schema.h"
#include "fileindex/file_type.h"

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
  static const std::vector<std::string> fields = {elastic::kFieldPath, "CORVMDIsDir", "CORVMDFSSize",
                                                  "CORVMDFSContentChangeDate"};
  return fields;
}

Json::Value IndexIds(const std::vector<std::string>& shares) {
  Json::Value ids(Json::arrayValue);
  for (const std::string& share : shares) ids.append(elastic::GetFileIndexID(share));
  return ids;
}

Json::Value SearchRequest(const SearchSpec& spec) {
  Json::Value filters(Json::arrayValue);
  if (!spec.category.empty()) {
    Json::Value extensions(Json::arrayValue);
    for (const std::string& ext : fileindex::GetExtensionsByCategory(spec.category)) extensions.append(ext);
    Json::Value terms(Json::objectValue);
    terms["terms"][elastic::kFieldExtension] = extensions;
    filters.append(terms);
  }
  if (spec.modified_from || spec.modified_to) filters.append(Range("CORVMDFSContentChangeDate", spec.modified_from, spec.modified_to));
  if (spec.size_min || spec.size_max) filters.append(Range("CORVMDFSSize", spec.size_min, spec.size_max));

  Json::Value qsl = spec.qsl;
  if (!filters.empty()) {
    Json::Value combined(Json::objectValue);
    if (!spec.qsl.isNull()) combined["bool"]["must"].append(spec.qsl);
    combined["bool"]["filter"] = filters;
    qsl = combined;
  }
  Json::Value data(Json::objectValue);
  if (!spec.shares.empty()) data["ids"] = IndexIds(spec.shares);
  if (!qsl.isNull()) data["query"]["qsl"] = qsl;
  data["from"] = spec.from;
  data["size"] = spec.size;
  data["track_total"] = spec.track_total;
  for (const std::string& field : HitFields()) data["load_field"].append(field);
  if (spec.highlight) {
    data["highlight"]["size"] = static_cast<Json::UInt64>(spec.highlight_size);
    data["highlight"]["pre"] = spec.highlight_pre;
    data["highlight"]["post"] = spec.highlight_post;
  }
  if (!spec.as_user.empty()) data["as_user"] = spec.as_user;
  Json::Value request(Json::objectValue);
  request["command"] = "search";
  request["data"] = data;
  return request;
}

}  // namespace frontend
}  // namespace corvlumex
