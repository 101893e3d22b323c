// Advisory lock on a file: the only exclusion between the processes that
// share a state file (daemon, web handlers, command-line tools).
#pragma once

#include <string>

#include "common/export.h"

CORVLUMEX_API_BEGIN

namespace corvlumex {

class LockFile {
 public:
  // Retries with a random back-off; throws Error 506 when it cannot lock.
  LockFile(const std::string& path, bool exclusive);
  ~LockFile();
  LockFile(const LockFile&) = delete;
  LockFile& operator=(const LockFile&) = delete;

 private:
  int fd_;
  std::string path_;
};

}  // namespace corvlumex

CORVLUMEX_API_END
