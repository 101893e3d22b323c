#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <gtest/gtest.h>

#include <climits>
#include <cstdint>
#include <ctime>

#include "common/error.h"
#include "common/file_util.h"
#include "common/json_util.h"
#include "common/sys.h"
#include "fileindex/state/constants.h"
#include "fileindex/state/status_mgr.h"
#include "tests/support/sandbox.h"

namespace corvlumex {
namespace fileindex {
namespace {

class StatusMgrTest : public ::testing::Test {
 protected:
  std::string StatusPath() const { return sandbox_.EtcFile("fileindex.status"); }
  void WriteStatus(const std::string& text) { sandbox_.Write("var/packages/CorvLumex/etc/fileindex.status", text); }
  Json::Value Stored() const {
    Json::Value stored;
    EXPECT_TRUE(JsonFromFile(stored, StatusPath())) << ReadFileText(StatusPath());
    return stored;
  }

  Sandbox sandbox_{true, Sandbox::kFakeIndexer};
  SleepRecorder sleeps_;
};

TEST_F(StatusMgrTest, AbsentFileOrMembersReadAsNotPausedWithoutFlags) {
  EXPECT_EQ(StatusMgr().GetPauseInfo(), -1);
  EXPECT_EQ(StatusMgr().GetShareStatus("music"), 0u);
  EXPECT_FALSE(IsFileExist(StatusPath()));
  // Clearing an empty state writes an object, still without a pause.
  StatusMgr().ClearShareStatus("music");
  EXPECT_EQ(ReadFileText(StatusPath()), "{}\n");
  EXPECT_EQ(StatusMgr().GetPauseInfo(), -1);
  WriteStatus("{\"resume_time\": 1234}");
  EXPECT_EQ(StatusMgr().GetPauseInfo(), 1234);
  EXPECT_EQ(StatusMgr().GetShareStatus("music"), 0u);
}

TEST_F(StatusMgrTest, PauseWithoutEndAndResumeAreStoredAndSentToTheDaemon) {
  StatusMgr().Pause(0);
  EXPECT_EQ(Stored()["resume_time"], 0);
  EXPECT_EQ(StatusMgr().GetPauseInfo(), 0);
  struct stat info;
  ASSERT_EQ(stat(StatusPath().c_str(), &info), 0);
  EXPECT_EQ(info.st_mode & 07777, 0644u);
  StatusMgr().Resume();
  EXPECT_EQ(Stored()["resume_time"], -1);
  const auto commands = sandbox_.DaemonCommands();
  ASSERT_EQ(commands.size(), 2u);
  EXPECT_EQ(JsonToString(commands[0]), "{\"data\":{\"resume_time\":0},\"type\":\"pause\"}");
  EXPECT_EQ(JsonToString(commands[1]), "{\"data\":null,\"type\":\"resume\"}");
}

// Hours, not seconds, added in unsigned 32-bit arithmetic (wrapping).
TEST_F(StatusMgrTest, PauseEndIsNowPlusHoursIn32Bits) {
  for (const int hours : {2, INT_MAX}) {
    SCOPED_TRACE(hours);
    const uint32_t before = static_cast<uint32_t>(time(nullptr));
    StatusMgr().Pause(hours);
    const uint32_t after = static_cast<uint32_t>(time(nullptr));
    const long long stored = StatusMgr().GetPauseInfo();
    EXPECT_GE(stored, 0);
    EXPECT_LE(stored, static_cast<long long>(UINT32_MAX));
    bool matches = false;
    for (uint32_t now = before; now <= after; ++now) {
      matches |= stored == static_cast<uint32_t>(now + static_cast<uint32_t>(hours) * 3600u);
    }
    EXPECT_TRUE(matches) << stored;
    EXPECT_EQ(sandbox_.DaemonCommands().back()["data"]["resume_time"].asInt64(), stored);
  }
}

TEST_F(StatusMgrTest, NegativePauseIsRefusedBeforeAnyChange) {
  WriteStatus("{\"resume_time\":-1}");
  ExpectError([] { StatusMgr().Pause(-1); }, kErrorBadArgument, "Pause length should NOT be negative", "0 > hours");
  EXPECT_EQ(ReadFileText(StatusPath()), "{\"resume_time\":-1}");
  EXPECT_TRUE(sandbox_.daemon()->Frames().empty());
}

TEST_F(StatusMgrTest, ShareFlagsAreOredClearedAndRemoved) {
  StatusMgr().SetShareStatus("music", 1);
  StatusMgr().SetShareStatus("music", 2);
  StatusMgr().SetShareStatus("video", 4);
  EXPECT_EQ(Stored()["share"]["music"], 3);
  StatusMgr().UnsetShareStatus("music", 1);
  EXPECT_EQ(StatusMgr().GetShareStatus("music"), 2u);
  StatusMgr().ClearShareStatus("music");
  const Json::Value stored = Stored();
  EXPECT_FALSE(stored["share"].isMember("music"));
  EXPECT_EQ(stored["share"]["video"], 4);
  EXPECT_TRUE(sandbox_.daemon()->Frames().empty()) << "flag changes send no command";
}

TEST_F(StatusMgrTest, OneSnapshotKeepsItsOwnView) {
  // Not re-read under the lock: the later save of an older snapshot wins.
  StatusMgr early;
  StatusMgr().SetShareStatus("music", 1);
  early.SetShareStatus("video", 1);
  EXPECT_EQ(StatusMgr().GetShareStatus("music"), 0u);
  EXPECT_EQ(StatusMgr().GetShareStatus("video"), 1u);
}

TEST_F(StatusMgrTest, UnreadableFileIs504WithTheConditionLogged) {
  const std::string unparsed = "IsFileExist(kFileIndexStatusCfgPath) && !data_.fromFile(kFileIndexStatusCfgPath)";
  const std::string not_object = "!data_.isNull() && !data_.isObject()";
  for (const auto& [content, condition] : std::vector<std::pair<std::string, std::string>>{
           {"{\"resume_time\": ", unparsed}, {"[1, 2]", not_object}, {"7", not_object}}) {
    SCOPED_TRACE(content);
    WriteStatus(content);
    ExpectError([] { StatusMgr(); }, kErrorLoadJson, "Cannot load json: " + StatusPath(), condition, "StatusMgr");
  }
}

TEST_F(StatusMgrTest, SaveFailureIs505AndKeepsTheChangeInMemory) {
  const std::string etc = sandbox_.root() + "/var/packages/CorvLumex/etc";
  ASSERT_EQ(rmdir(etc.c_str()), 0);
  StatusMgr status;
  ExpectError([&] { status.SetShareStatus("music", 1); }, kErrorSaveJson, "Failed to save json: " + StatusPath(),
              "!data_.toFile(kFileIndexStatusCfgPath)");
  EXPECT_EQ(status.GetShareStatus("music"), 1u);
}

TEST_F(StatusMgrTest, LockIsHeldAcrossTheDaemonCommand) {
  // With no daemon the command retries its connect; each retry's sleep
  // finds the status lock taken.
  Sandbox no_daemon(true, Sandbox::kInstalled);
  const std::string lock_path = SysPath(kFileIndexStatusLockPath);
  int checks = 0, held = 0;
  SetSleepHook([&](std::chrono::microseconds) {
    ++checks;
    const int fd = open(lock_path.c_str(), O_RDONLY);
    if (fd >= 0 && flock(fd, LOCK_EX | LOCK_NB) != 0) ++held;
    if (fd >= 0) close(fd);
  });
  const Error error = ErrorOf([] { StatusMgr().Resume(); });
  EXPECT_EQ(error.code, kErrorSystem);
  EXPECT_EQ(error.reason.rfind("write failed, reason=", 0), 0u) << error.reason;
  SetSleepHook(nullptr);
  EXPECT_EQ(checks, 4);
  EXPECT_EQ(held, 4);
  // The file was saved before the daemon was told.
  EXPECT_EQ(StatusMgr().GetPauseInfo(), -1);
  EXPECT_TRUE(IsFileExist(no_daemon.EtcFile("fileindex.status")));
}

}  // namespace
}  // namespace fileindex
}  // namespace corvlumex
