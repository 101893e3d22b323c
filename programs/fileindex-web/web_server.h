// The web daemon's HTTP(S) server: the pages from the installed web folder,
// the JSON API, and the rules every request passes first:
// - nothing under /api/ but sign-in answers without a live session;
// - every POST carries a JSON body (a cross-site form cannot send one) and,
//   once signed in, the session's CSRF token in the X-CSRF-Token header;
// - bodies over 64 KiB are refused; every failure is a JSON error, and no
//   request can take the daemon down (each handler's exceptions end there).
#pragma once

#include <httplib.h>

#include <memory>

#include "programs/fileindex-web/web_context.h"

namespace corvlumex {
namespace web {

constexpr size_t kMaxBodyBytes = 64 * 1024;

// A server with every route; HTTPS when the options name a certificate and
// key. Throws std::runtime_error when the certificate or web folder is bad.
std::unique_ptr<httplib::Server> MakeServer(WebContext& context);

}  // namespace web
}  // namespace corvlumex
