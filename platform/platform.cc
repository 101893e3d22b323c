#include "platform/platform.h"

#include <mutex>

#include "platform/linux/linux_platform.h"

namespace corvlumex {
namespace platform {
namespace {

std::mutex& InstalledMutex() {
  static std::mutex mutex;
  return mutex;
}

std::shared_ptr<Platform>& Installed() {
  static std::shared_ptr<Platform> installed;
  return installed;
}

}  // namespace

std::shared_ptr<Platform> Current() {
  std::lock_guard<std::mutex> guard(InstalledMutex());
  if (!Installed()) Installed() = std::make_shared<LinuxPlatform>();
  return Installed();
}

void Install(std::shared_ptr<Platform> platform) {
  std::lock_guard<std::mutex> guard(InstalledMutex());
  Installed() = std::move(platform);
}

}  // namespace platform
}  // namespace corvlumex
