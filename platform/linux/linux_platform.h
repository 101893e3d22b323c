// The platform on a Debian host: plain files, the kernel and systemd stand
// in for the appliance's own services. Fixed paths go through SysPath:
//   /etc/corvlumex/shares.json          the share registry
//   /etc/corvlumex/monitor.d/           the notifier's queue configurations
//   /etc/corvlumex/service_command      optional: the program that starts/stops services
//   /etc/samba/corvlumex-spotlight.conf the SMB Spotlight switch (a samba include)
//   /var/log/corvlumex/service_requests.log  service requests recorded in a sandbox
#pragma once

#include "platform/platform.h"

namespace corvlumex {
namespace platform {

class LinuxPlatform : public Platform {
 public:
  int AclPermGet(const std::string& path) override;
  int DirIsMountPoint(const std::string& path) override;
  int FileCopy(const std::string& src, const std::string& dst, const CopyArgs& args, int flags) override;
  bool UserGet(const std::string& name, UserRecord* user) override;
  bool UserGetByUID(uid_t uid, UserRecord* user) override;
  bool ResetCredentialsByName(const std::string& name, bool with_groups) override;
  int ServiceUserHomeIsEnabled() override;

  int ShareGet(const std::string& name, std::unique_ptr<ShareInfo>* info) override;
  int ShareEnum(StringList* list, int filter) override;
  std::unique_ptr<StringList> StringListAlloc(size_t capacity) override;
  int ShareIsEncryptedGet(const ShareInfo& share, int* value) override;
  int ShareIsReadOnlyGet(const ShareInfo& share, int* value) override;
  int ShareIsEncryptionGet(const ShareInfo& share, int* value) override;
  int ShareRecycleStatusGet(const ShareInfo& share, int* value) override;
  int ShareHideUnreadableGet(const ShareInfo& share, int* value) override;
  int ShareUserPrivGet(const std::string& user, const ShareInfo& share) override;
  int ShareNamePathGet(const char* full_path, char* name, size_t name_size, char* path, size_t path_size) override;
  int ShareIsShareRecycle(const std::string& full_path) override;
  int RecycleUserHomePathIsExist(const std::string& full_path, int flags) override;

  int QueuePathCompose(const char* share_path, char* path, size_t size) override;
  int DBPathCompose(const char* share_path, char* path, size_t size) override;
  int GetIndexID(const char* share_name, char* name, size_t size) override;

  int GetFSType(const std::string& path, int flags) override;
  int FSIsRemoteFS(int type) override;
  int FSIsImageFS(int type) override;
  int FhsPathInSnapshot(const std::string& path, int* in_snapshot) override;
  int EAIsHiddenDir(const std::string& name) override;
  int QuotaIsEnough(uid_t uid, const std::string& path, uint64_t size) override;

  int ServiceStart(const std::string& name, bool wait) override;
  int ServiceStop(const std::string& name, bool wait) override;
  int ServiceRestart(const std::string& name) override;
  int ServicectlStart(const std::string& job, int type) override;
  int ServicectlStop(const std::string& job, int type) override;
  int Exec(const std::string& program, const std::vector<std::string>& args, int flags) override;
  int SMBIsEnableSpotlight() override;
  int SMBSetSpotlight(bool enable) override;
  int SMBSetSpotlightShares(const std::vector<std::string>& share_names) override;

  bool MonitorQueueUpsert(const Json::Value& queue, const std::string& app, int type) override;
  bool MonitorQueueDelete(const std::string& queue_path, const std::string& app, int type) override;

  void ParseFile(const std::string& path, const Json::Value& options, Json::Value& document) override;

 protected:
  // Free bytes of the volume holding `path` for an unprivileged writer
  // (statvfs f_bavail); false when statvfs fails. Tests override it to
  // stand for a full volume.
  virtual bool VolumeFreeBytes(const std::string& path, uint64_t* free_bytes);
  // Bytes `uid` may still write on the volume of `path` under its quota;
  // false when no quota applies or it cannot be read.
  virtual bool QuotaFreeBytes(uid_t uid, const std::string& path, uint64_t* free_bytes);
  // The magic number statfs reports for `path`; false on failure.
  virtual bool StatfsMagic(const std::string& path, long* magic);
  // The mount table's type name of the mount holding `path` ("fuse.sshfs"); empty when unknown.
  virtual std::string MountTypeName(const std::string& path);
};

}  // namespace platform
}  // namespace corvlumex
