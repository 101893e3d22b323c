#include "programs/corvspotlightd/share_search.h"

#include "common/error.h"
#include "common/index_fields.h"
#include "common/path_below.h"
#include "fileindex/elastic/comm.h"
#include "fileindex/elastic/daemon_codes.h"
#include "fileindex/elastic/schema.h"
#include "fileindex/paths/path_rules.h"
#include "sdk/share.h"

namespace corvlumex {
namespace spotlightd {
namespace {

constexpr char kAllIndexes[] = "_all";

std::string WithoutTrailingSlash(std::string path) {
  while (path.size() > 1 && path.back() == '/') path.pop_back();
  return path;
}

ShareTarget ShareByName(const std::string& share_name) {
  const sdk::SDKShare share(share_name);
  return ShareTarget{share.GetDBName(), share.GetPath()};
}

Json::Value PathPrefix(const std::string& folder) {
  Json::Value clause(Json::objectValue);
  clause["prefix"][kFieldPath] = PrefixOfPathsBelow(folder);
  return clause;
}

}  // namespace

ShareTarget ResolveShare(const std::string& index_name, const std::vector<std::string>& scopes) {
  if (index_name == kAllIndexes) {
    if (scopes.empty()) throw SearchFailure(400, "parsing_exception", "\"_all\" needs a search scope to choose the share");
    std::string share_name;
    std::string share_path;
    try {
      fileindex::GetShareNamePathByFullPath(share_name, share_path, WithoutTrailingSlash(scopes.front()));
    } catch (const Error&) {
      throw SearchFailure(404, "index_not_found_exception", "no share holds the folder \"" + scopes.front() + "\"");
    }
    return ShareByName(share_name);
  }
  for (const std::string& share_name : sdk::SDKShare::Enum()) {
    ShareTarget target = ShareByName(share_name);
    if (target.index_id != index_name) continue;
    for (const std::string& scope : scopes) {
      const std::string folder = WithoutTrailingSlash(scope);
      if (!IsPathAtOrBelow(folder, target.share_path)) {
        throw SearchFailure(400, "parsing_exception",
                            "the scope \"" + scope + "\" is not in the share of index \"" + index_name + "\"");
      }
    }
    return target;
  }
  throw SearchFailure(404, "index_not_found_exception", "no share has the index \"" + index_name + "\"");
}

SearchPage SearchShare(const ShareTarget& share, const std::vector<std::string>& scopes, const Json::Value& clause,
                       int from, int size) {
  Json::Value filters(Json::arrayValue);
  filters.append(PathPrefix(share.share_path));
  for (const std::string& scope : scopes) filters.append(PathPrefix(scope));
  Json::Value query(Json::objectValue);
  query["bool"]["must"].append(clause);
  query["bool"]["filter"] = filters;

  Json::Value request(Json::objectValue);
  request["command"] = "search";
  Json::Value& data = request["data"];
  data["id"] = share.index_id;
  data["query"]["qsl"] = query;
  data["from"] = from;
  data["size"] = size;
  // Key order: pages of one search never overlap or skip, and no scoring.
  data["sort"] = kSortByKey;
  data["load_field"].append(kFieldPath);
  data["track_total"] = true;

  Json::Value answer;
  try {
    SendRequestImpl(answer, request);
  } catch (const Error& error) {
    const int code = static_cast<int>(error.code);
    if (code == elasticd::kCodeBadQuery || code == elasticd::kCodeBadArgument) {
      throw SearchFailure(400, "query_shard_exception", error.reason);
    }
    if (code == elasticd::kCodeIndexNotFound) throw SearchFailure(404, "index_not_found_exception", error.reason);
    throw SearchFailure(503, "unavailable_shards_exception", std::string("the search daemon: ") + error.what());
  }
  SearchPage page;
  const Json::Value& result = answer["data"];
  page.total = result["total"].asInt64();
  for (const Json::Value& hit : result["hits"]) {
    const Json::Value& path = hit["fields"][kFieldPath];
    if (path.isString()) page.paths.push_back(path.asString());
  }
  return page;
}

}  // namespace spotlightd
}  // namespace corvlumex
