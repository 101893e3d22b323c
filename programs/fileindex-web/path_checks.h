// The one rule for paths a browser sends: absolute, no empty, "." or ".."
// component, no trailing slash, no NUL. Anything else is refused before a
// path reaches the file system or a management operation.
#pragma once

#include <string>

namespace corvlumex {
namespace web {

bool IsCleanAbsolutePath(const std::string& path);

}  // namespace web
}  // namespace corvlumex
