// The one platform fake of the tests: the Linux platform, where each answer
// a test sets (a hook) replaces the real one; Real<Name> gives the real
// answer to a hook that changes only some cases. Installed while a
// ScopedFakePlatform is alive.
#pragma once

#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "platform/linux/linux_platform.h"

namespace corvlumex {
namespace testing_support {

#define CORV_FAKE_HOOK(Ret, Name, Params, Args)                                                 \
 public:                                                                                       \
  std::function<Ret Params> Name##Hook;                                                        \
  Ret Real##Name Params { return LinuxPlatform::Name Args; }                                   \
  Ret Name Params override { return Name##Hook ? Name##Hook Args : LinuxPlatform::Name Args; }

class FakePlatform : public platform::LinuxPlatform {
  using ShareInfo = platform::ShareInfo;
  CORV_FAKE_HOOK(bool, StatfsMagic, (const std::string& path, long* magic), (path, magic))
  CORV_FAKE_HOOK(std::string, MountTypeName, (const std::string& path), (path))
  CORV_FAKE_HOOK(int, DirIsMountPoint, (const std::string& path), (path))
  CORV_FAKE_HOOK(bool, VolumeFreeBytes, (const std::string& path, uint64_t* bytes), (path, bytes))
  CORV_FAKE_HOOK(bool, QuotaFreeBytes, (uid_t uid, const std::string& path, uint64_t* bytes), (uid, path, bytes))
  CORV_FAKE_HOOK(int, QuotaIsEnough, (uid_t uid, const std::string& path, uint64_t size), (uid, path, size))
  CORV_FAKE_HOOK(int, EAIsHiddenDir, (const std::string& name), (name))
  CORV_FAKE_HOOK(bool, UserGetByUID, (uid_t uid, platform::UserRecord* user), (uid, user))
  CORV_FAKE_HOOK(bool, ResetCredentialsByName, (const std::string& name, bool with_groups), (name, with_groups))
  CORV_FAKE_HOOK(int, ShareEnum, (platform::StringList* list, int filter), (list, filter))
  CORV_FAKE_HOOK(std::unique_ptr<platform::StringList>, StringListAlloc, (size_t capacity), (capacity))
  CORV_FAKE_HOOK(int, ShareIsEncryptedGet, (const ShareInfo& share, int* value), (share, value))
  CORV_FAKE_HOOK(int, ShareIsReadOnlyGet, (const ShareInfo& share, int* value), (share, value))
  CORV_FAKE_HOOK(int, ShareIsEncryptionGet, (const ShareInfo& share, int* value), (share, value))
  CORV_FAKE_HOOK(int, ShareRecycleStatusGet, (const ShareInfo& share, int* value), (share, value))
  CORV_FAKE_HOOK(int, ShareHideUnreadableGet, (const ShareInfo& share, int* value), (share, value))
  CORV_FAKE_HOOK(int, ShareIsShareRecycle, (const std::string& full_path), (full_path))
  CORV_FAKE_HOOK(int, QueuePathCompose, (const char* share_path, char* path, size_t size), (share_path, path, size))
  CORV_FAKE_HOOK(int, DBPathCompose, (const char* share_path, char* path, size_t size), (share_path, path, size))
  CORV_FAKE_HOOK(int, GetIndexID, (const char* share_name, char* name, size_t size), (share_name, name, size))
  CORV_FAKE_HOOK(int, Exec, (const std::string& program, const std::vector<std::string>& args, int flags),
                 (program, args, flags))
  CORV_FAKE_HOOK(int, SMBSetSpotlight, (bool enable), (enable))
  CORV_FAKE_HOOK(bool, MonitorQueueUpsert, (const Json::Value& queue, const std::string& app, int type), (queue, app, type))
  CORV_FAKE_HOOK(bool, MonitorQueueDelete, (const std::string& queue_path, const std::string& app, int type),
                 (queue_path, app, type))
  CORV_FAKE_HOOK(void, ParseFile, (const std::string& path, const Json::Value& options, Json::Value& document),
                 (path, options, document))

 public:
  // The answers of a full volume and of a refused platform call, with the platform error set.
  static int NoSpace();
  static int Refuse(int error_code);
  // The notifier's queue configuration cannot be written or removed.
  void RefuseMonitorQueues();
};

#undef CORV_FAKE_HOOK

// Installs a fresh FakePlatform while alive; the default platform afterwards.
class ScopedFakePlatform {
 public:
  ScopedFakePlatform();
  ~ScopedFakePlatform();
  FakePlatform* operator->() const { return platform_.get(); }
  FakePlatform& operator*() const { return *platform_; }

 private:
  std::shared_ptr<FakePlatform> platform_;
};

}  // namespace testing_support
}  // namespace corvlumex
