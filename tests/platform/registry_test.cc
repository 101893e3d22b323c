// The share registry and the share questions of the Linux platform.
#include <gtest/gtest.h>
#include <pwd.h>
#include <sys/stat.h>
#include <unistd.h>

#include "platform/linux/linux_platform.h"
#include "platform/linux/share_registry.h"
#include "tests/support/sandbox.h"

namespace corvlumex {
namespace platform {
namespace {

using testing_support::LogCapture;
using testing_support::Sandbox;

std::string Problem(const std::string& text) {
  std::vector<ShareInfo> shares;
  std::string problem;
  EXPECT_FALSE(ParseShareRegistry(text, "shares.json", &shares, &problem)) << text;
  return problem;
}

// Each mistake is named: whole messages where they are fixed, the telling
// part where the message quotes the parser.
TEST(ShareRegistryTest, RefusesWhatAnAdministratorCouldGetWrong) {
  const std::vector<std::pair<std::string, std::string>> whole = {
      {"{}", "shares.json must hold a JSON array of shares"},
      {R"([{"path": "/v/a"}])", "shares.json: entry 1: no \"name\" (a non-empty string)"},
      {R"([{"name": "a", "path": "/v/a"}, {"name": "b"}])",
       "shares.json: entry 2: share \"b\" has no \"path\" (a non-empty string)"},
      {R"([{"name": "photo", "path": "/v/photos"}])",
       "shares.json: entry 1: path \"/v/photos\" does not end in the share's name \"photo\""},
      {R"([{"name": "a", "path": "/v/a", "readonly": 1}])",
       "shares.json: entry 1: share \"a\": \"readonly\" must be true or false"},
  };
  for (const auto& [text, problem] : whole) EXPECT_EQ(Problem(text), problem);
  const std::vector<std::pair<std::string, std::string>> parts = {
      {R"([{"name": "a", )", "shares.json is not valid JSON"},
      {"", "not valid JSON"},
      {R"([{"name": "a", "path": "/v/a/"}])", "trailing"},
      {R"([{"name": "a", "path": "v/a"}])", "not an absolute path"},
      {R"([{"name": "a", "path": "/v/../a"}])", "not an absolute path"},
      {R"([{"name": "a/b", "path": "/v/a/b"}])", "single path component"},
      {R"([{"name": "a", "path": "/v/a"}, {"name": "a", "path": "/w/a"}])", "listed twice"},
      {R"([{"name": "a", "path": "/v/a", "ftp_privilege": 8}])", "ftp_privilege"},
      {R"([{"name": "a", "path": "/v/a", "privileges": {"bob": "write"}}])", "\"bob\""},
  };
  for (const auto& [text, part] : parts) EXPECT_NE(Problem(text).find(part), std::string::npos) << text;
}

TEST(ShareRegistryTest, FlagsDefaultToFalse) {
  std::vector<ShareInfo> shares;
  std::string problem;
  ASSERT_TRUE(ParseShareRegistry(
      R"([{"name": "a", "path": "/v/a"},
          {"name": "b", "path": "/v/b", "readonly": true, "encrypted": true, "recycle_bin": true,
           "hide_unreadable": true, "ftp_privilege": 5, "privileges": {"bob": "ro", "eve": "none"}}])",
      "x", &shares, &problem))
      << problem;
  ASSERT_EQ(shares.size(), 2u);
  EXPECT_FALSE(shares[0].readonly || shares[0].encrypted || shares[0].recycle_bin || shares[0].hide_unreadable);
  EXPECT_EQ(shares[0].ftp_privilege, 0u);
  EXPECT_TRUE(shares[1].readonly && shares[1].encrypted && shares[1].recycle_bin && shares[1].hide_unreadable);
  EXPECT_EQ(shares[1].ftp_privilege, kFtpPrivNoList | kFtpPrivNoDownload);
  EXPECT_EQ(shares[1].privileges.at("bob"), kSharePrivReadOnly);
  EXPECT_EQ(shares[1].privileges.at("eve"), kSharePrivNone);
}

class LinuxSharesTest : public ::testing::Test {
 protected:
  Sandbox sandbox_;
  LinuxPlatform platform_;
};

TEST_F(LinuxSharesTest, MissingRegistryMeansNoShareAndBrokenOneIsRefusedAloud) {
  std::unique_ptr<ShareInfo> info;
  EXPECT_LT(platform_.ShareGet("photo", &info), 0);
  EXPECT_EQ(LastError().code, kPlatformErrShareNotFound);
  StringList names;
  EXPECT_EQ(platform_.ShareEnum(&names, kShareEnumAll), 0);

  sandbox_.WriteRegistryText("[{\"name\": \"photo\", \"path\": \"/srv/pictures\"}]");
  LogCapture log;
  EXPECT_LT(platform_.ShareGet("photo", &info), 0);
  EXPECT_EQ(LastError().code, kPlatformErrRegistry);
  EXPECT_EQ(LastError().file, "share_registry.cc");
  EXPECT_EQ(log.Matching("does not end in the share's name \"photo\"").size(), 1u);
  EXPECT_LT(platform_.ShareEnum(&names, kShareEnumAll), 0);
}

TEST_F(LinuxSharesTest, RecordsFlagsAndEnumerationFilters) {
  const std::string photo = sandbox_.AddShare("photo", Json::Value(Json::objectValue));
  Json::Value flags;
  flags["readonly"] = true;
  sandbox_.AddShare("archive", flags);
  flags = Json::Value();
  flags["encrypted"] = true;
  flags["hide_unreadable"] = true;
  sandbox_.AddShare("secret", flags);

  std::unique_ptr<ShareInfo> info;
  ASSERT_EQ(platform_.ShareGet("photo", &info), 0);
  EXPECT_EQ(info->name, "photo");
  EXPECT_EQ(info->path, photo);
  EXPECT_LT(platform_.ShareGet("Photo", &info), 0);  // names are exact

  ASSERT_EQ(platform_.ShareGet("secret", &info), 0);
  int value = -1;
  EXPECT_EQ(platform_.ShareIsEncryptedGet(*info, &value), 0);
  EXPECT_EQ(value, 1);
  EXPECT_EQ(platform_.ShareIsReadOnlyGet(*info, &value), 0);
  EXPECT_EQ(value, 0);
  EXPECT_EQ(platform_.ShareHideUnreadableGet(*info, &value), 0);
  EXPECT_EQ(value, 1);
  EXPECT_LT(platform_.ShareRecycleStatusGet(*info, nullptr), 0);

  StringList names;
  EXPECT_EQ(platform_.ShareEnum(&names, kShareEnumAll), 3);
  EXPECT_EQ(names, (StringList{"photo", "archive", "secret"}));
  names.clear();
  platform_.ShareEnum(&names, kShareEnumSkipReadOnly | kShareEnumSkipEncrypted);
  EXPECT_EQ(names, StringList{"photo"});
}

TEST_F(LinuxSharesTest, FullPathsResolveToTheInnermostShareOnComponentBoundaries) {
  const std::string photo = sandbox_.AddShare("photo");
  sandbox_.AddShare("photos");
  char name[kShareNameMax];
  char path[kPathBufferSize];
  ASSERT_EQ(platform_.ShareNamePathGet((photo + "s/a.jpg").c_str(), name, sizeof(name), path, sizeof(path)), 0);
  EXPECT_STREQ(name, "photos");
  ASSERT_EQ(platform_.ShareNamePathGet(photo.c_str(), name, sizeof(name), path, sizeof(path)), 0);
  EXPECT_STREQ(name, "photo");
  EXPECT_EQ(std::string(path), photo);
  EXPECT_LT(platform_.ShareNamePathGet(sandbox_.volume().c_str(), name, sizeof(name), path, sizeof(path)), 0);
  EXPECT_EQ(LastError().code, kPlatformErrShareNotFound);
  EXPECT_LT(platform_.ShareNamePathGet(photo.c_str(), name, 5, path, sizeof(path)), 0);
  EXPECT_EQ(LastError().code, kPlatformErrBufferTooSmall);
}

TEST_F(LinuxSharesTest, RecycleBinsOfSharesAndHomes) {
  const std::string photo = sandbox_.AddShare("photo");
  const std::string homes = sandbox_.AddShare("homes");
  EXPECT_EQ(platform_.ShareIsShareRecycle(photo + "/#recycle"), 1);
  EXPECT_EQ(platform_.ShareIsShareRecycle(photo + "/#recycle/a/b.jpg"), 1);
  EXPECT_EQ(platform_.ShareIsShareRecycle(photo + "/a/#recycle/b.jpg"), 0);
  EXPECT_EQ(platform_.ShareIsShareRecycle(photo + "/#recycled"), 0);
  EXPECT_LT(platform_.ShareIsShareRecycle("/elsewhere/#recycle"), 0);

  EXPECT_EQ(platform_.RecycleUserHomePathIsExist(homes + "/alice/#recycle/x", 11), 1);
  EXPECT_EQ(platform_.RecycleUserHomePathIsExist(homes + "/alice/#recycle", 11), 1);
  EXPECT_EQ(platform_.RecycleUserHomePathIsExist(homes + "/alice/docs/#recycle", 11), 0);
  EXPECT_EQ(platform_.RecycleUserHomePathIsExist(homes + "/alice", 11), 0);
  EXPECT_EQ(platform_.RecycleUserHomePathIsExist(photo + "/alice/#recycle", 11), 0);
  EXPECT_EQ(platform_.ServiceUserHomeIsEnabled(), 1);
}

TEST_F(LinuxSharesTest, IndexFilesLiveInTheSharesMetadataFolder) {
  char path[kPathBufferSize];
  ASSERT_EQ(platform_.QueuePathCompose("/volume1/photo", path, sizeof(path)), 0);
  EXPECT_STREQ(path, "/volume1/photo/@eaDir/fileindex.queue");
  ASSERT_EQ(platform_.DBPathCompose("/volume1/photo/", path, sizeof(path)), 0);
  EXPECT_STREQ(path, "/volume1/photo/@eaDir/fileindex.db");
  EXPECT_LT(platform_.QueuePathCompose("photo", path, sizeof(path)), 0);
  EXPECT_LT(platform_.DBPathCompose("/", path, sizeof(path)), 0);
  EXPECT_LT(platform_.QueuePathCompose("/volume1/photo", path, 10), 0);
  char name[kIndexIdBufferSize];
  ASSERT_EQ(platform_.GetIndexID("photo", name, sizeof(name)), 0);
  EXPECT_STREQ(name, "fileindex_photo");
  EXPECT_LT(platform_.GetIndexID("", name, sizeof(name)), 0);
  EXPECT_LT(platform_.GetIndexID("photo", name, 15), 0);  // no room for the NUL
}

TEST_F(LinuxSharesTest, PrivilegesFromTheRegistryOrTheDirectoryMode) {
  struct passwd* nobody = getpwnam("nobody");
  ASSERT_NE(nobody, nullptr);
  Json::Value extra;
  extra["privileges"]["nobody"] = "rw";
  const std::string listed = sandbox_.AddShare("listed", extra);
  extra["readonly"] = true;
  sandbox_.AddShare("capped", extra);
  const std::string open_dir = sandbox_.AddShare("open");
  const std::string closed = sandbox_.AddShare("closed");
  const std::string readable = sandbox_.AddShare("readable");
  ASSERT_EQ(chmod(open_dir.c_str(), 0777), 0);
  ASSERT_EQ(chmod(closed.c_str(), 0700), 0);
  ASSERT_EQ(chmod(readable.c_str(), 0755), 0);

  auto privilege = [this](const std::string& user, const std::string& share) {
    std::unique_ptr<ShareInfo> info;
    EXPECT_EQ(platform_.ShareGet(share, &info), 0);
    return platform_.ShareUserPrivGet(user, *info);
  };
  EXPECT_EQ(privilege("nobody", "listed"), kSharePrivReadWrite);
  EXPECT_EQ(privilege("nobody", "capped"), kSharePrivReadOnly);  // a read-only share caps every user
  if (getuid() != nobody->pw_uid) {
    EXPECT_EQ(privilege("nobody", "open"), kSharePrivReadWrite);
    EXPECT_EQ(privilege("nobody", "closed"), kSharePrivNone);
    EXPECT_EQ(privilege("nobody", "readable"), kSharePrivReadOnly);
  }
  // In the sandbox "root" is the running user: the superuser, or the owner of the directory.
  EXPECT_EQ(privilege("root", "closed"), kSharePrivReadWrite);
  EXPECT_LT(privilege("no-such-user-here", "open"), 0);
  EXPECT_EQ(LastError().code, kPlatformErrUserNotFound);
}

}  // namespace
}  // namespace platform
}  // namespace corvlumex
