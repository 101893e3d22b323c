#include "common/sys.h"

#include <cstdlib>
#include <mutex>
#include <thread>

namespace corvlumex {
namespace {

std::mutex& SleepHookMutex() {
  static std::mutex mutex;
  return mutex;
}

std::function<void(std::chrono::microseconds)>& SleepHook() {
  static std::function<void(std::chrono::microseconds)> hook;
  return hook;
}

}  // namespace

std::string SysPath(const std::string& path) {
  const char* root = std::getenv("CORVLUMEX_ROOT");
  if (root == nullptr || *root == '\0') return path;
  return std::string(root) + path;
}

bool InSandbox() {
  const char* root = std::getenv("CORVLUMEX_ROOT");
  return root != nullptr && *root != '\0';
}

void SleepFor(std::chrono::microseconds duration) {
  std::function<void(std::chrono::microseconds)> hook;
  {
    std::lock_guard<std::mutex> guard(SleepHookMutex());
    hook = SleepHook();
  }
  if (hook) {
    hook(duration);
    return;
  }
  std::this_thread::sleep_for(duration);
}

void SetSleepHook(std::function<void(std::chrono::microseconds)> hook) {
  std::lock_guard<std::mutex> guard(SleepHookMutex());
  SleepHook() = std::move(hook);
}

}  // namespace corvlumex
