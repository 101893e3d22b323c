// sdk::SDKCredentials: real switches as root, failures through test platforms.
#include <fcntl.h>
#include <grp.h>
#include <gtest/gtest.h>
#include <pwd.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>

#include "common/error.h"
#include "common/log.h"
#include "sdk/credentials.h"
#include "tests/support/sandbox.h"
#include "tests/support/fake_platform.h"

namespace corvlumex {
namespace sdk {
namespace {

using testing_support::ErrorOf;
using testing_support::LogCapture;
using testing_support::Sandbox;
using testing_support::ScopedFakePlatform;

// Counts switches in `switches`, and refuses those to `refused`.
void CountSwitches(ScopedFakePlatform& fake, int* switches, const std::string& refused = "") {
  fake->ResetCredentialsByNameHook = [&fake, switches, refused](const std::string& name, bool with_groups) {
    ++*switches;
    if (name == refused) {
      platform::SetLastError(platform::kPlatformErrCredentials, "test", 1, "refused");
      return false;
    }
    return fake->RealResetCredentialsByName(name, with_groups);
  };
}

struct passwd* Nobody() { return getpwnam("nobody"); }

TEST(SDKCredentialsTest, UnchangedIdsRestoreNothing) {
  Sandbox root;
  ScopedFakePlatform installed;
  int switches = 0;
  CountSwitches(installed, &switches);
  { SDKCredentials saved; }
  EXPECT_EQ(switches, 0);
  {
    SDKCredentials saved;
    saved.AsUser("root");  // the sandbox's "root" is the running user: no change
  }
  EXPECT_EQ(switches, 1);
  EXPECT_EQ(geteuid(), getuid());
}

TEST(SDKCredentialsTest, FailuresAre503) {
  Sandbox root;
  ScopedFakePlatform installed;
  int switches = 0;
  CountSwitches(installed, &switches, "alice");
  LogCapture log;
  EXPECT_EQ(ErrorOf([] { SDKCredentials as("alice"); }).code, kErrorSwitchUser);
  EXPECT_EQ(log.Matching("Failed [!ResetCredentialsByName(target_username)]").size(), 1u);

  installed->UserGetByUIDHook = [](uid_t, platform::UserRecord*) {
    platform::SetLastError(platform::kPlatformErrUserNotFound, "test", 1, "");
    return false;
  };
  const Error error = ErrorOf([] { SDKCredentials saved; });
  EXPECT_EQ(error.code, kErrorSwitchUser);
  EXPECT_EQ(error.reason, "CORVUserGetByUID failed, err=0x0600");
  EXPECT_EQ(log.Matching("Failed [0 > CORVUserGetByUID(euid_, &user_info) || !user_info]").size(), 1u);
}

class RootCredentialsTest : public ::testing::Test {
 protected:
  void SetUp() override {
    if (geteuid() != 0 || getuid() != 0) GTEST_SKIP() << "switching users needs root";
    if (Nobody() == nullptr) GTEST_SKIP() << "no user \"nobody\"";
    nobody_uid_ = Nobody()->pw_uid;
    nobody_gid_ = Nobody()->pw_gid;
  }
  void TearDown() override {
    // Whatever a test did, the next one starts as root.
    if (geteuid() != 0 && seteuid(0) != 0) std::abort();
    if (getegid() != 0 && setegid(0) != 0) std::abort();
  }
  uid_t nobody_uid_ = 0;
  gid_t nobody_gid_ = 0;
};

TEST_F(RootCredentialsTest, SwitchesToAnotherUserAndBack) {
  Sandbox private_dir(false);
  ASSERT_EQ(chmod(private_dir.path().c_str(), 0700), 0);
  const std::string probe = private_dir.path() + "/probe";
  {
    SDKCredentials saved;
    saved.AsUser("nobody");
    EXPECT_EQ(geteuid(), nobody_uid_);
    EXPECT_EQ(getegid(), nobody_gid_);
    EXPECT_EQ(getuid(), 0u);  // only the effective ids move
    // The switched identity is what the kernel checks.
    EXPECT_LT(open(probe.c_str(), O_WRONLY | O_CREAT, 0644), 0);
    EXPECT_EQ(errno, EACCES);
    std::vector<gid_t> groups(getgroups(0, nullptr));
    getgroups(static_cast<int>(groups.size()), groups.data());
    for (gid_t gid : groups) EXPECT_NE(gid, 0u) << "root's group kept";
  }
  EXPECT_EQ(geteuid(), 0u);
  EXPECT_EQ(getegid(), 0u);
  std::vector<gid_t> groups(getgroups(0, nullptr));
  getgroups(static_cast<int>(groups.size()), groups.data());
  EXPECT_EQ(std::count(groups.begin(), groups.end(), 0u), 1) << "root's groups back";
  const int fd = open(probe.c_str(), O_WRONLY | O_CREAT, 0644);
  EXPECT_GE(fd, 0);
  close(fd);
}

TEST_F(RootCredentialsTest, SwitchesWorkInsideASandboxToo) {
  Sandbox root;
  {
    SDKCredentials saved;  // "root": the running user of the sandbox
    saved.AsUser("nobody");
    EXPECT_EQ(geteuid(), nobody_uid_);
    saved.AsUser("CorvLumex");  // the sandbox's service account is the running user
    EXPECT_EQ(geteuid(), 0u);
    saved.AsUser("nobody");
  }
  EXPECT_EQ(geteuid(), 0u);
}

TEST_F(RootCredentialsTest, NamedSwitchReappliesItsTargetOnDestruction) {
  { SDKCredentials as("nobody"); }
  // Deliberately the target, not the caller: whoever wants the previous
  // user back saves it first with the default constructor.
  EXPECT_EQ(geteuid(), nobody_uid_);
  ASSERT_TRUE(platform::Current()->ResetCredentialsByName("root", true));
  EXPECT_EQ(geteuid(), 0u);
}

TEST_F(RootCredentialsTest, FailedRestoreEndsTheProcess) {
  ::testing::FLAGS_gtest_death_test_style = "threadsafe";
  EXPECT_DEATH(
      {
        SetLogSink([](int, const std::string& line) { fprintf(stderr, "%s\n", line.c_str()); });
        ScopedFakePlatform installed;
        int switches = 0;
        CountSwitches(installed, &switches, "root");
        SDKCredentials saved;
        saved.AsUser("nobody");
      },
      "Failed \\[!ResetCredentialsByName\\(username_\\)\\]");
}

}  // namespace
}  // namespace sdk
}  // namespace corvlumex
