#include "programs/corvnotifyd/admin_notice.h"

#include <string>
#include <vector>

#include "common/sys.h"
#include "platform/platform.h"

namespace corvlumex {
namespace notifyd {

int SendAdminNotice(const char* notice) {
  using platform::ExecFlags;
  // The tool's usual flags, less the wait.
  const int flags = ExecFlags::kExecNullStdin | ExecFlags::kExecNullStdout | ExecFlags::kExecNullStderr |
                    ExecFlags::kExecCloseFds | ExecFlags::kExecNewSession;
  const int result = platform::Current()->Exec(
      SysPath("/usr/corv/bin/corvvxmnotify"),
      {"-c", "CORV.Lumex.Application", "@administrators", "app:displayname", notice}, flags);
  if (result < 0) CORV_LOG_PLATFORM_ERROR("corvvxmnotify failed");
  return result;
}

}  // namespace notifyd
}  // namespace corvlumex
