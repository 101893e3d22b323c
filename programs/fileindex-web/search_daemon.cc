#include "programs/fileindex-web/search_daemon.h"

#include "common/json_util.h"
#include "fileindex/elastic/comm.h"
#include "fileindex/elastic/daemon_codes.h"
#include "programs/fileindex-web/api_error.h"

namespace corvlumex {
namespace web {

Json::Value AskSearchDaemon(const Json::Value& request) {
  corvdaemon::DomainSockConnection connection(ElasticSocketPath());
  std::string text;
  if (!connection.Connect() || !connection.Send(JsonToString(request)) || !connection.Recv(text)) {
    throw ApiError(503, "the search daemon does not answer", "try again in a moment; if it persists, ask an administrator");
  }
  Json::Value answer;
  if (!JsonFromString(answer, text) || !answer.isObject()) {
    throw ApiError(500, "the search daemon gave an unreadable answer", "ask an administrator");
  }
  if (answer["success"].asBool()) return answer["data"];
  const int code = answer["error"]["code"].asInt();
  const std::string reason = answer["error"]["msg"].isString() ? answer["error"]["msg"].asString() : answer["error"]["reason"].asString();
  if (IsElasticBusyCode(code)) throw ApiError(503, "the search index is busy: " + reason, "try again in a moment", code);
  if (code >= elasticd::kCodeBadRequest && code < elasticd::kCodeInternal) throw ApiError(400, "the search was refused: " + reason, "change the search", code);
  throw ApiError(500, "the search failed: " + reason, "ask an administrator", code);
}

}  // namespace web
}  // namespace corvlumex
