#include "tests/support/child_process.h"

#include <fcntl.h>
#include <signal.h>
#include <stdlib.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <fstream>
#include <sstream>
#include <thread>

namespace corvlumex {
namespace testing_support {
namespace {

int StatusOf(int status) { return WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status); }

}  // namespace

std::string ProgramPath(const std::string& name) {
  const char* build = getenv("FILEINDEX_BUILD_DIR");
  return std::string(build != nullptr && *build != '\0' ? build : ".") + "/programs/" + name + "/" + name;
}

std::string ReadFileText(const std::string& path) {
  std::ifstream in(path, std::ios::binary);
  std::stringstream text;
  text << in.rdbuf();
  return text.str();
}

bool PollUntil(const std::function<bool()>& condition, std::chrono::milliseconds timeout,
               std::chrono::milliseconds interval) {
  const auto deadline = std::chrono::steady_clock::now() + timeout;
  for (;;) {
    if (condition()) return true;
    if (std::chrono::steady_clock::now() >= deadline) return false;
    std::this_thread::sleep_for(interval);
  }
}

ChildProcess::ChildProcess(const std::string& program, const std::vector<std::string>& args,
                           const std::string& log_path, const std::map<std::string, std::string>& env, int stdin_fd)
    : log_path_(log_path) {
  std::vector<std::string> words{program};
  words.insert(words.end(), args.begin(), args.end());
  pid_ = fork();
  if (pid_ != 0) return;
  // A test process that dies leaves no program behind.
  prctl(PR_SET_PDEATHSIG, SIGKILL);
  for (const auto& [key, value] : env) setenv(key.c_str(), value.c_str(), 1);
  const int log = open(log_path.c_str(), O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0644);
  dup2(log, STDOUT_FILENO);
  dup2(log, STDERR_FILENO);
  if (stdin_fd >= 0) dup2(stdin_fd, STDIN_FILENO);
  std::vector<char*> argv;
  for (std::string& word : words) argv.push_back(&word[0]);
  argv.push_back(nullptr);
  execv(program.c_str(), argv.data());
  _exit(127);
}

ChildProcess::~ChildProcess() { Stop(SIGKILL); }

void ChildProcess::Signal(int signal) {
  if (pid_ > 0) kill(pid_, signal);
}

int ChildProcess::Stop(int signal) {
  if (pid_ <= 0) return -1;
  kill(pid_, signal);
  return Wait();
}

int ChildProcess::Wait() {
  if (pid_ <= 0) return -1;
  int status = 0;
  waitpid(pid_, &status, 0);
  pid_ = -1;
  return exit_status_ = StatusOf(status);
}

bool ChildProcess::Running() {
  if (pid_ <= 0) return false;
  int status = 0;
  if (waitpid(pid_, &status, WNOHANG) != pid_) return true;
  pid_ = -1;
  exit_status_ = StatusOf(status);
  return false;
}

}  // namespace testing_support
}  // namespace corvlumex
