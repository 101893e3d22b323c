// File systems, snapshots, hidden names, free space, users and the last
// platform error of the Linux platform.
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <fstream>

#include "common/file_util.h"
#include "platform/linux/linux_platform.h"
#include "platform/linux/mount_table.h"
#include "tests/platform/share_sandbox.h"

namespace corvlumex {
namespace platform {
namespace {

using testing_support::LogCapture;
using testing_support::SandboxRoot;

// Answers statfs and the mount table as a test machine cannot: any magic
// number and mount type for paths below `prefix_`.
class FakeMountPlatform : public LinuxPlatform {
 public:
  FakeMountPlatform(std::string prefix, long magic, std::string type)
      : prefix_(std::move(prefix)), magic_(magic), type_(std::move(type)) {}

 protected:
  bool StatfsMagic(const std::string& path, long* magic) override {
    if (!StringStartWith(path, prefix_)) return LinuxPlatform::StatfsMagic(path, magic);
    *magic = magic_;
    return true;
  }
  std::string MountTypeName(const std::string& path) override {
    return StringStartWith(path, prefix_) ? type_ : LinuxPlatform::MountTypeName(path);
  }

 private:
  std::string prefix_;
  long magic_;
  std::string type_;
};

int TypeOf(long magic, const std::string& mount_type = "") {
  FakeMountPlatform platform("/fake", magic, mount_type);
  return platform.GetFSType("/fake/dir", 0);
}

TEST(FsTypeTest, LocalDisksAndTmpAreOrdinaryFileSystems) {
  LinuxPlatform platform;
  SandboxRoot root(false);
  for (const std::string& path : {root.path(), std::string("/tmp"), std::string("/")}) {
    const int type = platform.GetFSType(path, 0);
    EXPECT_GE(type, 0) << path;
    EXPECT_NE(type, kFsPseudo) << path;
    EXPECT_EQ(platform.FSIsRemoteFS(type), 0) << path;
    EXPECT_EQ(platform.FSIsImageFS(type), 0) << path;
  }
  EXPECT_EQ(platform.GetFSType("/proc/self", 0), kFsPseudo);
  EXPECT_LT(platform.GetFSType(root.path() + "/missing", 0), 0);
  EXPECT_EQ(LastError().code, kPlatformErrSystem);
  EXPECT_LT(platform.GetFSType("", 0), 0);
}

TEST(FsTypeTest, MagicNumbersAndMountTypes) {
  EXPECT_EQ(TypeOf(0xEF53), kFsExt);
  EXPECT_EQ(TypeOf(0x9123683E), kFsBtrfs);
  EXPECT_EQ(TypeOf(0x58465342), kFsXfs);
  EXPECT_EQ(TypeOf(0x01021994, "tmpfs"), kFsTmpfs);
  EXPECT_EQ(TypeOf(0x01021994, "devtmpfs"), kFsPseudo);
  EXPECT_EQ(TypeOf(0x12345678), kFsUnknown);  // unknown is not refused
  EXPECT_EQ(TypeOf(0x6969), kFsNfs);
  EXPECT_EQ(TypeOf(0xFF534D42), kFsSmb);
  EXPECT_EQ(TypeOf(0xFE534D42), kFsSmb);
  EXPECT_EQ(TypeOf(0x01021997), kFs9p);
  EXPECT_EQ(TypeOf(0x00C36400), kFsCeph);
  EXPECT_EQ(TypeOf(0x65735546, "fuse.sshfs"), kFsFuseNetwork);
  EXPECT_EQ(TypeOf(0x65735546, "fuse.rclone"), kFsFuseNetwork);
  EXPECT_EQ(TypeOf(0x65735546, "fuseblk.ntfs-3g"), kFsFuseLocal);
  EXPECT_EQ(TypeOf(0x65735546, "fuse"), kFsFuseLocal);
  EXPECT_EQ(TypeOf(0x65735546, "fuse.fuseiso"), kFsIso9660);
  EXPECT_EQ(TypeOf(0x9660), kFsIso9660);
  EXPECT_EQ(TypeOf(0x15013346), kFsUdf);
  EXPECT_EQ(TypeOf(0x73717368), kFsSquashfs);
  EXPECT_EQ(TypeOf(0x9FA0), kFsPseudo);

  LinuxPlatform platform;
  for (int remote : {kFsNfs, kFsSmb, kFsFuseNetwork, kFs9p, kFsCeph, kFsAfs, kFsOtherRemote}) {
    EXPECT_NE(platform.FSIsRemoteFS(remote), 0) << remote;
    EXPECT_EQ(platform.FSIsImageFS(remote), 0) << remote;
  }
  for (int image : {kFsIso9660, kFsUdf, kFsSquashfs, kFsCramfs, kFsErofs, kFsRomfs, kFsArchive}) {
    EXPECT_NE(platform.FSIsImageFS(image), 0) << image;
    EXPECT_EQ(platform.FSIsRemoteFS(image), 0) << image;
  }
  for (int local : {kFsUnknown, kFsExt, kFsTmpfs, kFsFuseLocal, kFsPseudo}) {
    EXPECT_EQ(platform.FSIsRemoteFS(local) + platform.FSIsImageFS(local), 0) << local;
  }
}

TEST(MountTableTest, FindsTheMountOfAPathAndUnescapesFields) {
  MountEntry entry;
  ASSERT_TRUE(FindMountOf("/proc/self", &entry));
  EXPECT_EQ(entry.type, "proc");
  EXPECT_EQ(entry.mount_point, "/proc");
  EXPECT_FALSE(FindMountOf("/no/such/path/here", &entry));
  EXPECT_EQ(UnescapeMountField("/mnt/my\\040disk"), "/mnt/my disk");
  EXPECT_EQ(UnescapeMountField("a\\09"), "a\\09");
}

TEST(VolumeTest, SnapshotsAreRealSnapshotFolders) {
  SandboxRoot root(false);
  LinuxPlatform platform;
  const std::string share = root.MakeDir("photo");
  root.MakeDir("photo/#snapshot/daily/a");
  root.WriteFile("photo/x#snapshot/b", "");
  root.WriteFile("other/#snapshot", "");
  symlink((share + "/#snapshot").c_str(), (root.path() + "/linked#snapshot").c_str());
  int in_snapshot = -1;
  ASSERT_EQ(platform.FhsPathInSnapshot(share + "/#snapshot/daily/a", &in_snapshot), 0);
  EXPECT_EQ(in_snapshot, 1);
  ASSERT_EQ(platform.FhsPathInSnapshot(share + "/x#snapshot/b", &in_snapshot), 0);
  EXPECT_EQ(in_snapshot, 0);
  ASSERT_EQ(platform.FhsPathInSnapshot(root.path() + "/other/#snapshot", &in_snapshot), 0);
  EXPECT_EQ(in_snapshot, 0);  // a file of that name is no snapshot
  ASSERT_EQ(platform.FhsPathInSnapshot(share + "/#snapshot-old/x", &in_snapshot), 0);
  EXPECT_EQ(in_snapshot, 0);
  EXPECT_LT(platform.FhsPathInSnapshot("photo/#snapshot", &in_snapshot), 0);
}

TEST(VolumeTest, HiddenMetadataNames) {
  LinuxPlatform platform;
  EXPECT_EQ(platform.EAIsHiddenDir("@eaDir"), 1);
  EXPECT_EQ(platform.EAIsHiddenDir("@tmp"), 1);
  EXPECT_EQ(platform.EAIsHiddenDir("@eadir"), 0);
  EXPECT_EQ(platform.EAIsHiddenDir("eaDir"), 0);
  EXPECT_EQ(platform.EAIsHiddenDir(""), 0);
}

// A volume with a given amount of free space and user quota.
class SizedVolumePlatform : public LinuxPlatform {
 public:
  uint64_t volume_free = 0;
  bool volume_known = true;
  bool has_quota = false;
  uint64_t quota_free = 0;

 protected:
  bool VolumeFreeBytes(const std::string&, uint64_t* free_bytes) override {
    *free_bytes = volume_free;
    return volume_known;
  }
  bool QuotaFreeBytes(uid_t, const std::string&, uint64_t* free_bytes) override {
    *free_bytes = quota_free;
    return has_quota;
  }
};

TEST(VolumeTest, FreeSpaceAndTheTwoLackOfSpaceErrors) {
  SandboxRoot root(false);
  LinuxPlatform real;
  EXPECT_EQ(real.QuotaIsEnough(0, root.path(), 1), 1);
  EXPECT_EQ(LastError().code, kPlatformErrNone);
  EXPECT_EQ(real.QuotaIsEnough(0, root.path(), uint64_t{1} << 62), 0);
  EXPECT_EQ(LastError().code, kPlatformErrNoSpace);
  EXPECT_EQ(real.QuotaIsEnough(0, root.path() + "/missing", 1), 0);
  EXPECT_EQ(LastError().code, kPlatformErrSystem);

  SizedVolumePlatform sized;
  sized.volume_free = 100 << 20;
  EXPECT_EQ(sized.QuotaIsEnough(0, "/v", 100 << 20), 1);  // exactly enough is enough
  EXPECT_EQ(sized.QuotaIsEnough(0, "/v", (100 << 20) + 1), 0);
  EXPECT_EQ(LastError().code, kPlatformErrNoSpace);
  sized.has_quota = true;
  sized.quota_free = 10;
  EXPECT_EQ(sized.QuotaIsEnough(1000, "/v", 11), 0);
  EXPECT_EQ(LastError().code, kPlatformErrQuotaExceeded);
  EXPECT_EQ(sized.QuotaIsEnough(0, "/v", 11), 1);  // the owner has no quota
  EXPECT_EQ(sized.QuotaIsEnough(1000, "/v", 10), 1);
}

TEST(UsersTest, SandboxAccountsAreTheRunningUser) {
  SandboxRoot root;
  LinuxPlatform platform;
  UserRecord user;
  ASSERT_TRUE(platform.UserGet("CorvLumex", &user));
  EXPECT_EQ(user.uid, getuid());
  EXPECT_EQ(user.name, "CorvLumex");
  ASSERT_TRUE(platform.UserGet("root", &user));
  EXPECT_EQ(user.uid, getuid());
  ASSERT_TRUE(platform.UserGetByUID(getuid(), &user));
  EXPECT_FALSE(user.name.empty());
  EXPECT_FALSE(platform.UserGet("no-such-user-here", &user));
  EXPECT_FALSE(platform.UserGetByUID(static_cast<uid_t>(-5), &user));
  EXPECT_EQ(LastError().code, kPlatformErrUserNotFound);
  // Switching to the user one already is needs no privilege.
  EXPECT_TRUE(platform.ResetCredentialsByName("root", true));
  EXPECT_EQ(geteuid(), getuid());
  EXPECT_FALSE(platform.ResetCredentialsByName("no-such-user-here", true));
  EXPECT_EQ(LastError().code, kPlatformErrUserNotFound);
}

TEST(LastErrorTest, LogLineShowsNumberFileAndLine) {
  LogCapture log;
  errno = EIO;
  SetLastError(kPlatformErrService, "services.cc", 42, "systemctl failed");
  LogPlatformError("index_mgr.cc", 7, "SetupRelatedServices", "KLIBServiceRestart failed");
  ASSERT_EQ(log.Lines().size(), 1u);
  EXPECT_EQ(log.Lines()[0], StringPrintf("index_mgr.cc:7 (%d, %u) (SetupRelatedServices) KLIBServiceRestart failed: "
                                         "err=[0x0800 services.cc:42] [err: Input/output error]",
                                         static_cast<int>(getpid()), static_cast<unsigned>(geteuid())));
  EXPECT_EQ(errno, 0);
  // With errno clear the line ends with the platform's record.
  LogPlatformError("index_mgr.cc", 8, "SetupRelatedServices", "KLIBServiceRestart failed");
  EXPECT_EQ(log.Lines().back().find(" [err:"), std::string::npos) << log.Lines().back();
  ClearLastError();
  EXPECT_EQ(LastError().code, kPlatformErrNone);
  EXPECT_EQ(LastError().file, "");

  // The macros record the caller's own file and line.
  CORV_PLATFORM_ERROR(kPlatformErrNoSpace, "full");
  EXPECT_EQ(LastError().file, "linux_platform_test.cc");
  EXPECT_EQ(LastError().message, "full");
  CORV_LOG_PLATFORM_ERROR("CORVSMBSetSpotlight failed");
  EXPECT_NE(log.Lines().back().find("CORVSMBSetSpotlight failed: err=[0x2900 linux_platform_test.cc:"),
            std::string::npos);
}

}  // namespace
}  // namespace platform
}  // namespace corvlumex
