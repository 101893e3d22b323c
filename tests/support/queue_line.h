// One queue line in the notifier's form, for tests and benchmarks.
#pragma once

#include <json/json.h>

#include <string>

#include "common/json_util.h"

namespace corvlumex {
namespace fileindex {
namespace queue_testing {

inline std::string Line(unsigned mask, const std::string& path, bool is_dir = false,
                        const std::string& path_old = "") {
  Json::Value line(Json::objectValue);
  line["event"] = mask;
  line["is_dir"] = is_dir;
  line["path"] = path;
  if (!path_old.empty()) line["path_old"] = path_old;
  return JsonToString(line);
}

}  // namespace queue_testing
}  // namespace fileindex
}  // namespace corvlumex
