// The exception that carries one of the daemon's failure codes
// (fileindex/elastic/daemon_codes.h) from deep inside a command to the answer
// envelope.
#pragma once

#include <stdexcept>
#include <string>

#include "fileindex/elastic/daemon_codes.h"

namespace corvlumex {
namespace elasticd {

class DaemonError : public std::runtime_error {
 public:
  DaemonError(int code, const std::string& message) : std::runtime_error(message), code_(code) {}
  int code() const { return code_; }

 private:
  int code_;
};

}  // namespace elasticd
}  // namespace corvlumex
