// Path and share resolution and the indexability rules, on real
// directories of a sandbox root.
#include <gtest/gtest.h>
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

TEST(ShareNameTest, FirstComponentOfASharePathAndItsReplacement) {
  for (const auto& [path, name] : std::vector<std::pair<std::string, std::string>>{
           {"/photo/2019/a.jpg", "photo"}, {"/photo", "photo"}, {"/photo/", "photo"}, {"/", ""},
           {"//x", ""}}) {
    EXPECT_EQ(ShareNameOf(path), name) << path;
  }
  for (const std::string& bad : {std::string(), std::string("photo"), std::string("photo/a")}) {
    ExpectError([&] { ShareNameOf(bad); }, kErrorBadArgument, bad, "1 > share_path.size() || '/' != share_path.at(0)");
  }
  // Only the first whole component named like the share is replaced.
  for (const auto& [path, replaced] : std::vector<std::pair<std::string, std::string>>{
           {"/volume1/photo", "/volume1/pics"}, {"/volume1/photo/", "/volume1/pics/"},
           {"/volume1/photo/2019/a.jpg", "/volume1/pics/2019/a.jpg"}, {"/photo/x", "/pics/x"},
           {"/volume1/photo/x/photo", "/volume1/pics/x/photo"}}) {
    EXPECT_EQ(ReplacePathShare(path, "pics", "photo"), replaced) << path;
  }
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
  for (const auto& [path, in_bin] : std::vector<std::pair<std::string, bool>>{
           {photo_ + "/#recycle/old", true}, {photo_ + "/#recycle", true},
           {photo_ + "/2019/#recycle", false},  // not the share's bin
           {photo_ + "/2019", false}, {homes_ + "/alice/#recycle/x", true},
           {homes_ + "/#recycle", true}, {homes_ + "/alice/docs", false}}) {
    EXPECT_EQ(IsFullPathInRecycleBin(path), in_bin) << path;
  }
  EXPECT_THROW(IsFullPathInRecycleBin(sandbox_.volume() + "/video/#recycle"), Error);
}

// Canonical existing paths of writable shares, no link on the way, no bin,
// no snapshot.
TEST_F(PathRulesTest, IndexableFullPaths) {
  sandbox_.MakeDir(photo_ + "/#recycle/old");
  sandbox_.MakeDir(homes_ + "/alice/#recycle");
  sandbox_.MakeDir(photo_ + "/#snapshot/daily");
  sandbox_.MakeDir(photo_ + "/my#snapshot");
  ASSERT_EQ(symlink((photo_ + "/2019").c_str(), (photo_ + "/latest").c_str()), 0);
  for (const auto& [path, indexable] : std::vector<std::pair<std::string, bool>>{
           {photo_, true}, {photo_ + "/2019/trip", true}, {homes_ + "/alice", true},
           {photo_ + "/my#snapshot", true}, {photo_ + "/", false}, {photo_ + "/2019/", false},
           {photo_ + "//2019", false}, {photo_ + "/./2019", false},
           {photo_ + "/2019/trip/..", false}, {photo_ + "/missing", false},
           {photo_ + "/latest", false}, {photo_ + "/latest/trip", false}, {archive_, false},
           {secret_, false}, {photo_ + "/#recycle/old", false}, {homes_ + "/alice/#recycle", false},
           {photo_ + "/#snapshot/daily", false}}) {
    EXPECT_EQ(CanFullPathBeIndexed(path), indexable) << path;
  }
  EXPECT_TRUE(CanPathBeIndexed("/photo/2019"));
  EXPECT_FALSE(CanPathBeIndexed("/photo/2019/../2019"));
  // A path in no share cannot be answered: it throws rather than says no.
  const std::string outside = sandbox_.MakeDir(sandbox_.volume() + "/video");
  EXPECT_THROW(CanFullPathBeIndexed(outside), Error);
  EXPECT_THROW(CanPathBeIndexed("/video"), Error);
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
  // One file system of each class (FsTypeTest maps every magic number to its class).
  for (const Case& c : {Case{0x6969, false} /* nfs: remote */, Case{0x9660, false} /* iso9660: image */,
                        Case{0x9FA0, false} /* proc: pseudo */, Case{0xEF53, true} /* ext4 */,
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
  for (const char* name : {".DS_Store", ".TemporaryItems", ".CORVPPSDB", "@eaDir"}) {
    EXPECT_TRUE(IsSystemPreservedFileName(name)) << name;
  }
  for (const char* name : {".ds_store", "DS_Store", "#recycle", ""}) {
    EXPECT_FALSE(IsSystemPreservedFileName(name)) << name;
  }
  ScopedFakePlatform installed;
  installed->EAIsHiddenDirHook = [](const std::string& name) { return name == ".ds_store" ? 1 : 0; };
  EXPECT_TRUE(IsSystemPreservedFileName(".ds_store"));
  EXPECT_FALSE(IsSystemPreservedFileName("@eaDir"));
}

}  // namespace
}  // namespace fileindex
}  // namespace corvlumex
