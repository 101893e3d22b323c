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
#include "fileindex/constants.h"
#include "fileindex/status_mgr.h"
#include "tests/state/state_sandbox.h"

namespace corvlumex {
namespace fileindex {
namespace {

using testing_support::LogCapture;
using testing_support::SleepRecorder;
using testing_support::StateSandbox;

class StatusMgrTest : public ::testing::Test {
 protected:
  std::string StatusPath() const { return sandbox_.EtcFile("fileindex.status"); }
  Json::Value Stored() const {
    Json::Value stored;
    EXPECT_TRUE(JsonFromFile(stored, StatusPath())) << sandbox_.Read(StatusPath());
    return stored;
  }
  // The commands fileindexd received, as JSON.
  std::vector<Json::Value> Commands() {
    std::vector<Json::Value> commands;
    for (const auto& frame : sandbox_.daemon()->Frames()) {
      Json::Value command;
      EXPECT_EQ(frame.body.back(), '\0');
      EXPECT_TRUE(JsonFromString(command, frame.body.substr(0, frame.length - 1)));
      commands.push_back(command);
    }
    return commands;
  }

  StateSandbox sandbox_;
  SleepRecorder sleeps_;
};

TEST_F(StatusMgrTest, MissingFileReadsAsNotPausedWithoutFlags) {
  const StatusMgr status;
  EXPECT_EQ(status.GetPauseInfo(), -1);
  EXPECT_EQ(status.GetShareStatus("music"), 0u);
  EXPECT_FALSE(IsFileExist(StatusPath()));
}

TEST_F(StatusMgrTest, FileWithoutShareMemberReadsZero) {
  sandbox_.Write("var/packages/CorvLumex/etc/fileindex.status", "{\"resume_time\": 1234}");
  const StatusMgr status;
  EXPECT_EQ(status.GetPauseInfo(), 1234);
  EXPECT_EQ(status.GetShareStatus("music"), 0u);
}

TEST_F(StatusMgrTest, PauseWithoutEndStoresZeroAndTellsTheDaemon) {
  StatusMgr().Pause(0);
  EXPECT_EQ(Stored()["resume_time"], 0);
  EXPECT_EQ(StatusMgr().GetPauseInfo(), 0);
  const auto commands = Commands();
  ASSERT_EQ(commands.size(), 1u);
  EXPECT_EQ(commands[0]["type"], "pause");
  EXPECT_EQ(commands[0]["data"]["resume_time"], 0);
  struct stat info;
  ASSERT_EQ(stat(StatusPath().c_str(), &info), 0);
  EXPECT_EQ(info.st_mode & 07777, 0644u);
}

TEST_F(StatusMgrTest, PauseCountsHoursNotSeconds) {
  const long long before = time(nullptr);
  StatusMgr().Pause(2);
  const long long after = time(nullptr);
  const long long stored = StatusMgr().GetPauseInfo();
  EXPECT_GE(stored, before + 7200);
  EXPECT_LE(stored, after + 7200);
  EXPECT_EQ(Commands()[0]["data"]["resume_time"].asInt64(), stored);
}

TEST_F(StatusMgrTest, PauseWrapsInUnsigned32BitArithmetic) {
  const uint32_t before = static_cast<uint32_t>(time(nullptr));
  StatusMgr().Pause(INT_MAX);
  const uint32_t after = static_cast<uint32_t>(time(nullptr));
  const long long stored = StatusMgr().GetPauseInfo();
  EXPECT_GE(stored, 0);
  EXPECT_LE(stored, static_cast<long long>(UINT32_MAX));
  const uint32_t added = static_cast<uint32_t>(INT_MAX) * 3600u;
  bool matches = false;
  for (uint32_t now = before; now <= after; ++now) matches |= stored == static_cast<uint32_t>(now + added);
  EXPECT_TRUE(matches) << stored;
}

TEST_F(StatusMgrTest, NegativePauseIsRefusedBeforeAnyChange) {
  sandbox_.Write("var/packages/CorvLumex/etc/fileindex.status", "{\"resume_time\":-1}");
  LogCapture log;
  try {
    StatusMgr().Pause(-1);
    FAIL() << "no throw";
  } catch (const Error& error) {
    EXPECT_EQ(error.code, kErrorBadArgument);
    EXPECT_EQ(error.reason, "Pause length should NOT be negative");
  }
  EXPECT_EQ(sandbox_.Read(StatusPath()), "{\"resume_time\":-1}");
  EXPECT_TRUE(sandbox_.daemon()->Frames().empty());
  EXPECT_EQ(log.Matching("Pause length should NOT be negative").size(), 1u);
}

TEST_F(StatusMgrTest, ResumeStoresMinusOneAndSendsNullData) {
  StatusMgr().Pause(0);
  StatusMgr().Resume();
  EXPECT_EQ(Stored()["resume_time"], -1);
  const auto commands = Commands();
  ASSERT_EQ(commands.size(), 2u);
  EXPECT_EQ(commands[1]["type"], "resume");
  EXPECT_TRUE(commands[1].isMember("data"));
  EXPECT_TRUE(commands[1]["data"].isNull());
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

TEST_F(StatusMgrTest, ClearingAnEmptyStateWritesAnObject) {
  StatusMgr().ClearShareStatus("music");
  EXPECT_EQ(sandbox_.Read(StatusPath()), "{}\n");
  EXPECT_EQ(StatusMgr().GetPauseInfo(), -1);
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
  for (const char* content : {"{\"resume_time\": ", "[1, 2]", "7"}) {
    sandbox_.Write("var/packages/CorvLumex/etc/fileindex.status", content);
    LogCapture log;
    try {
      StatusMgr status;
      FAIL() << "no throw for " << content;
    } catch (const Error& error) {
      EXPECT_EQ(error.code, kErrorLoadJson);
      EXPECT_EQ(error.reason, "Cannot load json: " + StatusPath());
    }
    ASSERT_EQ(log.Lines().size(), 1u);
    EXPECT_NE(log.Lines()[0].find("(StatusMgr) Failed ["), std::string::npos) << log.Lines()[0];
  }
  sandbox_.Write("var/packages/CorvLumex/etc/fileindex.status", "{\"resume_time\": ");
  LogCapture log;
  EXPECT_THROW(StatusMgr(), Error);
  EXPECT_NE(log.Lines().at(0).find("Failed [IsFileExist(kFileIndexStatusCfgPath) && "
                                   "!data_.fromFile(kFileIndexStatusCfgPath)], reason: Cannot load json: "),
            std::string::npos)
      << log.Lines()[0];
}

TEST_F(StatusMgrTest, SaveFailureIs505AndKeepsTheChangeInMemory) {
  const std::string etc = sandbox_.root() + "/var/packages/CorvLumex/etc";
  ASSERT_EQ(rmdir(etc.c_str()), 0);
  StatusMgr status;
  LogCapture log;
  try {
    status.SetShareStatus("music", 1);
    FAIL() << "no throw";
  } catch (const Error& error) {
    EXPECT_EQ(error.code, kErrorSaveJson);
    EXPECT_EQ(error.reason, "Failed to save json: " + StatusPath());
  }
  EXPECT_EQ(status.GetShareStatus("music"), 1u);
  EXPECT_EQ(log.Matching("Failed [!data_.toFile(kFileIndexStatusCfgPath)]").size(), 1u);
}

TEST_F(StatusMgrTest, LockIsHeldAcrossTheDaemonCommand) {
  // With no daemon the command retries its connect; each retry's sleep
  // finds the status lock taken.
  StateSandbox no_daemon(false);
  const std::string lock_path = SysPath(kFileIndexStatusLockPath);
  int checks = 0, held = 0;
  SetSleepHook([&](std::chrono::microseconds) {
    ++checks;
    const int fd = open(lock_path.c_str(), O_RDONLY);
    if (fd >= 0 && flock(fd, LOCK_EX | LOCK_NB) != 0) ++held;
    if (fd >= 0) close(fd);
  });
  try {
    StatusMgr().Resume();
    ADD_FAILURE() << "no throw";
  } catch (const Error& error) {
    EXPECT_EQ(error.code, kErrorSystem);
    EXPECT_EQ(error.reason.rfind("write failed, reason=", 0), 0u) << error.reason;
  }
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
