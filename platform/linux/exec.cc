// Running programs without a shell: fork, then execv with an argument
// vector, so no argument is ever interpreted.
#include <fcntl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "platform/linux/linux_platform.h"

namespace corvlumex {
namespace platform {
namespace {

// Runs in the forked child: only async-signal-safe calls until execv.
[[noreturn]] void RunChild(const std::vector<char*>& argv, int flags, int report_fd) {
  const int null_fd = open("/dev/null", O_RDWR);
  if (null_fd >= 0) {
    if (flags & kExecNullStdin) dup2(null_fd, STDIN_FILENO);
    if (flags & kExecNullStdout) dup2(null_fd, STDOUT_FILENO);
    if (flags & kExecNullStderr) dup2(null_fd, STDERR_FILENO);
    if (null_fd > STDERR_FILENO) close(null_fd);
  }
  if (flags & kExecCloseFds) {
    // Keep only the report pipe, which closes itself on a successful exec.
    for (int fd = STDERR_FILENO + 1; fd < 1024; ++fd) {
      if (fd != report_fd) close(fd);
    }
  }
  if (flags & kExecNewSession) setsid();
  if ((flags & kExecSearchPath) && strchr(argv[0], '/') == nullptr) execvp(argv[0], argv.data());
  else execv(argv[0], argv.data());
  const int error = errno;
  ssize_t ignored = write(report_fd, &error, sizeof(error));
  (void)ignored;
  _exit(127);
}

int WaitFor(pid_t pid) {
  int status = 0;
  while (waitpid(pid, &status, 0) < 0) {
    if (errno != EINTR) return -1;
  }
  return status;
}

}  // namespace

int LinuxPlatform::Exec(const std::string& program, const std::vector<std::string>& args, int flags) {
  if (program.empty()) {
    CORV_PLATFORM_ERROR(kPlatformErrBadArgument, "no program to run");
    return -1;
  }
  std::vector<std::string> words{program};
  words.insert(words.end(), args.begin(), args.end());
  std::vector<char*> argv;
  for (std::string& word : words) argv.push_back(&word[0]);
  argv.push_back(nullptr);

  int report[2];
  if (pipe2(report, O_CLOEXEC) != 0) {
    CORV_PLATFORM_ERROR(kPlatformErrExec, std::string("pipe failed: ") + strerror(errno));
    return -1;
  }
  const pid_t pid = fork();
  if (pid < 0) {
    close(report[0]);
    close(report[1]);
    CORV_PLATFORM_ERROR(kPlatformErrExec, std::string("fork failed: ") + strerror(errno));
    return -1;
  }
  if (pid == 0) {
    close(report[0]);
    if (flags & kExecWait) RunChild(argv, flags, report[1]);
    // Not waited for: a grandchild runs the program, so that nobody has to
    // reap it (init does), and this child ends at once.
    const pid_t grandchild = fork();
    if (grandchild == 0) RunChild(argv, flags, report[1]);
    _exit(grandchild < 0 ? 126 : 0);
  }
  close(report[1]);
  int exec_errno = 0;
  ssize_t got;
  do {
    got = read(report[0], &exec_errno, sizeof(exec_errno));
  } while (got < 0 && errno == EINTR);
  close(report[0]);
  const int status = WaitFor(pid);
  if (got == static_cast<ssize_t>(sizeof(exec_errno))) {
    CORV_PLATFORM_ERROR(kPlatformErrExec, "cannot run " + program + ": " + strerror(exec_errno));
    return -1;
  }
  errno = 0;
  if (status < 0 || !WIFEXITED(status)) {
    CORV_PLATFORM_ERROR(kPlatformErrExec, program + (status >= 0 && WIFSIGNALED(status)
                                                         ? " ended by signal " + std::to_string(WTERMSIG(status))
                                                         : std::string(" could not be waited for")));
    return -1;
  }
  if (!(flags & kExecWait)) {
    if (WEXITSTATUS(status) != 0) {
      CORV_PLATFORM_ERROR(kPlatformErrExec, "fork failed starting " + program);
      return -1;
    }
    return 0;
  }
  if (WEXITSTATUS(status) != 0) {
    CORV_PLATFORM_ERROR(kPlatformErrExec, program + " exited with status " + std::to_string(WEXITSTATUS(status)));
  }
  return WEXITSTATUS(status);
}

}  // namespace platform
}  // namespace corvlumex
