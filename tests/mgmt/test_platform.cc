#include "tests/mgmt/test_platform.h"

#include <memory>

namespace corvlumex {
namespace testing_support {

using platform::kPlatformErrNoSpace;

#define FAIL_IF(flag, code)                     \
  do {                                          \
    if (flag) {                                 \
      CORV_PLATFORM_ERROR(code, "test failure"); \
      return -1;                                \
    }                                           \
  } while (0)

int TestPlatform::SMBSetSpotlight(bool enable) {
  FAIL_IF(fail_spotlight_switch, platform::kPlatformErrConfig);
  return LinuxPlatform::SMBSetSpotlight(enable);
}

bool TestPlatform::MonitorQueueUpsert(const Json::Value& queue, const std::string& app, int type) {
  return !fail_monitor && LinuxPlatform::MonitorQueueUpsert(queue, app, type);
}

bool TestPlatform::MonitorQueueDelete(const std::string& queue_path, const std::string& app, int type) {
  return !fail_monitor && LinuxPlatform::MonitorQueueDelete(queue_path, app, type);
}

int TestPlatform::DBPathCompose(const char* share_path, char* path, size_t size) {
  FAIL_IF(fail_db_compose, platform::kPlatformErrBadArgument);
  return LinuxPlatform::DBPathCompose(share_path, path, size);
}

int TestPlatform::QuotaIsEnough(uid_t uid, const std::string& path, uint64_t size) {
  if (no_space) {
    CORV_PLATFORM_ERROR(kPlatformErrNoSpace, "test: volume full");
    return 0;
  }
  return LinuxPlatform::QuotaIsEnough(uid, path, size);
}

int TestPlatform::ShareIsShareRecycle(const std::string& full_path) {
  const int in_bin = LinuxPlatform::ShareIsShareRecycle(full_path);
  if (!recycle_follows_switch || in_bin <= 0) return in_bin;
  char name[platform::kShareNameMax] = {};
  char dir[platform::kPathBufferSize] = {};
  if (ShareNamePathGet(full_path.c_str(), name, sizeof(name), dir, sizeof(dir)) < 0) return -1;
  std::unique_ptr<platform::ShareInfo> share;
  if (ShareGet(name, &share) < 0) return -1;
  return share->recycle_bin ? 1 : 0;
}

ScopedTestPlatform::ScopedTestPlatform() : platform_(std::make_shared<TestPlatform>()) {
  platform::Install(platform_);
}

ScopedTestPlatform::~ScopedTestPlatform() { platform::Install(nullptr); }

}  // namespace testing_support
}  // namespace corvlumex
