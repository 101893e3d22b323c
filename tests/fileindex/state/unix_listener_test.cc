#include "fileindex/unix_listener.h"

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <fstream>
#include <functional>
#include <memory>

#include "common/error.h"
#include "tests/support/frame_client.h"
#include "tests/support/log_capture.h"
#include "tests/support/sandbox.h"

namespace corvlumex {
namespace fileindex {
namespace {

class UnixListenerTest : public ::testing::Test {
 protected:
  std::unique_ptr<UnixListener> Listen(mode_t mode = 0666) {
    UnixListenerOptions options;
    options.mode = mode;
    return std::make_unique<UnixListener>(path_, options);
  }

  testing_support::Sandbox root_{false};
  std::string path_ = root_.path() + "/daemon.sock";
};

TEST_F(UnixListenerTest, WhatLiesAtThePathDecidesWhetherItIsTakenOver) {
  std::unique_ptr<UnixListener> live;
  const struct {
    const char* what;
    std::function<void()> prepare;
    const char* refusal;  // empty: the listener takes the path
  } cases[] = {
      {"nothing", [] {}, ""},
      {"a socket left by a crash", [&] { close(testing_support::BindSocket(path_, false)); }, ""},
      {"a socket another daemon answers on", [&] { live = Listen(); }, "another daemon already answers on "},
      {"a file that is no socket", [&] { std::ofstream(path_) << "keep me"; }, " exists and is not a socket"},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.what);
    c.prepare();
    try {
      const auto listener = Listen(0660);
      EXPECT_STREQ(c.refusal, "");
      struct stat info;
      ASSERT_EQ(lstat(path_.c_str(), &info), 0);
      EXPECT_TRUE(S_ISSOCK(info.st_mode));
      EXPECT_EQ(info.st_mode & 07777, 0660u);
      const int client = testing_support::ConnectTo(path_);
      EXPECT_GE(client, 0);
      close(client);
    } catch (const Error& error) {
      ASSERT_STRNE(c.refusal, "") << error.reason;
      EXPECT_NE(error.reason.find(c.refusal), std::string::npos) << error.reason;
      EXPECT_NE(error.reason.find(path_), std::string::npos) << error.reason;
    }
    if (live) {
      const int client = testing_support::ConnectTo(path_);
      EXPECT_GE(client, 0) << "the live daemon lost its socket";
      close(client);
      live.reset();
    }
    if (std::string(c.what) == "a file that is no socket") {
      EXPECT_EQ(testing_support::ReadFileText(path_), "keep me");
    }
    unlink(path_.c_str());
  }
}

TEST_F(UnixListenerTest, EachConnectionComesWithWhoIsAsking) {
  const auto listener = Listen();
  PeerCredentials peer;
  EXPECT_EQ(listener->Accept(&peer), -1) << "nobody is waiting";
  EXPECT_EQ(errno, EAGAIN);
  const int client = testing_support::ConnectTo(path_);
  ASSERT_GE(client, 0);
  const int served = listener->Accept(&peer);
  ASSERT_GE(served, 0);
  EXPECT_EQ(peer.uid, getuid());
  EXPECT_EQ(peer.gid, getgid());
  EXPECT_EQ(peer.pid, getpid());
  close(served);
  close(client);
}

TEST_F(UnixListenerTest, TheSocketFileGoesWithTheListener) {
  Listen().reset();
  EXPECT_NE(access(path_.c_str(), F_OK), 0);
}

}  // namespace
}  // namespace fileindex
}  // namespace corvlumex
