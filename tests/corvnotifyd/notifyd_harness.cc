#include "tests/corvnotifyd/notifyd_harness.h"

#include <fcntl.h>
#include <signal.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <thread>

#include <gtest/gtest.h>

#include "common/error.h"
#include "common/json_util.h"
#include "fileindex/event.h"

namespace corvlumex {
namespace testing_support {

std::string ReadWholeFile(const std::string& path) {
  std::ifstream in(path, std::ios::binary);
  std::stringstream text;
  text << in.rdbuf();
  return text.str();
}

std::vector<QueueLine> ReadQueue(const std::string& path) { return ParseQueueText(ReadWholeFile(path)); }

std::vector<QueueLine> ParseQueueText(const std::string& text) {
  std::vector<QueueLine> lines;
  // A line still being written (no "\n" yet) is read next time.
  for (size_t start = 0, end; (end = text.find('\n', start)) != std::string::npos; start = end + 1) {
    const std::string raw = text.substr(start, end - start);
    // Read as the indexer reads it.
    try {
      const fileindex::Event event(raw);
      QueueLine line{event.event, event.is_dir, event.path, event.path_old};
      lines.push_back(line);
    } catch (const Error& e) {
      ADD_FAILURE() << "not a queue line: " << raw << " (" << e.what() << ")";
    }
  }
  return lines;
}

void PrintTo(const QueueLine& line, std::ostream* out) {
  *out << "{" << line.event << (line.is_dir ? " dir " : " ") << line.path;
  if (!line.path_old.empty()) *out << " <- " << line.path_old;
  *out << "}";
}

bool WaitUntil(const std::function<bool()>& condition, std::chrono::milliseconds timeout) {
  const auto deadline = std::chrono::steady_clock::now() + timeout;
  while (!condition()) {
    if (std::chrono::steady_clock::now() > deadline) return false;
    // A real process is being waited for: a short real pause.
    std::this_thread::sleep_for(std::chrono::milliseconds(2));
  }
  return true;
}

NotifydProcess::NotifydProcess(const std::string& log_path, const std::vector<std::string>& args,
                               const std::map<std::string, std::string>& env)
    : log_path_(log_path) {
  const char* build = getenv("FILEINDEX_BUILD_DIR");
  const std::string program = std::string(build ? build : ".") + "/programs/corvnotifyd/corvnotifyd";
  std::vector<std::string> words{program};
  words.insert(words.end(), args.begin(), args.end());
  pid_ = fork();
  if (pid_ == 0) {
    for (const auto& [key, value] : env) setenv(key.c_str(), value.c_str(), 1);
    const int log = open(log_path.c_str(), O_WRONLY | O_CREAT | O_APPEND, 0644);
    dup2(log, 2);
    std::vector<char*> argv;
    for (std::string& word : words) argv.push_back(&word[0]);
    argv.push_back(nullptr);
    execv(program.c_str(), argv.data());
    _exit(127);
  }
}

NotifydProcess::~NotifydProcess() {
  if (pid_ > 0) Stop(SIGKILL);
}

int NotifydProcess::Stop(int signal) {
  if (pid_ <= 0) return -1;
  kill(pid_, signal);
  return Wait();
}

int NotifydProcess::Wait() {
  if (pid_ <= 0) return -1;
  int status = 0;
  waitpid(pid_, &status, 0);
  pid_ = -1;
  return WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
}

bool NotifydProcess::WaitForLog(const std::string& needle) const {
  return WaitUntil([&] { return Log().find(needle) != std::string::npos; });
}

NotifydSandbox::NotifydSandbox() {
  volume_ = "/dev/shm/corvnotifyd-test-XXXXXX";
  if (access("/dev/shm", W_OK) != 0 || mkdtemp(&volume_[0]) == nullptr) volume_ = root_.MakeDir("vol");
  share_ = volume_ + "/share";
  docs_ = share_ + "/docs";
  std::filesystem::create_directories(docs_);
  queue_ = share_ + "/@eaDir/fileindex.queue";
  root_.WriteFile("etc/corvlumex/shares.json", "[{\"name\": \"share\", \"path\": \"" + share_ + "\"}]\n");
  const std::string tool = root_.WriteFile("usr/corv/bin/corvvxmnotify",
                                           "#!/bin/sh\necho \"$@\" >> \"" + root_.path() + "/notices.log\"\n");
  chmod(tool.c_str(), 0755);
  WriteConfig("fileindex@share.json", queue_, {docs_});
}

NotifydSandbox::~NotifydSandbox() {
  std::error_code ignored;
  std::filesystem::remove_all(volume_, ignored);
}

void NotifydSandbox::WriteConfig(const std::string& name, const std::string& queue,
                                 const std::vector<std::string>& folders) {
  Json::Value config;
  config["queue"] = queue;
  config["application"] = "fileindex";
  config["type"] = 1;
  for (const std::string& folder : folders) {
    Json::Value entry;
    entry["path"] = folder;
    entry["mask"] = 65478;
    entry["ignore"].append("@eaDir");
    config["config"].append(entry);
  }
  root_.MakeDir("etc/corvlumex/monitor.d");
  ASSERT_TRUE(JsonToFile(config, config_dir() + "/" + name));
}

void NotifydSandbox::RemoveConfig(const std::string& name) { unlink((config_dir() + "/" + name).c_str()); }

std::vector<std::string> NotifydSandbox::Notices() const {
  std::vector<std::string> notices;
  std::stringstream text(ReadWholeFile(root_.path() + "/notices.log"));
  std::string line;
  while (std::getline(text, line)) notices.push_back(line);
  return notices;
}

std::unique_ptr<NotifydProcess> NotifydSandbox::Start(const std::map<std::string, std::string>& env) {
  auto process = std::make_unique<NotifydProcess>(log_path(), std::vector<std::string>{"--foreground"}, env);
  EXPECT_TRUE(process->WaitForLog("watching as configured")) << process->Log();
  return process;
}

bool NotifydSandbox::Sync(const std::string& path, const std::string& queue) {
  // A folder: its create is the only line it makes, so nothing of it trails behind.
  mkdir(path.c_str(), 0755);
  const std::string target = queue.empty() ? queue_ : queue;
  return WaitUntil([&] {
    const auto lines = ReadQueue(target);
    return std::any_of(lines.begin(), lines.end(),
                       [&](const QueueLine& line) { return line.event == 0x40 && line.path == path; });
  });
}

}  // namespace testing_support
}  // namespace corvlumex
