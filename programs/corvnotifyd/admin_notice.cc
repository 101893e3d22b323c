#include "programs/corvnotifyd/admin_notice.h"

#include "fileindex/queue/custom_event.h"

namespace corvlumex {
namespace notifyd {

int SendAdminNotice(const char* notice) {
  // The event thread must not hang on a slow desktop: no wait.
  return fileindex::RunAdminNotifier({"-c", "CORV.Lumex.Application", "@administrators", "app:displayname", notice},
                                     false);
}

}  // namespace notifyd
}  // namespace corvlumex
