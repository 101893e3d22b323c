#include "common/error.h"

#include <sstream>

namespace corvlumex {
namespace {

std::string BuildMessage(ErrorCode code, const std::string& reason) {
  std::ostringstream message;
  message << "CorvLumex error, code=" << static_cast<int32_t>(code);
  // An empty reason leaves no empty brackets behind.
  if (!reason.empty()) message << ", reason=[" << reason << "]";
  return message.str();
}

}  // namespace

Error::Error(ErrorCode code) : Error(code, std::string()) {}

Error::Error(ErrorCode code, const std::string& reason)
    : std::runtime_error(BuildMessage(code, reason)), code(code), reason(reason) {}

}  // namespace corvlumex
