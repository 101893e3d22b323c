#include "tests/system/cli_runner.h"

#include <fcntl.h>
#include <stdlib.h>
#include <sys/wait.h>
#include <unistd.h>

#include <fstream>
#include <sstream>

namespace corvlumex {
namespace testing_support {
namespace {

std::string ReadAndRemove(const std::string& path) {
  std::ifstream in(path);
  std::stringstream text;
  text << in.rdbuf();
  unlink(path.c_str());
  return text.str();
}

}  // namespace

CliResult RunCli(const std::vector<std::string>& args) {
  const char* build = getenv("FILEINDEX_BUILD_DIR");
  const std::string program = std::string(build != nullptr ? build : ".") + "/programs/fileindex/fileindex";
  char out_name[] = "/tmp/fileindex-cli-out-XXXXXX";
  char err_name[] = "/tmp/fileindex-cli-err-XXXXXX";
  const int out_fd = mkstemp(out_name);
  const int err_fd = mkstemp(err_name);
  CliResult result;
  const pid_t pid = fork();
  if (pid == 0) {
    dup2(out_fd, STDOUT_FILENO);
    dup2(err_fd, STDERR_FILENO);
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
