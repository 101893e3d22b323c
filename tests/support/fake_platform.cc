#include "tests/support/fake_platform.h"

namespace corvlumex {
namespace testing_support {

int FakePlatform::NoSpace() {
  CORV_PLATFORM_ERROR(platform::kPlatformErrNoSpace, "test: volume full");
  return 0;
}

int FakePlatform::Refuse(int error_code) {
  CORV_PLATFORM_ERROR(error_code, "test failure");
  return -1;
}

void FakePlatform::RefuseMonitorQueues() {
  MonitorQueueUpsertHook = [](auto&&...) { return false; };
  MonitorQueueDeleteHook = [](auto&&...) { return false; };
}

ScopedFakePlatform::ScopedFakePlatform() : platform_(std::make_shared<FakePlatform>()) { platform::Install(platform_); }

ScopedFakePlatform::~ScopedFakePlatform() { platform::Install(nullptr); }

}  // namespace testing_support
}  // namespace corvlumex
