// Starting the system's own programs in integration tests, and waiting for
// what they do: the one fork-and-exec every daemon harness shares.
#pragma once

#include <sys/types.h>

#include <chrono>
#include <functional>
#include <map>
#include <string>
#include <vector>

namespace corvlumex {
namespace testing_support {

// <build>/programs/<name>/<name>, the build folder named by
// FILEINDEX_BUILD_DIR (ctest sets it), else the current folder.
std::string ProgramPath(const std::string& name);

// The whole content of a file, "" when it cannot be read.
std::string ReadFileText(const std::string& path);

// Polls `condition` every `interval` until it holds or `timeout` passes. Only
// for waiting on real processes: everything in-process uses SleepRecorder.
bool PollUntil(const std::function<bool()>& condition, std::chrono::milliseconds timeout,
               std::chrono::milliseconds interval = std::chrono::milliseconds(10));

// A child running `program` with `args`, its standard output and error
// appended to `log_path`, `env` added to its environment, and `stdin_fd`
// (when given) as its standard input. It is killed with the test process,
// and by the destructor when still running.
class ChildProcess {
 public:
  ChildProcess(const std::string& program, const std::vector<std::string>& args, const std::string& log_path,
               const std::map<std::string, std::string>& env = {}, int stdin_fd = -1);
  ~ChildProcess();
  ChildProcess(const ChildProcess&) = delete;
  ChildProcess& operator=(const ChildProcess&) = delete;

  // Sends `signal` and waits: the exit status, or 128 + the signal that
  // ended it (-1 when it was already waited for).
  int Stop(int signal);
  // Sends `signal` and returns at once (a program that reacts and goes on).
  void Signal(int signal);
  // Waits for the program to end on its own.
  int Wait();
  // False once the program has ended (and then it is waited for).
  bool Running();
  // How it ended, as Wait() returns it (-1 while it runs).
  int exit_status() const { return exit_status_; }
  std::string Log() const { return ReadFileText(log_path_); }

 private:
  pid_t pid_ = -1;
  int exit_status_ = -1;
  std::string log_path_;
};

}  // namespace testing_support
}  // namespace corvlumex
