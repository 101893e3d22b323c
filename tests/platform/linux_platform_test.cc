// File systems, snapshots, hidden names, free space, users and the last
// platform error of the Linux platform.
#include <gtest/gtest.h>
#include <unistd.h>

#include <tuple>

#include "common/file_util.h"
#include "platform/linux/linux_platform.h"
#include "platform/linux/mount_table.h"
#include "tests/support/fake_platform.h"
#include "tests/support/sandbox.h"

namespace corvlumex {
namespace platform {
namespace {

using testing_support::FakePlatform;
using testing_support::LogCapture;
using testing_support::Sandbox;

// Answers statfs and the mount table as a test machine cannot: any magic
// number and mount type for paths below /fake.
int TypeOf(long magic, const std::string& mount_type = "") {
  FakePlatform platform;
  platform.StatfsMagicHook = [&](const std::string& path, long* answer) {
    *answer = magic;
    return StringStartWith(path, "/fake") || platform.RealStatfsMagic(path, answer);
  };
  platform.MountTypeNameHook = [&](const std::string& path) {
    return StringStartWith(path, "/fake") ? mount_type : platform.RealMountTypeName(path);
  };
  return platform.GetFSType("/fake/dir", 0);
}

TEST(FsTypeTest, LocalDisksAndTmpAreOrdinaryFileSystems) {
  LinuxPlatform platform;
  Sandbox root(false);
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
  // An unknown file system (0x12345678) is not refused.
  for (const auto& [magic, mount_type, type] : std::vector<std::tuple<long, const char*, int>>{
           {0xEF53, "", kFsExt}, {0x9123683E, "", kFsBtrfs}, {0x58465342, "", kFsXfs},
           {0x01021994, "tmpfs", kFsTmpfs}, {0x01021994, "devtmpfs", kFsPseudo}, {0x12345678, "", kFsUnknown},
           {0x6969, "", kFsNfs}, {0xFF534D42, "", kFsSmb}, {0xFE534D42, "", kFsSmb}, {0x01021997, "", kFs9p},
           {0x00C36400, "", kFsCeph}, {0x65735546, "fuse.sshfs", kFsFuseNetwork},
           {0x65735546, "fuse.rclone", kFsFuseNetwork}, {0x65735546, "fuseblk.ntfs-3g", kFsFuseLocal},
           {0x65735546, "fuse", kFsFuseLocal}, {0x65735546, "fuse.fuseiso", kFsIso9660},
           {0x9660, "", kFsIso9660}, {0x15013346, "", kFsUdf}, {0x73717368, "", kFsSquashfs},
           {0x9FA0, "", kFsPseudo}}) {
    EXPECT_EQ(TypeOf(magic, mount_type), type) << std::hex << magic << " " << mount_type;
  }

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
  Sandbox root(false);
  LinuxPlatform platform;
  const std::string share = root.MakeDir("photo");
  root.MakeDir("photo/#snapshot/daily/a");
  root.WriteFile("photo/x#snapshot/b", "");
  root.WriteFile("other/#snapshot", "");
  symlink((share + "/#snapshot").c_str(), (root.path() + "/linked#snapshot").c_str());
  int in_snapshot = -1;
  // A file of that name is no snapshot.
  for (const auto& [path, expected] : std::vector<std::pair<std::string, int>>{
           {share + "/#snapshot/daily/a", 1}, {share + "/x#snapshot/b", 0},
           {root.path() + "/other/#snapshot", 0}, {share + "/#snapshot-old/x", 0}}) {
    ASSERT_EQ(platform.FhsPathInSnapshot(path, &in_snapshot), 0) << path;
    EXPECT_EQ(in_snapshot, expected) << path;
  }
  EXPECT_LT(platform.FhsPathInSnapshot("photo/#snapshot", &in_snapshot), 0);
}

TEST(VolumeTest, HiddenMetadataNames) {
  LinuxPlatform platform;
  for (const char* name : {"@eaDir", "@tmp"}) EXPECT_EQ(platform.EAIsHiddenDir(name), 1) << name;
  for (const char* name : {"@eadir", "eaDir", ""}) EXPECT_EQ(platform.EAIsHiddenDir(name), 0) << name;
}

TEST(VolumeTest, FreeSpaceAndTheTwoLackOfSpaceErrors) {
  Sandbox root(false);
  LinuxPlatform real;
  EXPECT_EQ(real.QuotaIsEnough(0, root.path(), 1), 1);
  EXPECT_EQ(LastError().code, kPlatformErrNone);
  EXPECT_EQ(real.QuotaIsEnough(0, root.path(), uint64_t{1} << 62), 0);
  EXPECT_EQ(LastError().code, kPlatformErrNoSpace);
  EXPECT_EQ(real.QuotaIsEnough(0, root.path() + "/missing", 1), 0);
  EXPECT_EQ(LastError().code, kPlatformErrSystem);

  // A volume with a given amount of free space and user quota.
  FakePlatform sized;
  uint64_t quota_free = 0;
  bool has_quota = false;
  sized.VolumeFreeBytesHook = [](const std::string&, uint64_t* bytes) { return *bytes = 100 << 20, true; };
  sized.QuotaFreeBytesHook = [&](uid_t, const std::string&, uint64_t* bytes) { return *bytes = quota_free, has_quota; };
  EXPECT_EQ(sized.QuotaIsEnough(0, "/v", 100 << 20), 1);  // exactly enough is enough
  EXPECT_EQ(sized.QuotaIsEnough(0, "/v", (100 << 20) + 1), 0);
  EXPECT_EQ(LastError().code, kPlatformErrNoSpace);
  has_quota = true;
  quota_free = 10;
  EXPECT_EQ(sized.QuotaIsEnough(1000, "/v", 11), 0);
  EXPECT_EQ(LastError().code, kPlatformErrQuotaExceeded);
  EXPECT_EQ(sized.QuotaIsEnough(0, "/v", 11), 1);  // the owner has no quota
  EXPECT_EQ(sized.QuotaIsEnough(1000, "/v", 10), 1);
}

TEST(UsersTest, SandboxAccountsAreTheRunningUser) {
  Sandbox root;
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
