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
using testing_support::JsonOf;
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
  // Nothing to transfer makes no call. (The chunk sizes: DaemonChannel.SendsOneFrameAndReadsTheWholeReply.)
  SyscallScript script;
  ScopedSyscallScript scope(&script);
  BufferRead(-1, 0, nullptr);
  BufferWrite(-1, 0, nullptr);
  EXPECT_TRUE(script.read_sizes.empty() && script.write_sizes.empty());
}

// The length counts the NUL (DaemonChannel checks the frames sent); the
// reader drops the NUL, and accepts a body sent without one as it stands.
TEST(Frames, ReaderDropsTheNul) {
  Pipe pipe;
  WriteFrame(pipe.write_end, "");
  EXPECT_EQ(ReadFrame(pipe.read_end), "");
  WriteFrame(pipe.write_end, "{\"a\":1}");
  EXPECT_EQ(ReadFrame(pipe.read_end), "{\"a\":1}");
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

// Null data included, one frame out and the whole reply read back; a body
// over 1024 bytes goes out in chunks; the send timeout is the only option.
TEST_F(DaemonChannel, SendsOneFrameAndReadsTheWholeReply) {
  // A body (text + NUL) of exactly 3000 bytes.
  const std::string padding(3000 - 1 - std::string(R"({"data":"","type":"x"})").size(), 'p');
  const struct {
    std::string command;
    Json::Value data;
    std::string reply;
    std::string sent;
    std::vector<unsigned long> writes, reads;  // reads: empty when the reply is long
  } rows[] = {
      {"pause", JsonOf(R"({"resume_time":0})"), "{}", R"({"data":{"resume_time":0},"type":"pause"})", {4, 42}, {4, 2}},
      {"resume", Json::Value(), "{}", R"({"data":null,"type":"resume"})", {4, 30}, {4, 2}},
      {"worker_create", JsonOf("{}"), "", R"({"data":{},"type":"worker_create"})", {4, 35}, {4}},
      {"x", padding, std::string(5000, 'r'), R"({"data":")" + padding + R"(","type":"x"})", {4, 1024, 1024, 952}, {}},
  };
  for (const auto& row : rows) {
    SCOPED_TRACE(row.command);
    FakeDaemon daemon(DaemonSocket(), row.reply);
    SyscallScript script;
    {
      ScopedSyscallScript scope(&script);
      SendCommandToDaemon(row.command, row.data);
    }
    ASSERT_EQ(daemon.Frames().size(), 1u);
    EXPECT_EQ(daemon.Frames()[0].length, row.sent.size() + 1);
    EXPECT_EQ(daemon.Frames()[0].body, row.sent + std::string(1, '\0'));
    EXPECT_EQ(script.write_sizes, row.writes);
    ASSERT_EQ(script.options.size(), 1u);
    const SyscallScript::Option& timeout = script.options[0];
    EXPECT_EQ(std::vector<long>({timeout.level, timeout.name, timeout.seconds, timeout.microseconds}),
              std::vector<long>({SOL_SOCKET, SO_SNDTIMEO, 1, 0}));
    if (!row.reads.empty()) {
      EXPECT_EQ(script.read_sizes, row.reads);
    }
    // The 5000-byte reply was read whole, in chunks.
    unsigned long read_total = 0;
    for (unsigned long size : script.read_sizes) EXPECT_LE(size, 1024u);
    for (unsigned long size : script.read_sizes) read_total += size;
    EXPECT_GE(read_total, 4 + row.reply.size());
  }
  EXPECT_TRUE(sleeps_.Sleeps().empty());
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

// A failed socket() is logged; every failure after it closes the socket.
TEST_F(DaemonChannel, EveryFailureIsThrownAndClosesTheSocket) {
  FakeDaemon daemon(DaemonSocket());
  const int before = OpenDescriptors();
  const struct {
    bool fail_socket, fail_setsockopt;
    std::deque<int> writes, reads;
    std::string reason;
    std::string logged;  // the condition logged, or empty
  } cases[] = {
      {true, false, {}, {}, Failed("socket", EMFILE), "0 > (fd_socket = socket(PF_UNIX, SOCK_STREAM, 0))"},
      {false, true, {}, {}, Failed("setsockopt", ENOPROTOOPT),
       "0 > setsockopt(fd_socket, SOL_SOCKET, SO_SNDTIMEO, (char *)&timeout, sizeof(timeout))"},
      {false, false, {-EIO}, {}, Failed("write", EIO), ""},
      {false, false, {}, {-ECONNRESET}, Failed("read", ECONNRESET), ""},
  };
  size_t connections = 0;
  for (const auto& c : cases) {
    SCOPED_TRACE(c.reason);
    LogCapture log;
    SyscallScript script;
    script.fail_socket = c.fail_socket;
    script.fail_setsockopt = c.fail_setsockopt;
    script.writes = c.writes;
    script.reads = c.reads;
    {
      ScopedSyscallScript scope(&script);
      EXPECT_EQ(ReasonOf([] { SendCommandToDaemon("pause", Json::Value()); }), c.reason);
    }
    const std::string needle = "(SendCommandToDaemon) Failed [" + c.logged + "], reason: " + c.reason;
    EXPECT_EQ(log.Matching(needle).size(), c.logged.empty() ? 0u : 1u) << needle;
    EXPECT_EQ(log.Lines().size(), c.logged.empty() ? 0u : 1u);
    connections += c.fail_socket ? 0 : 1;
    ASSERT_TRUE(daemon.WaitForClosedConnections(connections));
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
