// Scripted system calls for the channel tests. The test binary defines
// read, write, socket, setsockopt and flock itself, so the library's calls reach
// these first; only the thread that installed a script is affected.
#pragma once

#include <deque>
#include <functional>
#include <vector>

namespace corvlumex {
namespace testing_support {

struct SyscallScript {
  // Next results of read/write on this thread: kPass runs the real call,
  // 0 returns 0, a negative value fails with errno = -value.
  static constexpr int kPass = 1;
  std::deque<int> reads;
  std::deque<int> writes;
  bool fail_socket = false;      // socket() fails with EMFILE
  bool fail_setsockopt = false;  // setsockopt() fails with ENOPROTOOPT
  std::function<void()> before_flock;  // runs just before each flock()

  // What the library asked for, in order.
  std::vector<unsigned long> read_sizes;
  std::vector<unsigned long> write_sizes;
  struct Option {
    int level, name;
    long seconds, microseconds;
  };
  std::vector<Option> options;
};

// Installs `script` for the calling thread while alive.
class ScopedSyscallScript {
 public:
  explicit ScopedSyscallScript(SyscallScript* script);
  ~ScopedSyscallScript();
};

}  // namespace testing_support
}  // namespace corvlumex
