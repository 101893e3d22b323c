// "The same path or below it": whether a path lies in a folder, compared as
// text (no file-system access, no normalisation), with "/" as the separator.
// A folder never holds a sibling whose name only starts like it: "/v/s/a"
// holds "/v/s/a/b" but not "/v/s/ab". A folder that ends in "/" (the root
// "/") holds whatever starts with it.
#pragma once

#include <string>

#include "common/export.h"

CORVLUMEX_API_BEGIN

namespace corvlumex {

// `path` is `folder` itself or anything inside it: what a folder governs, or
// what a rename of the folder carries along.
bool IsPathAtOrBelow(const std::string& path, const std::string& folder);

// `path` is inside `folder` and is not the folder itself: the folder's
// descendants only.
bool IsPathStrictlyBelow(const std::string& path, const std::string& folder);

// The text every path strictly below `folder` starts with ("/v/s/a" gives
// "/v/s/a/", "/" gives "/"): the bound of a prefix query or of a range scan
// over sorted paths.
std::string PrefixOfPathsBelow(const std::string& folder);

}  // namespace corvlumex

CORVLUMEX_API_END
