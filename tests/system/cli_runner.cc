#include "tests/system/cli_runner.h"

#include <fcntl.h>
#include <grp.h>
#include <sys/wait.h>
#include <unistd.h>

#include "tests/support/child_process.h"

namespace corvlumex {
namespace testing_support {
namespace {

std::string ReadAndRemove(const std::string& path) {
  const std::string text = ReadFileText(path);
  unlink(path.c_str());
  return text;
}

}  // namespace

CliResult RunCli(const std::vector<std::string>& args, unsigned as_user) {
  const std::string program = ProgramPath("fileindex");
  char out_name[] = "/tmp/fileindex-cli-out-XXXXXX";
  char err_name[] = "/tmp/fileindex-cli-err-XXXXXX";
  const int out_fd = mkstemp(out_name);
  const int err_fd = mkstemp(err_name);
  CliResult result;
  const pid_t pid = fork();
  if (pid == 0) {
    dup2(out_fd, STDOUT_FILENO);
    dup2(err_fd, STDERR_FILENO);
    if (as_user != 0 && (setgroups(0, nullptr) != 0 || setgid(65534) != 0 || setuid(as_user) != 0)) _exit(126);
    std::vector<std::string> words{program};
    words.insert(words.end(), args.begin(), args.end());
    std::vector<char*> argv;
    for (std::string& word : words) argv.push_back(&word[0]);
    argv.push_back(nullptr);
    execv(program.c_str(), argv.data());
    _exit(127);
  }
  close(out_fd);
  close(err_fd);
  int status = 0;
  waitpid(pid, &status, 0);
  result.status = WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
  result.out = ReadAndRemove(out_name);
  result.err = ReadAndRemove(err_name);
  return result;
}

}  // namespace testing_support
}  // namespace corvlumex
