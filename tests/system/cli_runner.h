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

CliResult RunCli(const std::vector<std::string>& args);

}  // namespace testing_support
}  // namespace corvlumex
