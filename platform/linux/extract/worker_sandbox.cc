#include "platform/linux/extract/worker_sandbox.h"

#include <fcntl.h>
#include <grp.h>
#include <sched.h>
#include <seccomp.h>
#include <signal.h>
#include <sys/prctl.h>
#include <sys/resource.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <stdexcept>

namespace corvlumex {
namespace platform {
namespace extract {
namespace {

#if defined(__SANITIZE_ADDRESS__)
constexpr bool kSanitized = true;  // the sanitizer reserves terabytes of address space and forks its leak checker
#elif defined(__has_feature)
#if __has_feature(address_sanitizer)
constexpr bool kSanitized = true;
#else
constexpr bool kSanitized = false;
#endif
#else
constexpr bool kSanitized = false;
#endif

constexpr uid_t kNobody = 65534;

[[noreturn]] void Fail(const std::string& step) {
  throw std::runtime_error("cannot confine the worker: " + step + ": " + strerror(errno));
}

void SetLimit(int resource, rlim_t soft, rlim_t hard, const char* name) {
  const struct rlimit limit = {soft, hard};
  if (setrlimit(resource, &limit) != 0) Fail(name);
}

// No network: a private, empty network namespace. Root may create one
// directly; others only inside a user namespace of their own.
bool LeaveNetwork() {
  if (unshare(CLONE_NEWNET) == 0) return true;
  if (unshare(CLONE_NEWUSER | CLONE_NEWNET) == 0) return true;
  errno = 0;
  return false;
}

void DropRoot() {
  if (geteuid() != 0) return;
  if (setgroups(0, nullptr) != 0) Fail("setgroups");
  if (setresgid(kNobody, kNobody, kNobody) != 0) Fail("setresgid");
  if (setresuid(kNobody, kNobody, kNobody) != 0) Fail("setresuid");
  if (geteuid() == 0 || getuid() == 0) Fail("still root");
}

void InstallSyscallFilter() {
  scmp_filter_ctx filter = seccomp_init(SCMP_ACT_ALLOW);
  if (filter == nullptr) Fail("seccomp_init");
  const uint32_t deny = SCMP_ACT_ERRNO(EPERM);
  int status = 0;
  // No sockets of any kind: the worker talks only on the one it was given.
  for (const int call : {SCMP_SYS(socket), SCMP_SYS(socketpair), SCMP_SYS(connect), SCMP_SYS(bind),
                         SCMP_SYS(listen), SCMP_SYS(accept), SCMP_SYS(accept4)}) {
    status |= seccomp_rule_add(filter, deny, call, 0);
  }
  // No other program, no way out of or around the confinement.
  for (const int call : {SCMP_SYS(execve), SCMP_SYS(execveat), SCMP_SYS(mount), SCMP_SYS(umount2),
                         SCMP_SYS(pivot_root), SCMP_SYS(chroot), SCMP_SYS(unshare), SCMP_SYS(setns),
                         SCMP_SYS(bpf), SCMP_SYS(perf_event_open), SCMP_SYS(keyctl), SCMP_SYS(add_key),
                         SCMP_SYS(request_key), SCMP_SYS(init_module), SCMP_SYS(finit_module),
                         SCMP_SYS(delete_module), SCMP_SYS(kexec_load), SCMP_SYS(reboot), SCMP_SYS(swapon),
                         SCMP_SYS(swapoff), SCMP_SYS(open_by_handle_at), SCMP_SYS(userfaultfd),
                         SCMP_SYS(io_uring_setup), SCMP_SYS(process_vm_readv), SCMP_SYS(process_vm_writev),
                         SCMP_SYS(setuid), SCMP_SYS(setgid), SCMP_SYS(setresuid), SCMP_SYS(setresgid),
                         SCMP_SYS(setreuid), SCMP_SYS(setregid), SCMP_SYS(setgroups)}) {
    status |= seccomp_rule_add(filter, deny, call, 0);
  }
  if (!kSanitized) {
    // Threads yes (a decoder may want them), new processes no. glibc falls
    // back from clone3, whose flags a filter cannot see, to clone.
    status |= seccomp_rule_add(filter, SCMP_ACT_ERRNO(ENOSYS), SCMP_SYS(clone3), 0);
    status |= seccomp_rule_add(filter, deny, SCMP_SYS(clone), 1, SCMP_A0(SCMP_CMP_MASKED_EQ, CLONE_THREAD, 0));
    status |= seccomp_rule_add(filter, deny, SCMP_SYS(fork), 0);
    status |= seccomp_rule_add(filter, deny, SCMP_SYS(vfork), 0);
    status |= seccomp_rule_add(filter, deny, SCMP_SYS(ptrace), 0);
  }
  if (status != 0) {
    seccomp_release(filter);
    errno = EINVAL;
    Fail("seccomp_rule_add");
  }
  const int loaded = seccomp_load(filter);
  seccomp_release(filter);
  if (loaded != 0) {
    errno = -loaded;
    Fail("seccomp_load");
  }
}

}  // namespace

std::vector<std::string> ConfineWorker(const WorkerLimits& limits) {
  std::vector<std::string> missing;
  // Only the standard descriptors (0 is our socket) stay open.
  close_range(3, ~0U, 0);

  if (!LeaveNetwork()) missing.push_back("private network namespace (the syscall filter still forbids sockets)");

  if (kSanitized) {
    missing.push_back("address-space limit (sanitizer build)");
  } else {
    const rlim_t bytes = static_cast<rlim_t>(limits.memory_mb) << 20;
    SetLimit(RLIMIT_AS, bytes, bytes, "RLIMIT_AS");
  }
  SetLimit(RLIMIT_CORE, 0, 0, "RLIMIT_CORE");
  // The worker writes no file; a library that tries gets an error, not a signal.
  signal(SIGXFSZ, SIG_IGN);
  SetLimit(RLIMIT_FSIZE, 0, 0, "RLIMIT_FSIZE");
  SetLimit(RLIMIT_NOFILE, 64, 64, "RLIMIT_NOFILE");
  RenewCpuAllowance(limits);

  DropRoot();
  // No parent-death signal: it follows the thread that started the worker,
  // not the indexer, and idle workers outlive their starting threads. An
  // idle worker sees end of stream when the indexer goes; a busy one meets
  // its CPU limit.
  if (prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0) != 0) Fail("PR_SET_NO_NEW_PRIVS");
  if (prctl(PR_SET_DUMPABLE, 0) != 0) Fail("PR_SET_DUMPABLE");
  InstallSyscallFilter();
  return missing;
}

void RenewCpuAllowance(const WorkerLimits& limits) {
  struct rusage usage;
  if (getrusage(RUSAGE_SELF, &usage) != 0) Fail("getrusage");
  const rlim_t used = static_cast<rlim_t>(usage.ru_utime.tv_sec + usage.ru_stime.tv_sec + 1);
  // The soft limit sends SIGXCPU (which ends the worker); the hard one is
  // left as it is so the allowance can be renewed for the next file.
  struct rlimit current;
  if (getrlimit(RLIMIT_CPU, &current) != 0) Fail("getrlimit");
  rlim_t soft = used + limits.cpu_seconds;
  if (current.rlim_max != RLIM_INFINITY && soft > current.rlim_max) soft = current.rlim_max;
  SetLimit(RLIMIT_CPU, soft, current.rlim_max, "RLIMIT_CPU");
}

}  // namespace extract
}  // namespace platform
}  // namespace corvlumex
