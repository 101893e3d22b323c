// corvelasticd's "search" request for what a person asked: the words (as a
// query clause), the shares, a category of files, date and size bounds,
// paging and highlighting. Both front ends build their searches here so a
// filter means the same from the command line and from the browser.
#pragma once

#include <json/json.h>

#include <optional>
#include <string>
#include <vector>

namespace corvlumex {
namespace frontend {

struct SearchParams {
  Json::Value qsl;                     // the words as a clause; null: everything
  std::vector<std::string> shares;     // none: every indexed share
  std::string category;                // "document", "audio", "video", "image" or empty
  std::optional<long long> modified_from, modified_to;  // seconds since 1970, inclusive
  std::optional<long long> size_min, size_max;          // bytes, inclusive
  unsigned from = 0, size = 20;
  bool highlight = false;
  std::string highlight_pre = "[", highlight_post = "]";
  size_t highlight_size = 160;
  bool track_total = true;
  std::string as_user;                 // search on behalf of this user (root/service user only)
};

// The fields each hit carries back: path, folder flag, size, modification time.
const std::vector<std::string>& HitFields();

Json::Value SearchRequest(const SearchParams& params);

// corvelasticd's "suggest" request: up to `size` file-name words that begin
// with `text`, in the shares named (none: every indexed share), seen as
// `as_user` when given.
Json::Value SuggestRequest(const std::vector<std::string>& shares, const std::string& text, unsigned size,
                           const std::string& as_user = "");

// A "search" request for one page of the documents of `share` that match
// `qsl`, in key (full path) order, each hit with its path only: what a
// listing of an index's contents asks.
Json::Value PathsPageRequest(const std::string& share, const Json::Value& qsl, unsigned from, unsigned size);

// "/share/dir": "fileindex_share" ids of the shares, for "ids".
Json::Value IndexIds(const std::vector<std::string>& shares);

}  // namespace frontend
}  // namespace corvlumex
