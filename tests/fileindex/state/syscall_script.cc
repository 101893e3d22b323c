// Deliberately free of <unistd.h> and <sys/socket.h>: these definitions
// replace the C library's for this test binary.
#include "tests/fileindex/state/syscall_script.h"

#include <dlfcn.h>
#include <sys/time.h>
#include <sys/types.h>

#include <cerrno>

namespace corvlumex {
namespace testing_support {
namespace {
thread_local SyscallScript* active = nullptr;

template <typename Fn>
Fn Real(const char* name) {
  return reinterpret_cast<Fn>(dlsym(RTLD_NEXT, name));
}

// Returns true with *result set when the script decides the call.
bool Scripted(std::deque<int>& queue, ssize_t* result) {
  if (queue.empty()) return false;
  const int next = queue.front();
  queue.pop_front();
  if (next == SyscallScript::kPass) return false;
  if (next < 0) {
    errno = -next;
    *result = -1;
  } else {
    *result = 0;
  }
  return true;
}
}  // namespace

ScopedSyscallScript::ScopedSyscallScript(SyscallScript* script) { active = script; }
ScopedSyscallScript::~ScopedSyscallScript() { active = nullptr; }

}  // namespace testing_support
}  // namespace corvlumex

using corvlumex::testing_support::active;
using corvlumex::testing_support::Real;
using corvlumex::testing_support::Scripted;

extern "C" {

ssize_t read(int fd, void* buffer, size_t size) {
  static const auto real = Real<ssize_t (*)(int, void*, size_t)>("read");
  if (active != nullptr) {
    active->read_sizes.push_back(size);
    ssize_t result = 0;
    if (Scripted(active->reads, &result)) return result;
  }
  return real(fd, buffer, size);
}

ssize_t write(int fd, const void* buffer, size_t size) {
  static const auto real = Real<ssize_t (*)(int, const void*, size_t)>("write");
  if (active != nullptr) {
    active->write_sizes.push_back(size);
    ssize_t result = 0;
    if (Scripted(active->writes, &result)) return result;
  }
  return real(fd, buffer, size);
}

int socket(int domain, int type, int protocol) noexcept {
  static const auto real = Real<int (*)(int, int, int)>("socket");
  if (active != nullptr && active->fail_socket) {
    errno = EMFILE;
    return -1;
  }
  return real(domain, type, protocol);
}

int setsockopt(int fd, int level, int name, const void* value, unsigned int length) noexcept {
  static const auto real = Real<int (*)(int, int, int, const void*, unsigned int)>("setsockopt");
  if (active != nullptr) {
    const struct timeval* timeout = static_cast<const struct timeval*>(value);
    active->options.push_back({level, name, length == sizeof(struct timeval) ? timeout->tv_sec : -1,
                               length == sizeof(struct timeval) ? timeout->tv_usec : -1});
    if (active->fail_setsockopt) {
      errno = ENOPROTOOPT;
      return -1;
    }
  }
  return real(fd, level, name, value, length);
}

int flock(int fd, int operation) noexcept {
  static const auto real = Real<int (*)(int, int)>("flock");
  if (active != nullptr && active->before_flock) active->before_flock();
  return real(fd, operation);
}

}  // extern "C"
