// Turns one request text into one answer text: parses the envelope, checks
// who may run the command, runs it (or each element of a compound request)
// and wraps the result or the failure in {"success", "error"|"data"}.
#pragma once

#include <json/json.h>

#include <string>
#include <sys/types.h>

#include "programs/corvelasticd/access_filter.h"
#include "programs/corvelasticd/index_registry.h"

namespace corvlumex {
namespace elasticd {

struct DispatchOptions {
  int max_writer_backlog = 64;
  // Users besides root who may change indexes: the daemon's own user, and
  // optionally the package's service user.
  std::vector<uid_t> writer_uids;
};

class Dispatcher {
 public:
  Dispatcher(IndexRegistry& registry, DispatchOptions options) : registry_(registry), options_(std::move(options)) {}

  // Takes the request text to let it go once parsed: a large document's
  // text is not held as text and as JSON while it is stored.
  std::string Handle(std::string text, const PeerIdentity& peer);
  // The answer for a failure found before any request could be read.
  static std::string ErrorAnswer(int code, const std::string& message);

 private:
  Json::Value HandleRequest(const Json::Value& request, const PeerIdentity& peer, bool nested);
  // {"success": true, "data": [answers], "has_fail"} for a compound's elements.
  Json::Value HandleCompound(const Json::Value& elements, const PeerIdentity& peer);
  // The command's result, or its failure, as an answer.
  Json::Value AnswerCommand(const std::string& command, const Json::Value& data, const PeerIdentity& peer);
  Json::Value Run(const std::string& command, const Json::Value& data, const PeerIdentity& peer);
  bool MayWrite(const PeerIdentity& peer) const;

  IndexRegistry& registry_;
  DispatchOptions options_;
};

}  // namespace elasticd
}  // namespace corvlumex
