#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <gtest/gtest.h>

#include <fstream>

#include "common/error.h"
#include "common/file_util.h"
#include "common/json_util.h"
#include "common/sys.h"
#include "fileindex/queue/custom_event.h"
#include "fileindex/queue/event.h"
#include "fileindex/state/status_mgr.h"
#include "platform/linux/linux_platform.h"
#include "tests/support/fake_platform.h"
#include "tests/support/sandbox.h"

namespace corvlumex {
namespace fileindex {
namespace {

std::vector<std::string> Lines(const std::string& path) {
  std::vector<std::string> lines;
  std::ifstream input(path);
  for (std::string line; std::getline(input, line);) lines.push_back(line);
  return lines;
}

class CustomEventTest : public ::testing::Test {
 protected:
  CustomEventTest() : share_(sandbox_.AddShare("docs")), queue_(share_ + "/@eaDir/fileindex.queue") {}

  Sandbox sandbox_{true, Sandbox::kInstalled};
  SleepRecorder sleeps_;
  const std::string share_;
  const std::string queue_;
};

TEST_F(CustomEventTest, AppendsOneOrdinaryQueueLine) {
  AddCustomEvent(kEventUpdateCfg, share_ + "/a", "", testing_support::JsonOf(R"({"document":true})"));
  AddCustomEvent(kEventRename, share_ + "/b", share_ + "/a", Json::Value());
  EXPECT_EQ(Lines(queue_),
            (std::vector<std::string>{
                R"({"data":{"document":true},"event":131072,"path":")" + share_ + R"(/a","path_old":""})",
                R"({"data":null,"event":256,"path":")" + share_ + R"(/b","path_old":")" + share_ + R"(/a"})"}));
}

TEST_F(CustomEventTest, ACoveringReindexMakesItANoOp) {
  AddCustomEvent(kEventReindex, share_ + "/dir", "", Json::Value());
  AddCustomEvent(kEventUpdateCfg, share_ + "/dir/sub", "", Json::Value());
  AddCustomEvent(kEventReindex, share_ + "/dir", "", Json::Value());
  AddCustomEvent(kEventUpdateCfg, share_ + "/dirx", "", Json::Value());
  EXPECT_EQ(Lines(queue_).size(), 2u);
}

TEST_F(CustomEventTest, APathOutsideEveryShareMarksTheEmptyNameAndThrows) {
  LogCapture log;
  EXPECT_EQ(ErrorOf([] { AddCustomEvent(kEventReindex, "/elsewhere/x", "", Json::Value()); }).code, kErrorSystem);
  const auto lines = log.Matching("(AddCustomEvent) AddCustomEvent failed, code=502, reason=");
  ASSERT_EQ(lines.size(), 1u);
  EXPECT_NE(lines[0].find(". Set [] need reindex"), std::string::npos) << lines[0];
  EXPECT_EQ(StatusMgr().GetShareStatus(""), 1u);
}

TEST_F(CustomEventTest, AnUnreadableQueueMarksTheShare) {
  std::ofstream(queue_) << "not json\n";
  EXPECT_THROW(AddCustomEvent(kEventCreate, share_ + "/a", "", Json::Value()), Error);
  EXPECT_EQ(StatusMgr().GetShareStatus("docs"), 1u);
  EXPECT_EQ(Lines(queue_).size(), 1u);
}

TEST_F(CustomEventTest, AMissingQueueDirectoryLosesTheEventSilently) {
  ASSERT_EQ(rmdir((share_ + "/@eaDir").c_str()), 0);
  LogCapture log;
  AddCustomEvent(kEventCreate, share_ + "/a", "", Json::Value());
  EXPECT_FALSE(IsFileExist(queue_));
  EXPECT_TRUE(log.Lines().empty());
  EXPECT_EQ(StatusMgr().GetShareStatus("docs"), 0u);
}

TEST_F(CustomEventTest, AQueueLockHeldPastEveryRetryIsAnErrorNotASilentLoss) {
  std::ofstream(queue_) << "";
  const int holder = open(queue_.c_str(), O_RDONLY);
  ASSERT_GE(holder, 0);
  ASSERT_EQ(flock(holder, LOCK_EX), 0);
  EXPECT_EQ(ErrorOf([&] { AddCustomEvent(kEventCreate, share_ + "/a", "", Json::Value()); }).code, kErrorLockFile);
  close(holder);
  EXPECT_TRUE(Lines(queue_).empty());
  EXPECT_FALSE(sleeps_.Sleeps().empty()) << "the lock was retried";
  // Once the lock is free the same call goes through.
  AddCustomEvent(kEventCreate, share_ + "/a", "", Json::Value());
  EXPECT_EQ(Lines(queue_).size(), 1u);
}

// --- Notifications ---

// The notification tool's calls, recorded and answered with `result`.
class NotifyTest : public ::testing::Test {
 protected:
  NotifyTest() {
    platform_->ExecHook = [this](const std::string& program, const std::vector<std::string>& args, int flags) {
      program_ = program, args_ = args, flags_ = flags;
      return result_;
    };
  }
  Sandbox sandbox_{true, Sandbox::kInstalled};
  testing_support::ScopedFakePlatform platform_;
  std::string program_;
  std::vector<std::string> args_;
  int flags_ = -1;
  int result_ = 0;
};

TEST_F(NotifyTest, NoticeArgumentsAndResults) {
  result_ = 3;
  EXPECT_EQ(SendVXMNotify(), 3);
  EXPECT_EQ(program_, sandbox_.root() + "/usr/corv/bin/corvvxmnotify");
  EXPECT_EQ(flags_, 187);
  EXPECT_EQ(args_,
            (std::vector<std::string>{"-c", "CORV.Lumex.Application", "-b", "true", "-e", "false", "@administrators",
                                      "app:displayname", "error:index_no_space",
                                      "<a data-corv-app=\"CORV.Lumex.Application\" data-corv-fn=\"preference\">",
                                      "</a>"}));
  result_ = -1;
  flags_ = 0;
  EXPECT_EQ(NotifyLackOfMemory(), -1);
  EXPECT_EQ(flags_, 187);
  EXPECT_EQ(args_, (std::vector<std::string>{"-c", "CORV.Lumex.Application", "@administrators",
                                                       "app:displayname", "error:lack_of_memory"}));
}

}  // namespace
}  // namespace fileindex
}  // namespace corvlumex
