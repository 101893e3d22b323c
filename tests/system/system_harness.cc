#include "tests/system/system_harness.h"

#include <fcntl.h>
#include <grp.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>

#include "common/error.h"
#include "common/json_util.h"
#include "fileindex/elastic/elastic_control.h"
#include "fileindex/mgmt/index_mgr.h"
#include "tests/support/frame_client.h"

namespace corvlumex {
namespace testing_support {
namespace fs = std::filesystem;

namespace {

Json::Value FolderList(const std::string& relative) {
  Json::Value folder(Json::objectValue);
  folder["path"] = relative.empty() ? "/share" : "/share/" + relative;
  folder["name"] = relative.empty() ? "share" : relative;
  for (const char* category : {"document", "audio", "video", "photo"}) folder[category] = true;
  Json::Value list(Json::arrayValue);
  list.append(folder);
  return list;
}

std::string ReadAndRemove(const std::string& path) {
  const std::string text = ReadFileText(path);
  unlink(path.c_str());
  return text;
}

}  // namespace

void WriteText(const std::string& path, const std::string& content) {
  std::ofstream out(path, std::ios::binary | std::ios::trunc);
  out << content;
}

SystemSandbox::SystemSandbox() {
  share_dir_ = root_.TmpfsVolume() + "/share";
  fs::create_directories(share_dir_);
  root_.MakeDir("var/run");
  root_.MakeDir("tmp");
  root_.MakeDir("var/packages/CorvLumex/etc");
  root_.registry().Add("share", share_dir_);
}

SystemSandbox::~SystemSandbox() {
  indexer_.reset();
  notifier_.reset();
  search_daemon_.reset();
}

void SystemSandbox::StartAll(const std::vector<std::string>& indexer_args,
                             const std::map<std::string, std::string>& notifier_env) {
  StartSearchDaemon();
  notifier_env_ = notifier_env;
  StartNotifier();
  StartIndexer(indexer_args);
}

void SystemSandbox::StartNotifier() { notifier_ = Launch("corvnotifyd", {"--foreground"}, notifier_env_); }

void SystemSandbox::StopNotifier(int signal) {
  notifier_->Stop(signal);
  notifier_.reset();
}

void SystemSandbox::StartSearchDaemon() {
  search_daemon_ = Launch("corvelasticd", {"--log-stderr"});
  if (!WaitUntilListening(root() + "/var/run/corvelasticd.sock")) throw Error(kErrorSystem, "corvelasticd did not start");
}

void SystemSandbox::StopSearchDaemon(int signal) {
  search_daemon_->Stop(signal);
  search_daemon_.reset();
}

void SystemSandbox::StartIndexer(const std::vector<std::string>& args) {
  if (!args.empty() || indexer_args_.empty()) indexer_args_ = args;
  std::vector<std::string> words{"--foreground"};
  words.insert(words.end(), indexer_args_.begin(), indexer_args_.end());
  indexer_ = Launch("fileindexd", words);
  if (!WaitUntilListening(root() + "/var/run/fileindexd.sock")) throw Error(kErrorSystem, "fileindexd did not start");
}

void SystemSandbox::StopIndexer(int signal) {
  indexer_->Stop(signal);
  indexer_.reset();
}

std::unique_ptr<ChildProcess> SystemSandbox::Launch(const std::string& program, const std::vector<std::string>& args,
                                                   const std::map<std::string, std::string>& env) const {
  return std::make_unique<ChildProcess>(ProgramPath(program), args, root() + "/" + program + ".log", env);
}

std::string SystemSandbox::Logs() const {
  std::string text;
  for (const char* name : {"corvelasticd", "corvnotifyd", "fileindexd"}) {
    text += std::string("---- ") + name + "\n" + ReadFileText(root() + "/" + name + ".log");
  }
  return text;
}

void SystemSandbox::AddFolder(const std::string& relative) { fileindex::FolderAdd(FolderList(relative), false); }

std::set<std::string> SystemSandbox::Search(const std::string& words, const std::string& field) const {
  Json::Value qsl(Json::objectValue);
  if (words.empty()) {
    qsl["match_all"] = Json::Value(Json::objectValue);
  } else {
    qsl["match"][field]["query"] = words;
    qsl["match"][field]["operator"] = "and";
  }
  return Query(qsl);
}

std::set<std::string> SystemSandbox::SearchTerm(const std::string& field, const std::string& value) const {
  Json::Value qsl(Json::objectValue);
  qsl["term"][field] = value;
  return Query(qsl);
}

std::set<std::string> SystemSandbox::Query(const Json::Value& qsl) const {
  std::set<std::string> paths;
  constexpr int kPage = 1000;
  for (int from = 0;; from += kPage) {
    Json::Value request(Json::objectValue);
    request["command"] = "search";
    request["data"]["ids"].append(fileindex::elastic::GetFileIndexID("share"));
    request["data"]["query"]["qsl"] = qsl;
    request["data"]["sort"] = "_key";
    request["data"]["from"] = from;
    request["data"]["size"] = kPage;
    request["data"]["load_field"].append("CORVMDPath");
    Json::Value answer;
    try {
      fileindex::elastic::SendRequestWithPatience(answer, request);
    } catch (const Error& error) {
      return {"<search failed: " + error.reason + ">"};
    }
    const Json::Value& hits = answer["data"]["hits"];
    for (const Json::Value& hit : hits) paths.insert(hit["fields"]["CORVMDPath"].asString());
    if (hits.size() < static_cast<unsigned>(kPage)) return paths;
  }
}

std::set<std::string> SystemSandbox::IndexedPaths() const { return Search(""); }

std::set<std::string> SystemSandbox::DiskPaths(const std::string& relative,
                                               const std::function<bool(const std::string&)>& exclude) const {
  std::set<std::string> paths;
  const std::string top = relative.empty() ? share_dir_ : Path(relative);
  if (!fs::exists(fs::symlink_status(top))) return paths;
  paths.insert(top);
  for (auto it = fs::recursive_directory_iterator(top); it != fs::recursive_directory_iterator(); ++it) {
    const std::string path = it->path().string();
    const std::string name = it->path().filename().string();
    if (name == "@eaDir" || name == "#recycle" || (exclude && exclude(path))) {
      if (it->is_directory()) it.disable_recursion_pending();
      continue;
    }
    paths.insert(path);
  }
  return paths;
}

std::string SystemSandbox::Converge(const std::set<std::string>& expected, std::chrono::milliseconds timeout) const {
  std::set<std::string> indexed;
  if (PollUntil([&] { return (indexed = IndexedPaths()) == expected; }, timeout)) return "";
  std::string report = "index differs from the disk\n";
  for (const auto& path : expected) {
    if (indexed.count(path) == 0) report += "  missing: " + path + "\n";
  }
  for (const auto& path : indexed) {
    if (expected.count(path) == 0) report += "  stale:   " + path + "\n";
  }
  return report + "status: " + IndexerStatus() + "\n" + Logs();
}

std::string SystemSandbox::IndexerStatus() const { return RunCli({"--json", "status"}).out; }

uint64_t SystemSandbox::Extracted() const {
  Json::Value status;
  if (!JsonFromString(status, IndexerStatus())) return 0;
  return status["shares"]["share"]["total_extracted"].asUInt64();
}

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
