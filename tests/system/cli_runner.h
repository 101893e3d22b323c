// Runs the fileindex command line of the build folder and collects what it
// printed and its exit status.
#pragma once

#include <string>
#include <vector>

namespace corvlumex {
namespace testing_support {

struct CliResult {
  int status = -1;
  std::string out;
  std::string err;
};

// `as_user` other than 0 runs it under that user id (and group "nogroup"),
// for what an unprivileged user sees; the caller must be root then.
CliResult RunCli(const std::vector<std::string>& args, unsigned as_user = 0);

}  // namespace testing_support
}  // namespace corvlumex
