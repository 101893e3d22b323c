// The appliance's platform services as one interface. The library never asks
// the operating system a platform question directly: it asks Current(), which
// is the Linux implementation unless a test or program installed another.
//
// Conventions of the interface, kept from the appliance's C libraries so the
// callers read the same everywhere: integer results are negative on failure,
// and every failure leaves the calling thread's last platform error
// (LastError(): number, source file, source line and a readable message).
#pragma once

#include <json/json.h>
#include <sys/types.h>

#include <cstddef>
#include <cstdint>
#include <map>
#include <memory>
#include <string>
#include <vector>

#include "common/export.h"
#include "common/log.h"

CORVLUMEX_API_BEGIN

namespace corvlumex {
namespace platform {

// ---------------------------------------------------------------------------
// Last platform error (per thread, like errno).

enum PlatformErrorCode : int {
  kPlatformErrNone = 0x0000,
  kPlatformErrBadArgument = 0x0100,     // empty or malformed argument
  kPlatformErrBufferTooSmall = 0x0200,  // the answer does not fit the caller's buffer
  kPlatformErrSystem = 0x0300,          // a system call failed (the message names it)
  kPlatformErrRegistry = 0x0400,        // the share registry is missing or invalid
  kPlatformErrShareNotFound = 0x0500,   // no share of that name, or no share holds the path
  kPlatformErrUserNotFound = 0x0600,    // no user of that name or id
  kPlatformErrCredentials = 0x0700,     // the effective user or groups could not be set
  kPlatformErrService = 0x0800,         // the service command failed
  kPlatformErrExec = 0x0900,            // a program could not be run or did not exit 0
  kPlatformErrConfig = 0x0A00,          // a platform configuration file could not be written
  kPlatformErrQuotaExceeded = 0x2400,   // lack of space: the owner's quota is used up
  kPlatformErrNoSpace = 0x2900,         // lack of space: the volume is full
};

struct ErrorRecord {
  int code = kPlatformErrNone;
  std::string file;     // source unit that recorded the error ("shares.cc")
  int line = 0;
  std::string message;  // what went wrong, for people
};

// The calling thread's last platform error.
const ErrorRecord& LastError();
void SetLastError(int code, const char* file, int line, const std::string& message);
void ClearLastError();

// Logs "file:line (pid, euid) (function) <what>: err=[0x%04X file:line]" with
// the thread's last platform error; `what` is the caller's text, for example
// "KLIBServiceRestart failed".
void LogPlatformError(const char* file, int line, const char* function, const char* what);

// ---------------------------------------------------------------------------
// Records.

struct UserRecord {
  std::string name;
  uid_t uid = 0;
  gid_t gid = 0;
  std::string home;
};

// Options of a file copy.
struct CopyArgs {
  bool keep_attributes = false;  // keep mode, owner and times where allowed
  bool move = false;             // remove the source once the copy is complete
};

// A user's privilege on a share (ShareUserPrivGet).
enum SharePrivilege : int {
  kSharePrivNone = 0,       // no access
  kSharePrivReadOnly = 1,   // may read
  kSharePrivReadWrite = 2,  // may read and write
};

// Bits of a share's FTP privilege word; 0 allows everything.
enum FtpPrivilegeBits : uint32_t {
  kFtpPrivNoList = 0x1,      // directory listings refused
  kFtpPrivNoUpload = 0x2,    // uploads, renames and deletes refused
  kFtpPrivNoDownload = 0x4,  // downloads refused
  kFtpPrivAll = 0x7,
};

// One share of the registry.
struct ShareInfo {
  std::string name;  // the share's name; the last component of `path`
  std::string path;  // the share's own absolute directory (/volume1/photo)
  bool readonly = false;
  bool encrypted = false;
  bool recycle_bin = false;
  bool hide_unreadable = false;
  uint32_t ftp_privilege = 0;                      // FtpPrivilegeBits
  std::map<std::string, SharePrivilege> privileges;  // per user; absent users follow the directory's mode
};

// Filters of ShareEnum (bits; 0 lists every share).
enum ShareEnumFilter : int {
  kShareEnumAll = 0,
  kShareEnumSkipReadOnly = 0x1,
  kShareEnumSkipEncrypted = 0x2,
};

using StringList = std::vector<std::string>;

// File-system type codes (GetFSType). The numbers are stable; 0 is a file
// system this platform does not know.
enum FsTypeCode : int {
  kFsUnknown = 0,
  kFsExt = 1,  // ext2, ext3, ext4
  kFsBtrfs = 2,
  kFsXfs = 3,
  kFsTmpfs = 4,
  kFsVfat = 5,
  kFsExfat = 6,
  kFsNtfs = 7,
  kFsZfs = 8,
  kFsF2fs = 9,
  kFsOverlay = 10,
  kFsFuseLocal = 11,  // FUSE file systems over local data (ntfs-3g, mergerfs, gocryptfs...)
  // Kernel pseudo file systems (proc, sysfs, devpts, cgroup, debugfs...):
  // they hold no user data, and their files change without telling anyone.
  kFsPseudo = 12,
  kFsOtherLocal = 13,  // other local disk file systems (jfs, reiserfs, nilfs2, hfs+...)
  // Remote file systems.
  kFsNfs = 20,
  kFsSmb = 21,  // smb, cifs, smb2/3
  kFsFuseNetwork = 22,  // FUSE network mounts (sshfs, rclone, s3fs, glusterfs, ceph-fuse...)
  kFs9p = 23,
  kFsCeph = 24,
  kFsAfs = 25,
  kFsOtherRemote = 26,  // coda, lustre, ncp, orangefs, beegfs
  // Image file systems (mounted disc or archive images).
  kFsIso9660 = 30,
  kFsUdf = 31,
  kFsSquashfs = 32,
  kFsCramfs = 33,
  kFsErofs = 34,
  kFsRomfs = 35,
  kFsArchive = 36,  // archives mounted as folders (archivemount, fuse-zip)
};

// Flags of Exec.
enum ExecFlags : int {
  kExecWait = 0x01,         // wait for the program and return its exit status
  kExecNullStdin = 0x02,    // stdin from /dev/null
  kExecSearchPath = 0x04,   // look the program up in PATH when it has no "/"
  kExecNullStdout = 0x08,   // stdout to /dev/null
  kExecNullStderr = 0x10,   // stderr to /dev/null
  kExecCloseFds = 0x20,     // close every descriptor above 2 in the child
  kExecNewSession = 0x80,   // the child leads a new session (setsid)
  kExecDefault = kExecWait | kExecNullStdin | kExecCloseFds,
};

// Kinds of job for ServicectlStart/Stop.
enum ServicectlType : int {
  kServicectlUpstart = 1,  // a package job (a systemd unit on Linux)
};

// The queue type under which the library registers its monitor queues.
enum MonitorQueueType : int {
  kMonitorQueueTypeApplication = 1,
};

// Buffer sizes the callers use for the path questions.
constexpr size_t kShareNameMax = 492;
constexpr size_t kPathBufferSize = 4096;
constexpr size_t kIndexIdBufferSize = 1024;

// The loopback port of corvspotlightd, the responder behind Samba's Spotlight
// back end (not Elasticsearch's 9200, so both can run on one server).
constexpr int kSpotlightResponderPort = 9210;

class Platform {
 public:
  virtual ~Platform() = default;

  // --- Files and users (foundations) ---
  // Permission bits (R_OK | W_OK | X_OK) the calling identity holds on `path`,
  // ACLs included; negative when the path cannot be examined.
  virtual int AclPermGet(const std::string& path) = 0;
  // >0 when `path` is a mount point, 0 when not, <0 on failure.
  virtual int DirIsMountPoint(const std::string& path) = 0;
  // 0 on success, negative on failure. `flags` is reserved (1 = overwrite).
  virtual int FileCopy(const std::string& src, const std::string& dst, const CopyArgs& args, int flags) = 0;
  // Looks a user up by name; false when unknown. In a sandbox root, "root"
  // and "CorvLumex" stand for the user running the process.
  virtual bool UserGet(const std::string& name, UserRecord* user) = 0;
  // Looks a user up by id; false when unknown.
  virtual bool UserGetByUID(uid_t uid, UserRecord* user) = 0;
  // Switches the effective user (and with `with_groups` the effective and
  // supplementary groups) to the named user; false on failure.
  virtual bool ResetCredentialsByName(const std::string& name, bool with_groups) = 0;
  // 1 when user home folders are served (a "homes" share exists), 0 when not.
  virtual int ServiceUserHomeIsEnabled() = 0;

  // --- Shares ---
  // Loads the share's record: 0 and `*info` set, or negative.
  virtual int ShareGet(const std::string& name, std::unique_ptr<ShareInfo>* info) = 0;
  // Fills a list allocated by StringListAlloc with the names of the shares
  // that pass `filter` (ShareEnumFilter bits); negative on failure.
  virtual int ShareEnum(StringList* list, int filter) = 0;
  // A list with room for `capacity` names; null when it cannot be allocated.
  virtual std::unique_ptr<StringList> StringListAlloc(size_t capacity) = 0;
  // Share flags: 0 and `*value` set to 0 or 1, or negative.
  virtual int ShareIsEncryptedGet(const ShareInfo& share, int* value) = 0;
  virtual int ShareIsReadOnlyGet(const ShareInfo& share, int* value) = 0;
  virtual int ShareIsEncryptionGet(const ShareInfo& share, int* value) = 0;
  virtual int ShareRecycleStatusGet(const ShareInfo& share, int* value) = 0;
  virtual int ShareHideUnreadableGet(const ShareInfo& share, int* value) = 0;
  // The user's SharePrivilege on the share, or negative (unknown user).
  virtual int ShareUserPrivGet(const std::string& user, const ShareInfo& share) = 0;
  // The share holding `full_path`: its name and its own directory, written
  // NUL-terminated into the caller's buffers. Negative when no share holds
  // the path or a buffer is too small.
  virtual int ShareNamePathGet(const char* full_path, char* name, size_t name_size, char* path,
                               size_t path_size) = 0;
  // 1 when `full_path` is in its share's recycle bin, 0 when not, <0 on failure.
  virtual int ShareIsShareRecycle(const std::string& full_path) = 0;
  // 1 when `full_path` is in a user's recycle bin inside the home folders,
  // 0 when not, <0 on failure. `flags` is passed through from the caller.
  virtual int RecycleUserHomePathIsExist(const std::string& full_path, int flags) = 0;

  // --- Index files of a share ---
  // The share's event queue file, from the share's own directory.
  virtual int QueuePathCompose(const char* share_path, char* path, size_t size) = 0;
  // The directory of the share's index database.
  virtual int DBPathCompose(const char* share_path, char* path, size_t size) = 0;
  // The index name of the share.
  virtual int GetIndexID(const char* share_name, char* name, size_t size) = 0;

  // --- File systems ---
  // FsTypeCode of the file system holding `path`, or negative. `flags` is reserved (0).
  virtual int GetFSType(const std::string& path, int flags) = 0;
  // Non-zero for remote file systems.
  virtual int FSIsRemoteFS(int type) = 0;
  // Non-zero for file systems of mounted images.
  virtual int FSIsImageFS(int type) = 0;
  // 0 and `*in_snapshot` set (1 inside a snapshot), or negative.
  virtual int FhsPathInSnapshot(const std::string& path, int* in_snapshot) = 0;
  // 1 when `name` is one of the platform's hidden metadata directories.
  virtual int EAIsHiddenDir(const std::string& name) = 0;
  // 1 when the volume of `path` has at least `size` bytes for user `uid`;
  // 0 when not (last error kPlatformErrNoSpace or kPlatformErrQuotaExceeded)
  // or when it cannot tell (another last error).
  virtual int QuotaIsEnough(uid_t uid, const std::string& path, uint64_t size) = 0;

  // --- Services and programs ---
  // Start/stop/restart a system service by name; `wait` waits until done.
  // 0 on success, negative on failure.
  virtual int ServiceStart(const std::string& name, bool wait) = 0;
  virtual int ServiceStop(const std::string& name, bool wait) = 0;
  // "samba" is never restarted (that would drop every connected SMB
  // client): its restart re-reads the configuration (a reload).
  virtual int ServiceRestart(const std::string& name) = 0;
  // Start/stop a package job (ServicectlType).
  virtual int ServicectlStart(const std::string& job, int type) = 0;
  virtual int ServicectlStop(const std::string& job, int type) = 0;
  // Runs `program` with `args` (argv[1]...) without a shell. With kExecWait
  // the program's exit status (0..255), else 0 once started; negative when
  // it cannot be started or ends by a signal.
  virtual int Exec(const std::string& program, const std::vector<std::string>& args, int flags) = 0;
  // SMB Spotlight search: 1 on, 0 off, negative on failure. When on, Samba
  // sends each search to corvspotlightd on 127.0.0.1:kSpotlightResponderPort.
  virtual int SMBIsEnableSpotlight() = 0;
  // 0 on success, negative on failure.
  virtual int SMBSetSpotlight(bool enable) = 0;
  // The shares whose Spotlight searches are answered from their index (the
  // indexed ones): 1 when the SMB configuration changed, 0 when it already
  // said so, negative on failure.
  virtual int SMBSetSpotlightShares(const std::vector<std::string>& share_names) = 0;

  // --- Notification daemon's queue configuration ---
  // Writes or replaces the configuration of `queue["queue"]` for `app`.
  virtual bool MonitorQueueUpsert(const Json::Value& queue, const std::string& app, int type) = 0;
  // Removes it; removing one that does not exist succeeds.
  virtual bool MonitorQueueDelete(const std::string& queue_path, const std::string& app, int type) = 0;

  // --- Content extraction ---
  // Fills `document` with the search fields of `path`; options carry
  // "need_meta". Throws on failure.
  virtual void ParseFile(const std::string& path, const Json::Value& options, Json::Value& document) = 0;
};

// The installed platform (the Linux implementation by default).
std::shared_ptr<Platform> Current();
// Replaces the installed platform; an empty pointer restores the default.
void Install(std::shared_ptr<Platform> platform);

}  // namespace platform
}  // namespace corvlumex

CORVLUMEX_API_END

// Records a platform error with the caller's source file and line.
#define CORV_PLATFORM_ERROR(code, message)                                                          \
  ::corvlumex::platform::SetLastError(code, ::corvlumex::log_detail::BaseName(__FILE__), __LINE__, \
                                      message)

// "file:line (pid, euid) (function) <what>: err=[0x%04X file:line]" with the
// thread's last platform error.
#define CORV_LOG_PLATFORM_ERROR(what) \
  ::corvlumex::platform::LogPlatformError(::corvlumex::log_detail::BaseName(__FILE__), __LINE__, __func__, what)
