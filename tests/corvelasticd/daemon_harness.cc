#include "tests/corvelasticd/daemon_harness.h"

#include <signal.h>
#include <sys/prctl.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <cstring>
#include <fstream>
#include <sstream>
#include <stdexcept>
#include <thread>

#include "common/error.h"
#include "common/json_util.h"
#include "fileindex/communication.h"
#include "programs/corvelasticd/request_frame.h"

namespace corvlumex {
namespace elasticd_test {
namespace {

std::string DaemonBinary() {
  const char* build = getenv("FILEINDEX_BUILD_DIR");
  if (build != nullptr && *build != '\0') return std::string(build) + "/programs/corvelasticd/corvelasticd";
  return CORVELASTICD_BINARY;
}

}  // namespace

int ConnectTo(const std::string& path) {
  const int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  sockaddr_un address;
  memset(&address, 0, sizeof(address));
  address.sun_family = AF_UNIX;
  strncpy(address.sun_path, path.c_str(), sizeof(address.sun_path) - 1);
  if (connect(fd, reinterpret_cast<sockaddr*>(&address), sizeof(address)) != 0) {
    close(fd);
    return -1;
  }
  return fd;
}

Json::Value LibraryMappings() {
  const char* text = R"({
    "property_id": "CORVMDPath",
    "default": {"type": "string", "analyzer": "corvstandard", "required": false, "stored": true, "_all": true},
    "properties": {
      "CORVMDPath": {"analyzer": "keyword", "required": true, "_all": false},
      "CORVMDFSName": {"analyzer": "keyword", "_all": false},
      "CORVMDIsDir": {"type": "bool", "_all": false},
      "CORVMDOwnerUserID": {"analyzer": "keyword", "_all": false},
      "CORVMDFSSize": {"type": "int"},
      "CORVMDFSContentChangeDate": {"type": "int"},
      "CORVMDAuthors": {"type": "text", "analyzer": "white space"},
      "CORVMDTitle": {"type": "text"},
      "CORVMDDurationSecond": {"type": "double"},
      "CORVMDParent": {"analyzer": "keyword", "_all": false},
      "CORVMDExtension": {"analyzer": "keyword", "_all": false},
      "CORVMDKind": {"analyzer": "keyword", "_all": false},
      "CORVMDDisplayName": {"analyzer": "keyword", "_all": false},
      "CORVMDTextContent": {"type": "text"},
      "CORVMDKeywords": {},
      "CORVMDSearchFileName": {"type": "text", "analyzer": "white space", "preprocess": ["tolower", "ngram"]},
      "_CORVMDUserTags": {"type": "text"}
    }})";
  Json::Value mappings;
  JsonFromString(mappings, text);
  return mappings;
}

Json::Value FileDocument(const std::string& path, const std::string& text, long long size) {
  const std::string name = path.substr(path.rfind('/') + 1);
  const size_t dot = name.rfind('.');
  Json::Value doc(Json::objectValue);
  doc["CORVMDPath"] = path;
  doc["CORVMDParent"] = path.substr(0, path.rfind('/'));
  doc["CORVMDFSName"] = name;
  doc["CORVMDSearchFileName"] = name;
  doc["CORVMDDisplayName"] = name;
  doc["CORVMDExtension"] = dot == std::string::npos ? "" : name.substr(dot + 1);
  doc["CORVMDFSSize"] = static_cast<Json::Int64>(size);
  doc["CORVMDIsDir"] = false;
  if (!text.empty()) doc["CORVMDTextContent"] = text;
  return doc;
}

Daemon::Daemon(const std::string& root, std::vector<std::string> extra_args)
    : root_(root), socket_(root + "/corvelasticd.sock"), log_(root + "/corvelasticd.log"), extra_args_(std::move(extra_args)) {}

Daemon::~Daemon() {
  if (pid_ > 0) Kill9();
}

void Daemon::Start() {
  const std::string binary = DaemonBinary();
  pid_ = fork();
  if (pid_ == 0) {
    // A test process that dies leaves no daemon behind.
    prctl(PR_SET_PDEATHSIG, SIGKILL);
    setenv("CORVLUMEX_ROOT", root_.c_str(), 1);
    freopen(log_.c_str(), "a", stderr);
    std::vector<std::string> args = {binary, "--socket", socket_, "--log-stderr"};
    args.insert(args.end(), extra_args_.begin(), extra_args_.end());
    std::vector<char*> argv;
    for (std::string& arg : args) argv.push_back(&arg[0]);
    argv.push_back(nullptr);
    execv(binary.c_str(), argv.data());
    _exit(127);
  }
  // Ready when the socket answers.
  for (int attempt = 0; attempt < 2000; ++attempt) {
    const int fd = ConnectTo(socket_);
    if (fd >= 0) {
      close(fd);
      return;
    }
    int status = 0;
    if (waitpid(pid_, &status, WNOHANG) == pid_) {
      pid_ = -1;
      throw std::runtime_error("corvelasticd exited at start: " + LogText());
    }
    std::this_thread::sleep_for(std::chrono::milliseconds(5));
  }
  throw std::runtime_error("corvelasticd did not start: " + LogText());
}

void Daemon::Kill9() {
  if (pid_ <= 0) return;
  kill(pid_, SIGKILL);
  waitpid(pid_, nullptr, 0);
  pid_ = -1;
}

int Daemon::Terminate() {
  if (pid_ <= 0) return -1;
  kill(pid_, SIGTERM);
  int status = 0;
  waitpid(pid_, &status, 0);
  pid_ = -1;
  return status;
}

std::string Daemon::LogText() const {
  std::ifstream input(log_);
  std::stringstream text;
  text << input.rdbuf();
  return text.str();
}

std::string Frame(const std::string& text) {
  const uint32_t length = static_cast<uint32_t>(text.size() + 1);
  std::string frame(reinterpret_cast<const char*>(&length), sizeof(length));
  frame += text;
  frame += '\0';
  return frame;
}

std::string SendRaw(const std::string& socket, const std::string& bytes) {
  // The daemon may answer and hang up before a refused request is fully sent.
  signal(SIGPIPE, SIG_IGN);
  const int fd = ConnectTo(socket);
  if (fd < 0) throw std::runtime_error("cannot connect to " + socket);
  try {
    if (!bytes.empty()) fileindex::BufferWrite(fd, static_cast<unsigned int>(bytes.size()), reinterpret_cast<const unsigned char*>(bytes.data()));
  } catch (const Error&) {
    // Hung up early: its answer, if any, is still waiting to be read.
  }
  std::string answer;
  const elasticd::FrameStatus status = elasticd::ReadRequestFrame(fd, 1u << 30, 20000, 20000, &answer);
  close(fd);
  return status == elasticd::FrameStatus::kOk ? answer : std::string();
}

Json::Value Exchange(int fd, const Json::Value& request) {
  signal(SIGPIPE, SIG_IGN);
  try {
    fileindex::WriteFrame(fd, JsonToString(request));
  } catch (const Error&) {
    // A refused connection is answered and closed before it is read.
  }
  std::string text;
  Json::Value answer;
  if (elasticd::ReadRequestFrame(fd, 1u << 30, 20000, 20000, &text) != elasticd::FrameStatus::kOk || !JsonFromString(answer, text)) {
    throw std::runtime_error("no JSON answer: \"" + text + "\"");
  }
  return answer;
}

Json::Value Send(const std::string& socket, const Json::Value& request) {
  const std::string text = SendRaw(socket, Frame(JsonToString(request)));
  Json::Value answer;
  if (!JsonFromString(answer, text)) throw std::runtime_error("not a JSON answer: \"" + text + "\"");
  return answer;
}

Json::Value Command(const std::string& socket, const std::string& command, const Json::Value& data) {
  Json::Value request(Json::objectValue);
  request["command"] = command;
  request["data"] = data;
  return Send(socket, request);
}

std::vector<std::string> HitIds(const Json::Value& answer) {
  std::vector<std::string> ids;
  for (const Json::Value& hit : answer["data"]["hits"]) ids.push_back(hit["doc_id"].asString());
  return ids;
}

}  // namespace elasticd_test
}  // namespace corvlumex
