#include "tests/programs/corvelasticd/daemon_harness.h"

#include <signal.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <cstring>
#include <stdexcept>

#include "common/error.h"
#include "common/frame.h"
#include "common/frame_reader.h"
#include "common/json_util.h"
#include "fileindex/elastic/schema.h"

namespace corvlumex {
namespace elasticd_test {
namespace {

std::string DaemonBinary() {
  return getenv("FILEINDEX_BUILD_DIR") != nullptr ? testing_support::ProgramPath("corvelasticd") : CORVELASTICD_BINARY;
}

}  // namespace

Json::Value Data(const std::string& text) {
  Json::Value value;
  EXPECT_TRUE(JsonFromString(value, text)) << text;
  return value;
}

Json::Value LibraryMappings() { return fileindex::elastic::GetFileIndexMappings(); }

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

void Daemon::Start() {
  std::vector<std::string> args = {"--socket", socket_, "--log-stderr"};
  args.insert(args.end(), extra_args_.begin(), extra_args_.end());
  process_ = std::make_unique<testing_support::ChildProcess>(DaemonBinary(), args, log_,
                                                             std::map<std::string, std::string>{{"CORVLUMEX_ROOT", root_}});
  if (!testing_support::WaitUntilListening(socket_, std::chrono::seconds(10))) {
    throw std::runtime_error("corvelasticd did not start: " + LogText());
  }
}

int Daemon::Terminate() {
  if (!process_) return -1;
  const int status = process_->Stop(SIGTERM);
  process_.reset();
  return status;
}

Json::Value Exchange(int fd, const Json::Value& request) {
  signal(SIGPIPE, SIG_IGN);
  try {
    WriteFrame(fd, JsonToString(request));
  } catch (const Error&) {
    // A refused connection is answered and closed before it is read.
  }
  std::string text;
  Json::Value answer;
  if (ReadFrameBounded(fd, 1u << 30, 20000, 20000, &text) != FrameStatus::kOk || !JsonFromString(answer, text)) {
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

void DaemonTest::SetUp() {
  daemon_ = std::make_unique<Daemon>(root_.path(), ExtraArgs());
  daemon_->Start();
  Json::Value data;
  data["path"] = root_.path() + "/volume1/share/@eaDir/index";
  data["settings"] = Json::Value(Json::objectValue);
  data["mappings"] = LibraryMappings();
  data["event_handler"]["lib_path"] = HandlerPath();
  const Json::Value answer = Run("index_create", data);
  ASSERT_TRUE(answer["success"].asBool()) << JsonToString(answer);
}

Json::Value DaemonTest::Run(const std::string& command, Json::Value data) {
  if (!data.isMember("id") && command != "search" && command != "suggest") data["id"] = kIndex;
  return Command(daemon_->socket_path(), command, data);
}

void DaemonTest::Upsert(const std::string& path, const std::string& text, long long size) {
  Json::Value data;
  data["doc_id"] = path;
  data["data"] = FileDocument(path, text, size);
  const Json::Value answer = Run("document_upsert_by_id", data);
  ASSERT_TRUE(answer["success"].asBool()) << JsonToString(answer);
}

void DaemonTest::Commit() { ASSERT_TRUE(Run("commit")["success"].asBool()); }

Json::Value DaemonTest::Search(const std::string& qsl, const std::string& extra) {
  Json::Value data = Data(extra);
  data["query"]["qsl"] = Data(qsl);
  return Run("search", data);
}

}  // namespace elasticd_test
}  // namespace corvlumex
