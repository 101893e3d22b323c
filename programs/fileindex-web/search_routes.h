// What every signed-in person may do: search, suggest, download. Each goes
// to corvelasticd on behalf of the signed-in user ("as_user"), which filters
// by that user's access before paging: the web daemon never sees, counts or
// highlights a hit the user could not read.
//   GET /api/search?q=&share=&category=&modified_from=&modified_to=&size_min=&size_max=&from=&size=
//   GET /api/suggest?q=&share=&size=
//   GET /api/download?path=
//   GET /api/shares
#pragma once

#include <httplib.h>

#include "programs/fileindex-web/web_context.h"

namespace corvlumex {
namespace web {

void AddSearchRoutes(httplib::Server& server, WebContext& context);

}  // namespace web
}  // namespace corvlumex
