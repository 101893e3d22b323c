// A Linux platform whose answers a test can change one at a time, installed
// for the test's lifetime.
#pragma once

#include <memory>
#include <string>

#include "platform/linux/linux_platform.h"

namespace corvlumex {
namespace testing_support {

class TestPlatform : public platform::LinuxPlatform {
 public:
  bool fail_spotlight_switch = false;
  bool fail_monitor = false;         // MonitorQueueUpsert / Delete refuse
  bool fail_db_compose = false;
  bool no_space = false;             // QuotaIsEnough reports a full volume
  bool recycle_follows_switch = false;  // "#recycle" is a bin only while the share's switch is on

  int SMBSetSpotlight(bool enable) override;
  bool MonitorQueueUpsert(const Json::Value& queue, const std::string& app, int type) override;
  bool MonitorQueueDelete(const std::string& queue_path, const std::string& app, int type) override;
  int DBPathCompose(const char* share_path, char* path, size_t size) override;
  int QuotaIsEnough(uid_t uid, const std::string& path, uint64_t size) override;
  int ShareIsShareRecycle(const std::string& full_path) override;
};

// Installs a TestPlatform for its lifetime; the default platform afterwards.
class ScopedTestPlatform {
 public:
  ScopedTestPlatform();
  ~ScopedTestPlatform();
  TestPlatform* operator->() { return platform_.get(); }

 private:
  std::shared_ptr<TestPlatform> platform_;
};

}  // namespace testing_support
}  // namespace corvlumex
