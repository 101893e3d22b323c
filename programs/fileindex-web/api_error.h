// The one failure of the web API: an HTTP status, a code (the library's
// error code for failures of a management operation, the HTTP status for the
// web daemon's own refusals), the reason, and what the person can do next.
// Every handler throws it; the server turns it into
//   {"success": false, "error": {"code", "reason", "what_to_do"}}.
#pragma once

#include <stdexcept>
#include <string>

namespace corvlumex {
namespace web {

class ApiError : public std::runtime_error {
 public:
  ApiError(int status, const std::string& reason, const std::string& what_to_do, int code = 0)
      : std::runtime_error(reason), status_(status), code_(code == 0 ? status : code), what_to_do_(what_to_do) {}
  int status() const { return status_; }
  int code() const { return code_; }
  const std::string& what_to_do() const { return what_to_do_; }

 private:
  int status_;
  int code_;
  std::string what_to_do_;
};

}  // namespace web
}  // namespace corvlumex
