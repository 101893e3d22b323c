// The one exception type of the library and its fixed failure codes.
#pragma once

#include <cstdint>
#include <stdexcept>
#include <string>

#include "common/export.h"

CORVLUMEX_API_BEGIN

namespace corvlumex {

// The numbers are part of the interface: daemons and front ends log them.
enum ErrorCode : int32_t {
  kErrorBadArgument = 120,
  kErrorShareEnum = 121,
  kErrorSystem = 502,
  kErrorSwitchUser = 503,
  kErrorLoadJson = 504,
  kErrorSaveJson = 505,
  kErrorLockFile = 506,
  kErrorShareNotFound = 800,
  kErrorUserLookup = 801,
  kErrorTooManyFolders = 900,
  kErrorDuplicatedId = 901,
  kErrorFolderNotFound = 902,
  kErrorPathCannotIndex = 903,
  kErrorMalformedEvent = 906,
  kErrorSearchRequest = 913,
  kErrorParseDocument = 914,
  kErrorQueryAnswer = 916,
  kErrorNoSpace = 1003,
  kErrorUnexpected = 9999,
};

class Error : public std::runtime_error {
 public:
  explicit Error(ErrorCode code);
  Error(ErrorCode code, const std::string& reason);

  ErrorCode code;
  std::string reason;
};

}  // namespace corvlumex

CORVLUMEX_API_END
