#include <signal.h>
#include <sys/socket.h>
#include <unistd.h>

#include <gtest/gtest.h>

#include <cerrno>
#include <cstring>
#include <functional>
#include <string>
#include <thread>
#include <vector>

#include "common/error.h"
#include "common/frame.h"
#include "common/json_util.h"
#include "common/sys.h"
#include "fileindex/state/communication.h"
#include "tests/fileindex/state/syscall_script.h"
#include "tests/support/frame_client.h"
#include "tests/support/sandbox.h"

namespace corvlumex {
namespace fileindex {
namespace {

using testing_support::FakeDaemon;
using testing_support::OpenDescriptors;
using testing_support::ScopedSyscallScript;
using testing_support::SyscallScript;

constexpr int P = SyscallScript::kPass;
constexpr int E = -EINTR;

std::string DaemonSocket() { return SysPath("/var/run/fileindexd.sock"); }

// "<call> failed, reason=<text of errno_value>"
std::string Failed(const char* call, int errno_value) {
  return std::string(call) + " failed, reason=" + strerror(errno_value);
}

// Reason of the Error 502 that `fn` throws.
template <typename Fn>
std::string ReasonOf(Fn fn) {
  const Error error = ErrorOf(fn);
  EXPECT_EQ(error.code, kErrorSystem) << error.what();
  return error.reason;
}

// A socket bound on the daemon's path of `root`, listening or not.
int BindDaemonSocket(const Sandbox& root, bool listening) {
  const int fd = testing_support::BindSocket(root.MakeDir("var/run") + "/fileindexd.sock", listening);
  EXPECT_GE(fd, 0);
  return fd;
}

class Pipe {
 public:
  Pipe() {
    int fds[2];
    EXPECT_EQ(socketpair(AF_UNIX, SOCK_STREAM, 0, fds), 0);
    read_end = fds[0];
    write_end = fds[1];
  }
  ~Pipe() {
    close(read_end);
    close(write_end);
  }
  int read_end, write_end;
};

// --- BufferRead / BufferWrite ---

TEST(BufferTransfer, ChunksOfAtMost1024BytesAndNoCallForNothing) {
  Pipe pipe;
  const std::vector<unsigned char> data(3000, 'x');
  SyscallScript script;
  {
    ScopedSyscallScript scope(&script);
    BufferRead(-1, 0, nullptr);
    BufferWrite(-1, 0, nullptr);
    EXPECT_TRUE(script.read_sizes.empty());
    EXPECT_TRUE(script.write_sizes.empty());
    BufferWrite(pipe.write_end, data.size(), data.data());
  }
  EXPECT_EQ(script.write_sizes, (std::vector<unsigned long>{1024, 1024, 952}));
  std::vector<unsigned char> back(3000);
  {
    ScopedSyscallScript scope(&script);
    BufferRead(pipe.read_end, back.size(), back.data());
  }
  EXPECT_EQ(back, data);
  ASSERT_GE(script.read_sizes.size(), 3u);
  for (unsigned long size : script.read_sizes) EXPECT_LE(size, 1024u);
}

// Ten interruptions in one transfer are retried, spread over its chunks or
// not (progress does not reset the budget); the eleventh fails. A zero result
// is retried; any other error fails at once. The functions never log.
TEST(BufferTransfer, RetriesAndFailures) {
  struct Row {
    bool reading;
    std::deque<int> script;
    size_t size;
    std::string failure;  // empty: the data goes through whole
  };
  const std::deque<int> ten(10, E), eleven(11, E);
  const std::vector<Row> rows = {
      {false, ten, 1, ""},
      {false, eleven, 1, Failed("write", EINTR)},
      {true, ten, 1, ""},
      {true, eleven, 1, Failed("read", EINTR)},
      {false, {E, E, E, E, P, E, E, E, E, P, E, E, P}, 3000, ""},
      {false, {E, E, E, E, P, E, E, E, E, P, E, E, E}, 3000, Failed("write", EINTR)},
      {false, {0, 0, P}, 3, ""},
      {true, {-ECONNRESET}, 3, Failed("read", ECONNRESET)},
  };
  LogCapture log;
  for (const Row& row : rows) {
    SCOPED_TRACE(::testing::Message() << (row.reading ? "read " : "write ") << row.size << " " << row.failure);
    Pipe pipe;
    std::vector<unsigned char> data(row.size, 'x'), back(row.size);
    SyscallScript script;
    (row.reading ? script.reads : script.writes) = row.script;
    if (row.reading) BufferWrite(pipe.write_end, data.size(), data.data());
    ScopedSyscallScript scope(&script);
    if (!row.failure.empty()) {
      EXPECT_EQ(ReasonOf([&] {
                  row.reading ? BufferRead(pipe.read_end, back.size(), back.data())
                              : BufferWrite(pipe.write_end, data.size(), data.data());
                }),
                row.failure);
      continue;
    }
    if (!row.reading) BufferWrite(pipe.write_end, data.size(), data.data());
    BufferRead(pipe.read_end, back.size(), back.data());
    EXPECT_EQ(back, data);
  }
  EXPECT_EQ(ReasonOf([&] { BufferWrite(-1, 1, nullptr); }), Failed("write", EBADF));
  EXPECT_EQ(ReasonOf([&] { BufferRead(-1, 1, nullptr); }), Failed("read", EBADF));
  EXPECT_TRUE(log.Lines().empty());
}

TEST(Frames, LengthCountsTheNulAndReaderDropsIt) {
  Pipe pipe;
  WriteFrame(pipe.write_end, "{\"a\":1}");
  uint32_t length = 0;
  ASSERT_EQ(read(pipe.read_end, &length, 4), 4);
  EXPECT_EQ(length, 8u);
  char body[8];
  ASSERT_EQ(read(pipe.read_end, body, 8), 8);
  EXPECT_EQ(std::string(body, 8), std::string("{\"a\":1}\0", 8));

  WriteFrame(pipe.write_end, "");
  EXPECT_EQ(ReadFrame(pipe.read_end), "");
  // A body sent without its NUL is accepted as it stands.
  const uint32_t bare = 2;
  ASSERT_EQ(write(pipe.write_end, &bare, 4), 4);
  ASSERT_EQ(write(pipe.write_end, "{}", 2), 2);
  EXPECT_EQ(ReadFrame(pipe.read_end), "{}");
}

// --- SendCommandToDaemon against a fake fileindexd ---

class DaemonChannel : public ::testing::Test {
 protected:
  Sandbox root_;
  SleepRecorder sleeps_;
};

TEST_F(DaemonChannel, SendsOneFrameAndWaitsForTheReplyNullDataIncluded) {
  FakeDaemon daemon(DaemonSocket());
  Json::Value data;
  data["resume_time"] = 0;
  SendCommandToDaemon("pause", data);
  SendCommandToDaemon("resume", Json::Value());
  SendCommandToDaemon("worker_create", Json::Value(Json::objectValue));
  const auto frames = daemon.Frames();
  ASSERT_EQ(frames.size(), 3u);
  const std::vector<std::string> texts = {"{\"data\":{\"resume_time\":0},\"type\":\"pause\"}",
                                          "{\"data\":null,\"type\":\"resume\"}",
                                          "{\"data\":{},\"type\":\"worker_create\"}"};
  for (size_t i = 0; i < texts.size(); ++i) {
    EXPECT_EQ(frames[i].length, texts[i].size() + 1);
    EXPECT_EQ(frames[i].body, texts[i] + std::string(1, '\0'));
  }
  EXPECT_TRUE(sleeps_.Sleeps().empty());
}

TEST_F(DaemonChannel, LongRequestGoesOutInChunksAndSendTimeoutIsTheOnlyOption) {
  FakeDaemon daemon(DaemonSocket(), std::string(5000, 'r'));
  // A body (text + NUL) of exactly 3000 bytes.
  Json::Value probe(Json::objectValue);
  probe["data"] = "";
  probe["type"] = "x";
  const std::string padding(3000 - 1 - JsonToString(probe).size(), 'p');
  SyscallScript script;
  {
    ScopedSyscallScript scope(&script);
    SendCommandToDaemon("x", padding);
  }
  EXPECT_EQ(script.write_sizes, (std::vector<unsigned long>{4, 1024, 1024, 952}));
  ASSERT_EQ(script.options.size(), 1u);
  EXPECT_EQ(script.options[0].level, SOL_SOCKET);
  EXPECT_EQ(script.options[0].name, SO_SNDTIMEO);
  EXPECT_EQ(script.options[0].seconds, 1);
  EXPECT_EQ(script.options[0].microseconds, 0);
  // The 5000-byte reply was read whole, in chunks.
  unsigned long read_total = 0;
  for (unsigned long size : script.read_sizes) EXPECT_LE(size, 1024u);
  for (unsigned long size : script.read_sizes) read_total += size;
  EXPECT_GE(read_total, 5004u);
  ASSERT_EQ(daemon.Frames().size(), 1u);
  EXPECT_EQ(daemon.Frames()[0].length, 3000u);
}

TEST_F(DaemonChannel, EmptyReplyIsAccepted) {
  FakeDaemon daemon(DaemonSocket(), "");
  SyscallScript script;
  {
    ScopedSyscallScript scope(&script);
    SendCommandToDaemon("notify_setting_changed", "share1");
  }
  // Only the 4-byte length is read.
  EXPECT_EQ(script.read_sizes, (std::vector<unsigned long>{4}));
  EXPECT_EQ(daemon.Frames().size(), 1u);
}

// Only a missing socket is retried (five attempts, a second apart); a
// refused connection or a path too long for a socket fails at once. No
// descriptor is left open; a daemon that is not there is not logged.
TEST_F(DaemonChannel, UnreachableDaemonFails) {
  const int before = OpenDescriptors();
  int bound = -1;
  const std::string long_root = root_.path() + "/" + std::string(120, 'd');
  const struct {
    const char* what;
    std::function<void()> prepare;
    size_t sleeps;
    const char* reason;
    bool silent;
  } cases[] = {
      {"no socket", [] {}, 4, "write failed, reason=", true},
      // Bound but never listening: connect is refused.
      {"nobody listens", [&] { bound = BindDaemonSocket(root_, false); }, 0, "write failed, reason=", true},
      {"overlong path", [&] { setenv("CORVLUMEX_ROOT", long_root.c_str(), 1); }, 0,
       "socket path too long, path=", false},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.what);
    SleepRecorder sleeps;
    LogCapture log;
    c.prepare();
    const std::string reason = ReasonOf([] { SendCommandToDaemon("pause", Json::Value()); });
    setenv("CORVLUMEX_ROOT", root_.path().c_str(), 1);
    EXPECT_EQ(reason.rfind(c.reason, 0), 0u) << reason;
    EXPECT_EQ(sleeps.Sleeps(), std::vector<std::chrono::microseconds>(c.sleeps, std::chrono::seconds(1)));
    EXPECT_EQ(log.Lines().empty(), c.silent);
  }
  close(bound);
  EXPECT_EQ(OpenDescriptors(), before);
}

TEST_F(DaemonChannel, DaemonThatStartsDuringTheRetriesGetsTheCommand) {
  std::unique_ptr<FakeDaemon> daemon;
  int sleeps = 0;
  SetSleepHook([&](std::chrono::microseconds) {
    if (++sleeps == 2) daemon = std::make_unique<FakeDaemon>(DaemonSocket());
  });
  SendCommandToDaemon("worker_delete", "music");
  SetSleepHook(nullptr);
  EXPECT_EQ(sleeps, 2);
  ASSERT_TRUE(daemon);
  EXPECT_EQ(daemon->Frames().size(), 1u);
}

TEST_F(DaemonChannel, SocketFailureIsLoggedAndThrown) {
  LogCapture log;
  SyscallScript script;
  script.fail_socket = true;
  ScopedSyscallScript scope(&script);
  EXPECT_EQ(ReasonOf([] { SendCommandToDaemon("pause", Json::Value()); }), Failed("socket", EMFILE));
  ASSERT_EQ(log.Lines().size(), 1u);
  EXPECT_NE(log.Lines()[0].find("(SendCommandToDaemon) Failed [0 > (fd_socket = socket(PF_UNIX, SOCK_STREAM, 0))], "
                                "reason: socket failed, reason="),
            std::string::npos)
      << log.Lines()[0];
}

TEST_F(DaemonChannel, EveryFailureAfterTheSocketClosesIt) {
  FakeDaemon daemon(DaemonSocket());
  const int before = OpenDescriptors();
  struct Case {
    bool fail_setsockopt;
    std::deque<int> writes, reads;
    std::string reason;
  };
  const std::vector<Case> cases = {{true, {}, {}, Failed("setsockopt", ENOPROTOOPT)},
                                   {false, {-EIO}, {}, Failed("write", EIO)},
                                   {false, {}, {-ECONNRESET}, Failed("read", ECONNRESET)}};
  for (size_t i = 0; i < cases.size(); ++i) {
    SCOPED_TRACE(cases[i].reason);
    LogCapture log;
    SyscallScript script;
    script.fail_setsockopt = cases[i].fail_setsockopt;
    script.writes = cases[i].writes;
    script.reads = cases[i].reads;
    {
      ScopedSyscallScript scope(&script);
      EXPECT_EQ(ReasonOf([] { SendCommandToDaemon("pause", Json::Value()); }), cases[i].reason);
    }
    if (cases[i].fail_setsockopt) {
      EXPECT_EQ(log.Matching("(SendCommandToDaemon) Failed [0 > setsockopt(fd_socket, SOL_SOCKET, SO_SNDTIMEO, "
                             "(char *)&timeout, sizeof(timeout))]")
                    .size(),
                1u);
    }
    ASSERT_TRUE(daemon.WaitForClosedConnections(i + 1));
    EXPECT_EQ(OpenDescriptors(), before);
  }
}

TEST_F(DaemonChannel, PeerThatHangsUpGivesAnErrorNotASignal) {
  // Accepts and closes at once, without reading: the write meets a closed
  // peer. The caller did not ignore SIGPIPE and must survive.
  const int listener = BindDaemonSocket(root_, true);
  std::thread closer([listener] { close(accept(listener, nullptr, nullptr)); });
  ASSERT_EQ(signal(SIGPIPE, SIG_DFL), SIG_DFL);
  const std::string reason = ReasonOf([] { SendCommandToDaemon("x", std::string(200000, 'z')); });
  closer.join();
  close(listener);
  EXPECT_EQ(reason.rfind("write failed, reason=", 0), 0u) << reason;
  sigset_t pending;
  sigpending(&pending);
  EXPECT_EQ(sigismember(&pending, SIGPIPE), 0);
}

}  // namespace
}  // namespace fileindex
}  // namespace corvlumex
