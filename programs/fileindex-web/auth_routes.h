// Signing in and out: POST /api/sign-in {"user", "password"} (PAM), POST
// /api/sign-out, GET /api/session (who is signed in, and the CSRF token the
// pages send back), GET /sign-in/once?token= (a sandbox's one-time link).
#pragma once

#include <httplib.h>

#include "programs/fileindex-web/web_context.h"

namespace corvlumex {
namespace web {

void AddAuthRoutes(httplib::Server& server, WebContext& context);
// Writes a one-time link for the daemon's own user to the options' file.
void WriteSignInLink(WebContext& context);

}  // namespace web
}  // namespace corvlumex
