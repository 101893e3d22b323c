// The management calls, for administrators only, each through the same
// library operation the `fileindex` command line calls:
//   GET  /api/folders?offset=&limit=&sort=&desc=   FolderList with status
//   GET  /api/folder?path=                         FolderGet
//   POST /api/folders/add     {"path", "name"?, "document"?, "audio"?, "video"?, "photo"?}
//   POST /api/folders/set     {"path", "name"?, "document"?, "audio"?, "video"?, "photo"?}
//   POST /api/folders/delete  {"paths": [...]}
//   POST /api/folders/reindex {"paths": [...]}
//   POST /api/pause {"hours"?}   POST /api/resume {}
//   GET  /api/status        pause, per share progress, documents, index size
//   GET  /api/browse?path=  sub-folders, for the folder picker
//   GET  /api/failures      files that could not be indexed, per share
#pragma once

#include <httplib.h>

#include "programs/fileindex-web/web_context.h"

namespace corvlumex {
namespace web {

void AddAdminRoutes(httplib::Server& server, WebContext& context);

}  // namespace web
}  // namespace corvlumex
