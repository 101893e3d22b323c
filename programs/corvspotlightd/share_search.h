// Runs one Spotlight search on a share's index in corvelasticd.
//
// The share comes from the index name in the URL (the Samba configuration we
// write names each share's index, "fileindex_<share>", in
// elasticsearch:index) or, for "_all", from the scope folder of the search.
// Whatever the query says, hits are kept strictly below the share's folder
// (and below the scope): Samba treats a path outside the share as a failed
// search, and the share's own folder as a broken result.
//
// The search runs unfiltered (this daemon runs as root or the service user):
// Samba checks every path against the SMB user's rights before the client
// sees it. Only Samba may ask (the listener checks each peer).
#pragma once

#include <json/json.h>

#include <cstdint>
#include <stdexcept>
#include <string>
#include <vector>

namespace corvlumex {
namespace spotlightd {

// A failure with the HTTP status it is answered with.
class SearchFailure : public std::runtime_error {
 public:
  SearchFailure(int status, std::string type, const std::string& reason)
      : std::runtime_error(reason), status_(status), type_(std::move(type)) {}
  int status() const { return status_; }
  const std::string& type() const { return type_; }

 private:
  int status_;
  std::string type_;
};

struct ShareTarget {
  std::string index_id;    // corvelasticd's index
  std::string share_path;  // the share's own folder
};

// 404 for an index name that is no share's, or a scope in no share; 400 for
// a scope outside the URL's share.
ShareTarget ResolveShare(const std::string& index_name, const std::vector<std::string>& scopes);

struct SearchPage {
  int64_t total = 0;
  std::vector<std::string> paths;
};

// `clause` is corvelasticd's query; the share and scopes are added as path
// filters. corvelasticd's refusals become 400 (bad query), 404 (no such
// index) or 503 (busy, not running).
SearchPage SearchShare(const ShareTarget& share, const std::vector<std::string>& scopes, const Json::Value& clause,
                       int from, int size);

}  // namespace spotlightd
}  // namespace corvlumex
