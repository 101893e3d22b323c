#include <dirent.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <fstream>

#include "common/error.h"
#include "common/file_util.h"
#include "platform/file_ops.h"
#include "sdk/credentials.h"
#include "tests/support/log_capture.h"
#include "tests/support/sandbox.h"

namespace corvlumex {
namespace {

using testing_support::Sandbox;

TEST(PathTextTest, BasenameDirnameExtension) {
  for (const auto& [path, dirname] : std::vector<std::pair<std::string, std::string>>{
           {"file", "file"}, {"/a", ""}, {"/a/b/c", "/a/b"}}) {
    EXPECT_EQ(Dirname(path), dirname) << path;
  }
  for (const auto& [path, basename] : std::vector<std::pair<std::string, std::string>>{
           {"a/b/", ""}, {"plain", "plain"}, {"/x/y.txt", "y.txt"}}) {
    EXPECT_EQ(Basename(path), basename) << path;
  }
  for (const auto& [path, extension] : std::vector<std::pair<std::string, std::string>>{
           {"/x/Photo.JPG", "jpg"}, {"/x.d/README", ""}, {"/x/.bashrc", "bashrc"}, {"/x/a.tar.GZ", "gz"}}) {
    EXPECT_EQ(GetFileExtension(path, true), extension) << path;
  }
  EXPECT_EQ(GetFileExtension("/x/Photo.JPG", false), "JPG");
  EXPECT_TRUE(StringStartWith("/volume1/share", "/volume1"));
  EXPECT_TRUE(StringStartWith("abc", ""));
  EXPECT_FALSE(StringStartWith("ab", "abc"));
}

class FileUtilTest : public ::testing::Test {
 protected:
  Sandbox root_{false};
  std::string Path(const std::string& relative) const { return root_.path() + "/" + relative; }
};

TEST_F(FileUtilTest, FileAndDirectoryPredicatesAndLinks) {
  root_.WriteFile("dir/file.txt", "x");
  ASSERT_EQ(symlink(Path("dir/file.txt").c_str(), Path("link-to-file").c_str()), 0);
  ASSERT_EQ(symlink(Path("dir").c_str(), Path("link-to-dir").c_str()), 0);
  ASSERT_EQ(symlink(Path("link-to-dir").c_str(), Path("link-to-link").c_str()), 0);
  // A file: a regular one, never a link. A directory: links followed only when asked.
  const struct {
    const char* path;
    bool file, dir, dir_through_links;
  } cases[] = {{"dir/file.txt", true, false, false}, {"link-to-file", false, false, false},
               {"dir", false, true, true},           {"missing", false, false, false},
               {"link-to-dir", false, false, true},  {"link-to-link", false, false, true}};
  for (const auto& c : cases) {
    EXPECT_EQ(IsFileExist(Path(c.path)), c.file) << c.path;
    EXPECT_EQ(IsDirExist(Path(c.path), false), c.dir) << c.path;
    EXPECT_EQ(IsDirExist(Path(c.path), true), c.dir_through_links) << c.path;
  }
}

// A relative link target is tested as it stands, against the working directory.
TEST_F(FileUtilTest, RelativeLinkTargetIsResolvedAgainstTheWorkingDirectory) {
  root_.MakeDir("a/target");
  root_.MakeDir("elsewhere");
  ASSERT_EQ(symlink("target", Path("a/rel").c_str()), 0);
  char previous[4096];
  ASSERT_NE(getcwd(previous, sizeof(previous)), nullptr);
  ASSERT_EQ(chdir(Path("elsewhere").c_str()), 0);
  EXPECT_FALSE(IsDirExist(Path("a/rel"), true));
  ASSERT_EQ(chdir(Path("a").c_str()), 0);
  EXPECT_TRUE(IsDirExist(Path("a/rel"), true));
  ASSERT_EQ(chdir(previous), 0);
}

TEST_F(FileUtilTest, DirentTypes) {
  struct dirent entry = {};
  entry.d_type = DT_DIR;
  EXPECT_TRUE(IsDirentDir(&entry, "/nonexistent"));
  entry.d_type = DT_REG;
  EXPECT_FALSE(IsDirentDir(&entry, root_.path()));
  entry.d_type = DT_UNKNOWN;
  EXPECT_FALSE(IsDirentDir(&entry, root_.path()));
  EXPECT_FALSE(IsDirentDir(&entry, Path("missing")));
}

TEST_F(FileUtilTest, RealPathUnlinkCopyAndMove) {
  root_.WriteFile("d/f", "content");
  EXPECT_EQ(RealPath(Path("d/../d/./f")), RealPath(Path("d/f")));
  EXPECT_EQ(RealPath(Path("missing")), "");
  EXPECT_TRUE(Unlink(Path("missing")));

  ASSERT_TRUE(CPFile(Path("d/f"), Path("copy")));
  EXPECT_TRUE(IsFileExist(Path("d/f")));
  EXPECT_EQ(testing_support::ReadFileText(Path("copy")), "content");

  ASSERT_TRUE(MVFile(Path("copy"), Path("moved")));
  EXPECT_FALSE(IsFileExist(Path("copy")));
  EXPECT_TRUE(IsFileExist(Path("moved")));
  EXPECT_FALSE(CPFile(Path("missing"), Path("x")));
  EXPECT_FALSE(MVFile(Path("missing"), Path("x")));

  EXPECT_TRUE(Unlink(Path("moved")));
  EXPECT_FALSE(IsFileExist(Path("moved")));
  root_.MakeDir("full");
  root_.WriteFile("full/x", "");
  EXPECT_FALSE(Unlink(Path("full")));  // a directory is not unlinked
}

TEST_F(FileUtilTest, AclPermissionBits) {
  root_.WriteFile("f", "x");
  ASSERT_EQ(chmod(Path("f").c_str(), 0600), 0);
  EXPECT_TRUE(CheckACLPerm(Path("f"), R_OK));
  EXPECT_TRUE(CheckACLPerm(Path("f"), R_OK | X_OK));
  if (geteuid() != 0) {
    EXPECT_FALSE(CheckACLPerm(Path("f"), X_OK));
  }
  EXPECT_FALSE(CheckACLPerm(Path("missing"), R_OK));
}

TEST_F(FileUtilTest, MountPoints) {
  EXPECT_TRUE(IsMountPoint("/"));
  EXPECT_TRUE(IsMountPoint("/proc"));
  EXPECT_FALSE(IsMountPoint(root_.path()));
  EXPECT_FALSE(IsMountPoint(Path("missing")));
}

TEST_F(FileUtilTest, ChownToTheServiceUserInASandbox) {
  Sandbox sandbox;  // in a sandbox the service user is whoever runs it
  root_.WriteFile("owned", "x");
  EXPECT_TRUE(ChownCorvLumex(Path("owned")));
  struct stat st;
  ASSERT_EQ(stat(Path("owned").c_str(), &st), 0);
  EXPECT_EQ(st.st_uid, geteuid());
  EXPECT_FALSE(ChownCorvLumex(Path("missing")));
}

}  // namespace
}  // namespace corvlumex
