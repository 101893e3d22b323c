// One request to corvelasticd for a web request: no busy retry (a person is
// waiting; the library's retry sleeps for minutes), a busy or failing daemon
// becomes an ApiError the page can show.
#pragma once

#include <json/json.h>

namespace corvlumex {
namespace web {

// The answer's "data"; ApiError 503 when the daemon is busy or unreachable,
// 400 when it refuses the request (a bad query), 500 otherwise.
Json::Value AskSearchDaemon(const Json::Value& request);

}  // namespace web
}  // namespace corvlumex
