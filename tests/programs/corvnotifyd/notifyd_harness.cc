#include "tests/programs/corvnotifyd/notifyd_harness.h"

#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <filesystem>
#include <sstream>

#include <gtest/gtest.h>

#include "common/error.h"
#include "common/json_util.h"
#include "fileindex/queue/event.h"

namespace corvlumex {
namespace testing_support {

std::vector<QueueLine> ReadQueue(const std::string& path) { return ParseQueueText(ReadFileText(path)); }

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

NotifydSandbox::NotifydSandbox() {
  volume_ = root_.TmpfsVolume();
  share_ = volume_ + "/share";
  docs_ = share_ + "/docs";
  std::filesystem::create_directories(docs_);
  queue_ = share_ + "/@eaDir/fileindex.queue";
  root_.registry().Add("share", share_);
  root_.InstallNoticeTool(root_.path() + "/notices.log");
  WriteConfig("fileindex@share.json", queue_, {docs_});
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

std::vector<std::string> TextLines(const std::string& path) {
  std::vector<std::string> lines;
  std::istringstream in(ReadFileText(path));
  for (std::string line; std::getline(in, line);) lines.push_back(line);
  return lines;
}

size_t CountOccurrences(const std::string& text, const std::string& needle) {
  size_t count = 0;
  for (size_t at = text.find(needle); at != std::string::npos; at = text.find(needle, at + 1)) {
    ++count;
  }
  return count;
}

std::unique_ptr<ChildProcess> NotifydSandbox::Run(const std::vector<std::string>& args,
                                                 const std::map<std::string, std::string>& env) const {
  return std::make_unique<ChildProcess>(ProgramPath("corvnotifyd"), args, log_path(), env);
}

std::unique_ptr<ChildProcess> NotifydSandbox::Start(const std::map<std::string, std::string>& env) const {
  // The log is appended to: an earlier run's line does not count.
  const auto runs = [this] {
    return CountOccurrences(ReadFileText(log_path()), "watching as configured");
  };
  const size_t before = runs();
  auto process = Run({"--foreground"}, env);
  EXPECT_TRUE(WaitUntil([&] { return runs() > before; })) << process->Log();
  return process;
}

bool NotifydSandbox::WaitForLog(const std::string& needle) const {
  return WaitUntil([&] { return ReadFileText(log_path()).find(needle) != std::string::npos; });
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
