// Path and share resolution and the indexability rules, on real
// directories of a sandbox root.
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include "common/error.h"
#include "common/file_util.h"
#include "fileindex/paths/path_rules.h"
#include "tests/support/expect_error.h"
#include "tests/support/fake_platform.h"
#include "tests/support/sandbox.h"

namespace corvlumex {
namespace fileindex {
namespace {

using testing_support::ErrorOf;
using testing_support::ExpectError;
using testing_support::Sandbox;
using testing_support::ScopedFakePlatform;

std::string ShareNameOf(const std::string& share_path) {
  std::string name = "unchanged";
  GetShareNameByPath(name, share_path);
  return name;
}

TEST(ShareNameTest, FirstComponentOfASharePath) {
  EXPECT_EQ(ShareNameOf("/photo/2019/a.jpg"), "photo");
  EXPECT_EQ(ShareNameOf("/photo"), "photo");
  EXPECT_EQ(ShareNameOf("/photo/"), "photo");
  EXPECT_EQ(ShareNameOf("/"), "");
  EXPECT_EQ(ShareNameOf("//x"), "");
  for (const std::string& bad : {std::string(), std::string("photo"), std::string("photo/a")}) {
    ExpectError([&] { ShareNameOf(bad); }, kErrorBadArgument, bad, "1 > share_path.size() || '/' != share_path.at(0)");
  }
}

TEST(ReplacePathShareTest, FirstWholeComponentOnly) {
  EXPECT_EQ(ReplacePathShare("/volume1/photo", "pics", "photo"), "/volume1/pics");
  EXPECT_EQ(ReplacePathShare("/volume1/photo/", "pics", "photo"), "/volume1/pics/");
  EXPECT_EQ(ReplacePathShare("/volume1/photo/2019/a.jpg", "pics", "photo"), "/volume1/pics/2019/a.jpg");
  EXPECT_EQ(ReplacePathShare("/photo/x", "pics", "photo"), "/pics/x");
  EXPECT_EQ(ReplacePathShare("/volume1/a/x/a", "b", "a"), "/volume1/b/x/a");
  ExpectError([] { ReplacePathShare("/volume1/photos/a", "pics", "photo"); }, kErrorBadArgument,
              "Cannot find share: photo", "string::npos == pos");
  EXPECT_THROW(ReplacePathShare("photo", "pics", "photo"), Error);  // no "/" before the name
}

class PathRulesTest : public ::testing::Test {
 protected:
  void SetUp() override {
    photo_ = sandbox_.AddShare("photo");
    homes_ = sandbox_.AddShare("homes");
    archive_ = sandbox_.AddShare("archive", testing_support::JsonOf(R"({"readonly": true})"));
    secret_ = sandbox_.AddShare("secret", testing_support::JsonOf(R"({"encrypted": true})"));
    sandbox_.MakeDir(photo_ + "/2019/trip");
  }

  Sandbox sandbox_;
  std::string photo_, homes_, archive_, secret_;
};

TEST_F(PathRulesTest, FullPathsAndSharePathsConvert) {
  std::string full;
  GetFullPath(full, "/photo/2019/a.jpg");
  EXPECT_EQ(full, photo_ + "/2019/a.jpg");
  GetFullPath(full, "/photo");
  EXPECT_EQ(full, photo_);
  EXPECT_EQ(ErrorOf([&] { GetFullPath(full, "/video/x"); }).code, kErrorShareNotFound);
  EXPECT_THROW(GetFullPath(full, "photo/x"), Error);

  std::string name, path;
  GetShareNamePathByFullPath(name, path, photo_ + "/2019/trip");
  EXPECT_EQ(name, "photo");
  EXPECT_EQ(path, photo_);
  const std::string outside = sandbox_.volume() + "/video/x";
  ExpectError([&] { GetShareNamePathByFullPath(name, path, outside); }, kErrorSystem,
              "CORVShareNamePathGet failed, full_path=" + outside,
              "0 > CORVShareNamePathGet(full_path.c_str(), szShareName, sizeof(szShareName), szSharePath, "
              "sizeof(szSharePath))");
}

TEST_F(PathRulesTest, RecycleBins) {
  sandbox_.MakeDir(photo_ + "/#recycle/old");
  sandbox_.MakeDir(homes_ + "/alice/#recycle/x");
  EXPECT_TRUE(IsFullPathInRecycleBin(photo_ + "/#recycle/old"));
  EXPECT_TRUE(IsFullPathInRecycleBin(photo_ + "/#recycle"));
  EXPECT_FALSE(IsFullPathInRecycleBin(photo_ + "/2019/#recycle"));  // not the share's bin
  EXPECT_FALSE(IsFullPathInRecycleBin(photo_ + "/2019"));
  EXPECT_TRUE(IsFullPathInRecycleBin(homes_ + "/alice/#recycle/x"));
  EXPECT_TRUE(IsFullPathInRecycleBin(homes_ + "/#recycle"));
  EXPECT_FALSE(IsFullPathInRecycleBin(homes_ + "/alice/docs"));
  EXPECT_THROW(IsFullPathInRecycleBin(sandbox_.volume() + "/video/#recycle"), Error);
}

TEST_F(PathRulesTest, CanonicalPathsInWritableSharesAreIndexable) {
  EXPECT_TRUE(CanFullPathBeIndexed(photo_));
  EXPECT_TRUE(CanFullPathBeIndexed(photo_ + "/2019/trip"));
  EXPECT_TRUE(CanPathBeIndexed("/photo/2019"));
  EXPECT_FALSE(CanFullPathBeIndexed(photo_ + "/"));
  EXPECT_FALSE(CanFullPathBeIndexed(photo_ + "/2019/"));
  EXPECT_FALSE(CanFullPathBeIndexed(photo_ + "//2019"));
  EXPECT_FALSE(CanFullPathBeIndexed(photo_ + "/./2019"));
  EXPECT_FALSE(CanFullPathBeIndexed(photo_ + "/2019/trip/.."));
  EXPECT_FALSE(CanPathBeIndexed("/photo/2019/../2019"));
  EXPECT_FALSE(CanFullPathBeIndexed(photo_ + "/missing"));
  ASSERT_EQ(symlink((photo_ + "/2019").c_str(), (photo_ + "/latest").c_str()), 0);
  EXPECT_FALSE(CanFullPathBeIndexed(photo_ + "/latest"));
  EXPECT_FALSE(CanFullPathBeIndexed(photo_ + "/latest/trip"));
}

TEST_F(PathRulesTest, ReadOnlyEncryptedRecycledAndUnknown) {
  EXPECT_FALSE(CanFullPathBeIndexed(archive_));
  EXPECT_FALSE(CanFullPathBeIndexed(secret_));
  sandbox_.MakeDir(photo_ + "/#recycle/old");
  sandbox_.MakeDir(homes_ + "/alice/#recycle");
  EXPECT_FALSE(CanFullPathBeIndexed(photo_ + "/#recycle/old"));
  EXPECT_FALSE(CanFullPathBeIndexed(homes_ + "/alice/#recycle"));
  EXPECT_TRUE(CanFullPathBeIndexed(homes_ + "/alice"));
  // A path in no share cannot be answered: it throws rather than says no.
  const std::string outside = sandbox_.MakeDir(sandbox_.volume() + "/video");
  EXPECT_THROW(CanFullPathBeIndexed(outside), Error);
  EXPECT_THROW(CanPathBeIndexed("/video"), Error);
}

TEST_F(PathRulesTest, SnapshotsOnlyWhenThePlatformConfirms) {
  sandbox_.MakeDir(photo_ + "/#snapshot/daily");
  sandbox_.MakeDir(photo_ + "/my#snapshot");
  EXPECT_FALSE(CanFullPathBeIndexed(photo_ + "/#snapshot/daily"));
  EXPECT_TRUE(CanFullPathBeIndexed(photo_ + "/my#snapshot"));
}

// Answers statfs for the whole sandbox as a given file system would.
void AsFileSystem(ScopedFakePlatform& platform, long as_magic) {
  platform->StatfsMagicHook = [&platform, as_magic](const std::string& path, long* magic) {
    if (!platform->RealStatfsMagic(path, magic)) return false;  // missing paths stay missing
    *magic = as_magic;
    return true;
  };
  platform->MountTypeNameHook = [](const std::string&) { return std::string("tmpfs"); };
}

TEST_F(PathRulesTest, RemoteImageAndPseudoFileSystemsAreRefused) {
  struct Case {
    long magic;
    bool indexable;
  };
  for (const Case& c : {Case{0x6969, false} /* nfs */, Case{0xFF534D42, false} /* cifs */,
                        Case{0x00C36400, false} /* ceph */, Case{0x9660, false} /* iso9660 */,
                        Case{0x73717368, false} /* squashfs */, Case{0x9FA0, false} /* proc: code 12 */,
                        Case{0xEF53, true} /* ext4 */, Case{0x01021994, true} /* tmpfs */,
                        Case{0x12345678, true} /* unknown */}) {
    ScopedFakePlatform installed;
    AsFileSystem(installed, c.magic);
    EXPECT_EQ(CanFullPathBeIndexed(photo_ + "/2019"), c.indexable) << std::hex << c.magic;
  }
}

// The snapshot and file-system rules come before the share is resolved: a
// path that they refuse is answered "no" even when no share holds it, while
// a path that passes them and lies in no share throws.
TEST_F(PathRulesTest, EarlyRulesRefuseBeforeTheShareIsResolved) {
  const std::string outside = sandbox_.MakeDir(sandbox_.volume() + "/video");
  sandbox_.MakeDir(outside + "/#snapshot/daily");
  EXPECT_FALSE(CanFullPathBeIndexed(outside + "/#snapshot/daily"));
  EXPECT_FALSE(CanFullPathBeIndexed(outside + "/missing"));  // no file-system type
  {
    ScopedFakePlatform installed;
    AsFileSystem(installed, 0x6969);  // nfs
    EXPECT_FALSE(CanFullPathBeIndexed(outside));
  }
  EXPECT_THROW(CanFullPathBeIndexed(outside), Error);
}

// Every share directory is a mount point; the encryption setting is
// reported apart from the "encrypted" flag, as an appliance may.
TEST_F(PathRulesTest, MountPointsOnlyAsAnEncryptedSharesDirectory) {
  ScopedFakePlatform installed;
  installed->DirIsMountPointHook = [&](const std::string& path) {
    return Basename(path) == "photo" || Basename(path) == "homes" ? 1 : installed->RealDirIsMountPoint(path);
  };
  installed->ShareIsEncryptionGetHook = [](const platform::ShareInfo& share, int* value) {
    *value = share.name == "homes" ? 1 : 0;
    return 0;
  };
  EXPECT_FALSE(CanFullPathBeIndexed(photo_));
  EXPECT_TRUE(CanFullPathBeIndexed(photo_ + "/2019"));
  EXPECT_TRUE(CanFullPathBeIndexed(homes_));
}

TEST(PreservedNameTest, PlatformHiddenNamesAndTheFixedList) {
  EXPECT_TRUE(IsSystemPreservedFileName(".DS_Store"));
  EXPECT_TRUE(IsSystemPreservedFileName(".TemporaryItems"));
  EXPECT_TRUE(IsSystemPreservedFileName(".CORVPPSDB"));
  EXPECT_TRUE(IsSystemPreservedFileName("@eaDir"));
  EXPECT_FALSE(IsSystemPreservedFileName(".ds_store"));
  EXPECT_FALSE(IsSystemPreservedFileName("DS_Store"));
  EXPECT_FALSE(IsSystemPreservedFileName("#recycle"));
  EXPECT_FALSE(IsSystemPreservedFileName(""));
  ScopedFakePlatform installed;
  installed->EAIsHiddenDirHook = [](const std::string& name) { return name == ".ds_store" ? 1 : 0; };
  EXPECT_TRUE(IsSystemPreservedFileName(".ds_store"));
  EXPECT_FALSE(IsSystemPreservedFileName("@eaDir"));
}

}  // namespace
}  // namespace fileindex
}  // namespace corvlumex
