// The library's administrator notices reach the notices log through the real
// notification tool installed in a sandbox root.
#include <gtest/gtest.h>
#include <unistd.h>

#include <cstdlib>
#include <filesystem>
#include <fstream>

#include "common/json_util.h"
#include "fileindex/queue/custom_event.h"
#include "tests/support/log_capture.h"
#include "tests/support/sandbox.h"

namespace corvlumex {
namespace {

class NotifyTest : public ::testing::Test {
 protected:
  void SetUp() override {
    const char* build = getenv("FILEINDEX_BUILD_DIR");
    ASSERT_NE(build, nullptr);
    root_.MakeDir("usr/corv/bin");
    std::filesystem::create_symlink(std::string(build) + "/programs/corvvxmnotify/corvvxmnotify",
                                    root_.path() + "/usr/corv/bin/corvvxmnotify");
  }

  std::vector<Json::Value> Notices() const {
    std::vector<Json::Value> notices;
    std::ifstream log(root_.path() + "/var/log/corvlumex/notices.log");
    for (std::string line; std::getline(log, line);) {
      Json::Value record;
      EXPECT_TRUE(JsonFromString(record, line)) << line;
      notices.push_back(record);
    }
    return notices;
  }

  testing_support::Sandbox root_;
};

TEST_F(NotifyTest, NoSpaceAndLackOfMemoryNoticesAreRecorded) {
  EXPECT_EQ(fileindex::SendVXMNotify(), 0);
  EXPECT_EQ(fileindex::NotifyLackOfMemory(), 0);
  const auto notices = Notices();
  ASSERT_EQ(notices.size(), 2u);
  EXPECT_EQ(notices[0]["message"].asString(), "error:index_no_space");
  EXPECT_EQ(notices[0]["target"].asString(), "@administrators");
  EXPECT_TRUE(notices[0]["badge"].asBool());
  EXPECT_TRUE(notices[0]["has_link"].asBool());
  EXPECT_NE(notices[0]["text"].asString().find("full"), std::string::npos);
  EXPECT_EQ(notices[1]["message"].asString(), "error:lack_of_memory");
  EXPECT_FALSE(notices[1]["has_link"].asBool());
}

TEST_F(NotifyTest, ABadCommandLineIsRefusedAndRecordsNothing) {
  EXPECT_EQ(fileindex::RunAdminNotifier({"-c", "X", "-b", "maybe", "@administrators", "t", "m"}, true), 2);
  EXPECT_EQ(fileindex::RunAdminNotifier({"-c", "X", "@administrators", "t", "m", "<a>"}, true), 2);
  EXPECT_TRUE(Notices().empty());
}

TEST_F(NotifyTest, AMissingToolIsANegativeResultNotAThrow) {
  std::filesystem::remove(root_.path() + "/usr/corv/bin/corvvxmnotify");
  testing_support::LogCapture log;
  EXPECT_LT(fileindex::SendVXMNotify(), 0);
}

}  // namespace
}  // namespace corvlumex
