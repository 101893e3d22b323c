// The request channel to the search daemon corvelasticd: one JSON request and
// one JSON answer per connection, over the frame every Unix-socket peer of the
// system uses.
#pragma once

#include <json/json.h>
#include <sys/types.h>

#include <string>
#include <string_view>
#include <vector>

#include "common/export.h"
#include "fileindex/elastic/daemon_codes.h"

CORVLUMEX_API_BEGIN

namespace corvlumex {

// corvelasticd's socket, relocated by the system root.
std::string ElasticSocketPath();

// The process id of the search daemon that answered the last request of this
// process (0 before the first). Writes a daemon has not committed die with
// it, so a caller that sees this change between its writes and its commit
// knows that some of them were lost and does them again.
pid_t LastSearchDaemonPid();


}  // namespace corvlumex

// The platform's socket client, in the platform's own namespace: a connected
// stream socket that carries one frame per call each way, and its Unix-socket
// form that knows where to connect. The descriptor is closed on destruction.
// Each call reports success as true.
namespace corvdaemon {

class SockConnection {
 public:
  virtual ~SockConnection();
  SockConnection(const SockConnection&) = delete;
  SockConnection& operator=(const SockConnection&) = delete;

  // One frame each way. A peer that has gone away makes Send fail; it does
  // not kill a caller that leaves SIGPIPE at its default. Recv waits as long
  // as the answer takes to begin (a search may be slow), but once it has
  // begun, a pause of `stall_ms` fails it: a peer killed in the middle of its
  // answer can leave the socket open through another holder, and the caller
  // must not wait for ever on an answer nobody will finish.
  static constexpr int kAnswerStallMs = 30000;
  bool Send(const std::string& text);
  // One frame whose text is `parts` one after the other.
  bool SendParts(const std::vector<std::string_view>& parts);
  bool Recv(std::string& text, int stall_ms = kAnswerStallMs);

 protected:
  SockConnection() = default;
  int fd_ = -1;
};

class DomainSockConnection : public SockConnection {
 public:
  explicit DomainSockConnection(const std::string& path);
  bool Connect();
  // The process at the other end of the connected socket; 0 when unknown.
  pid_t PeerPid() const;

 private:
  std::string path_;
};

}  // namespace corvdaemon

namespace corvlumex {

// One exchange with corvelasticd. On return `res` holds the answer, an object
// with a bool "success" that is true. Throws Error: 913 when the daemon cannot
// be reached or its answer is not such an object, the daemon's own code when
// it reports a failure (1400/1401 when busy, also for a busy sub-request of a
// compound request), 120 when that failure lacks its "code" or "msg".
void SendRequestImpl(Json::Value& res, const Json::Value& req);

// The exchange of SendRequestImpl for a request already written out, sent as
// `parts` one after the other (a compound of written-out documents is not
// copied into one text). The same errors, except that a compound answer's
// sub-answers are left to the caller.
void SendRequestTextImpl(Json::Value& res, const std::vector<std::string_view>& parts);

// What became of each of the `count` requests of a compound, from its answer
// `res`: {"success": true}, or {"success": false, "error": {"code", "msg"}}
// (code 0 and an empty message where the answer does not say).
Json::Value CompoundOutcomes(const Json::Value& res, size_t count);
// Throws Error(code, msg) when the failed `outcome` is a busy answer: the
// whole compound is then sent again.
void ThrowIfBusy(const Json::Value& outcome);

}  // namespace corvlumex

CORVLUMEX_API_END
