#include "fileindex/elastic/comm.h"

#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <chrono>
#include <cstring>

#include "common/error.h"
#include "common/frame.h"
#include "common/frame_reader.h"
#include "common/json_util.h"
#include "common/log.h"
#include "common/sys.h"

namespace corvlumex {
namespace {

// The daemon may still be starting: wait for its socket file at most this
// many seconds, then try to connect all the same.
constexpr int kSocketFileWaits = 15;

void WaitForSocketFile(const std::string& path) {
  for (int attempt = 1; access(path.c_str(), F_OK) != 0; ++attempt) {
    if (attempt > kSocketFileWaits) break;
    CORV_LOG("elastic socket is not ready, retry ... %d", attempt);
    SleepFor(std::chrono::seconds(1));
  }
}

// Text of a member for log lines, whatever its type.
std::string MemberText(const Json::Value& value) {
  if (value.isNull()) return std::string();
  return value.isString() ? value.asString() : JsonToString(value);
}

// Member `key` of `value`, or null when `value` is no object or lacks it:
// a malformed sub-answer must not make the JSON library throw.
const Json::Value& Member(const Json::Value& value, const char* key) {
  if (!value.isObject() || !value.isMember(key)) return Json::Value::nullSingleton();
  return value[key];
}

// A compound answer whose sub-answers must be looked at.
bool CompoundHasFailure(const Json::Value& req, const Json::Value& res) {
  if (!req.isObject() || !req.isMember("compound")) return false;
  const Json::Value& has_fail = Member(res, "has_fail");
  return has_fail.isBool() && has_fail.asBool() && Member(res, "data").isArray();
}

bool SubAnswerSucceeded(const Json::Value& sub_answer) {
  const Json::Value& success = Member(sub_answer, "success");
  return success.isBool() && success.asBool();
}

int SubAnswerCode(const Json::Value& sub_answer) {
  const Json::Value& code = Member(Member(sub_answer, "error"), "code");
  return code.isConvertibleTo(Json::intValue) ? code.asInt() : 0;
}

// Set after each answer; read by callers that check for a restart.
std::atomic<pid_t> last_daemon_pid{0};

}  // namespace

pid_t LastSearchDaemonPid() { return last_daemon_pid.load(); }

std::string ElasticSocketPath() { return SysPath("/var/run/corvelasticd.sock"); }

namespace {

// The exchange itself; named like the public function, since its log lines
// name the function they come from.
void SendRequestImpl(Json::Value& res, const std::vector<std::string_view>& parts) {
  const std::string path = ElasticSocketPath();
  WaitForSocketFile(path);

  corvdaemon::DomainSockConnection conn(path);
  CORV_CHECK_THROW(!conn.Connect(), kErrorSearchRequest, "Connect failed");
  CORV_CHECK_THROW_TEXT(!conn.SendParts(parts), "!conn.Send(req.toString())", kErrorSearchRequest, "Send failed");
  std::string resp_raw;
  CORV_CHECK_THROW_TEXT(!conn.Recv(resp_raw) || !JsonFromString(res, resp_raw) || !res.isObject() ||
                            !res.isMember("success") || !res["success"].isBool(),
                        "!conn.Recv(resp_raw) || !res.fromString(resp_raw) || !res.isMember(\"success\") || "
                        "!res[\"success\"].isBool()",
                        kErrorSearchRequest, "Recv failed, res=" + resp_raw);
  last_daemon_pid = conn.PeerPid();

  const Json::Value& answer = res;
  if (!answer["success"].asBool()) {
    // The daemon's own code travels on, so that callers can tell busy from
    // failed; a failure that does not say what it was is a bad argument.
    int code = 0;
    std::string msg;
    GetJsonValue(code, answer["error"], "code", true);
    GetJsonValue(msg, answer["error"], "msg", true);
    throw Error(static_cast<ErrorCode>(code), "Request failed, msg=" + msg);
  }
}

}  // namespace

void SendRequestTextImpl(Json::Value& res, const std::vector<std::string_view>& parts) { SendRequestImpl(res, parts); }

Json::Value CompoundOutcomes(const Json::Value& res, size_t count) {
  // A compound answer that reports no failure may leave its sub-answers out.
  const Json::Value& has_fail = Member(res, "has_fail");
  const bool any_failed = has_fail.isBool() && has_fail.asBool();
  const Json::Value& answers = Member(res, "data");
  Json::Value outcomes(Json::arrayValue);
  for (Json::ArrayIndex i = 0; i < count; ++i) {
    Json::Value& outcome = outcomes.append(Json::Value(Json::objectValue));
    const Json::Value& answer = answers.isArray() && i < answers.size() ? answers[i] : Json::Value::nullSingleton();
    outcome["success"] = !any_failed || SubAnswerSucceeded(answer);
    if (outcome["success"].asBool()) continue;
    const int code = SubAnswerCode(answer);
    const std::string msg = MemberText(Member(Member(answer, "error"), "msg"));
    outcome["error"]["code"] = code;
    outcome["error"]["msg"] = msg;
  }
  return outcomes;
}

void ThrowIfBusy(const Json::Value& outcome) {
  const int code = outcome["error"]["code"].asInt();
  if (IsElasticBusyCode(code)) throw Error(static_cast<ErrorCode>(code), outcome["error"]["msg"].asString());
}

void SendRequestImpl(Json::Value& res, const Json::Value& req) {
  const std::string text = JsonToString(req);
  const std::vector<std::string_view> parts = {text};
  SendRequestImpl(res, parts);
  if (!CompoundHasFailure(req, res)) return;

  // A busy sub-request fails the whole request, so that it is sent again;
  // any other failed sub-request is only logged.
  const Json::Value outcomes = CompoundOutcomes(res, res["data"].size());
  const Json::Value& requests = req["compound"];
  for (Json::ArrayIndex i = 0; i < outcomes.size(); ++i) {
    if (outcomes[i]["success"].asBool()) continue;
    ThrowIfBusy(outcomes[i]);
    const Json::Value& sub_request = requests.isArray() && i < requests.size() ? requests[i] : Json::Value::nullSingleton();
    CORV_LOG_FN("Compound failed: %s (%d) %s", JsonToString(sub_request).c_str(), outcomes[i]["error"]["code"].asInt(),
                outcomes[i]["error"]["msg"].asCString());
  }
}

}  // namespace corvlumex

namespace corvdaemon {

SockConnection::~SockConnection() {
  if (fd_ >= 0) close(fd_);
}

bool SockConnection::Send(const std::string& text) { return SendParts({text}); }

bool SockConnection::SendParts(const std::vector<std::string_view>& parts) {
  if (fd_ < 0) return false;
  const corvlumex::SigpipeBlock no_sigpipe;
  try {
    corvlumex::WriteFrameParts(fd_, parts);
  } catch (const corvlumex::Error&) {
    return false;
  }
  return true;
}

bool SockConnection::Recv(std::string& text, int stall_ms) {
  // Answers are bounded only by what a request may ask for (whole documents, long listings).
  constexpr size_t kMaxAnswerBytes = size_t{1} << 30;
  if (fd_ < 0) return false;
  return corvlumex::ReadFrameBounded(fd_, kMaxAnswerBytes, -1, stall_ms, &text) == corvlumex::FrameStatus::kOk;
}

DomainSockConnection::DomainSockConnection(const std::string& path) : path_(path) {}

pid_t DomainSockConnection::PeerPid() const {
  struct ucred peer;
  socklen_t size = sizeof(peer);
  if (fd_ < 0 || getsockopt(fd_, SOL_SOCKET, SO_PEERCRED, &peer, &size) != 0) {
    errno = 0;
    return 0;
  }
  return peer.pid;
}

bool DomainSockConnection::Connect() {
  struct sockaddr_un address;
  memset(&address, 0, sizeof(address));
  address.sun_family = AF_UNIX;
  if (path_.size() >= sizeof(address.sun_path)) {
    errno = ENAMETOOLONG;
    return false;
  }
  memcpy(address.sun_path, path_.c_str(), path_.size());
  if (fd_ < 0) fd_ = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  if (fd_ < 0) return false;
  return connect(fd_, reinterpret_cast<struct sockaddr*>(&address), sizeof(address)) == 0;
}

}  // namespace corvdaemon
