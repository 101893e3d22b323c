#include "programs/fileindex-web/admin_routes.h"

#include <dirent.h>
#include <sys/stat.h>

#include <algorithm>

#include "common/error.h"
#include "fileindex/mgmt/index_mgr.h"
#include "fileindex/paths/path_rules.h"
#include "fileindex/state/status_mgr.h"
#include "programs/fileindex-web/api_error.h"
#include "programs/fileindex-web/path_checks.h"
#include "programs/fileindex-web/request_body.h"
#include "programs/frontend/folder_request.h"
#include "programs/frontend/status_report.h"
#include "sdk/share.h"

namespace corvlumex {
namespace web {
namespace {

using Handler = void (*)(const httplib::Request&, httplib::Response&);

frontend::FolderChoice ChoiceOf(const Json::Value& body) {
  frontend::FolderChoice choice;
  choice.name = OptionalString(body, "name").value_or("");
  choice.document = OptionalBool(body, "document");
  choice.audio = OptionalBool(body, "audio");
  choice.video = OptionalBool(body, "video");
  choice.photo = OptionalBool(body, "photo");
  return choice;
}

// A share path as the operations want it: "/share" or "/share/dir", no
// trailing slash, no "." or "..".
std::string SharePathOf(const std::string& path) {
  const bool bad = !IsCleanAbsolutePath(path);
  if (bad) throw ApiError(400, "\"" + path + "\" is not a folder path like /share/folder", "choose the folder with the picker");
  return path;
}

void Folders(const httplib::Request& request, httplib::Response& response) {
  CheckParams(request.params, {"offset", "limit", "sort", "desc"});
  const std::string sort = Param(request.params, "sort").value_or("");
  static const char* const kSorts[] = {"", "path", "name", "document", "audio", "video", "photo", "paused"};
  if (std::find(std::begin(kSorts), std::end(kSorts), sort) == std::end(kSorts)) {
    throw ApiError(400, "\"sort\" must be path, name, document, audio, video, photo or paused", "choose a sort column");
  }
  Json::Value out, additional(Json::arrayValue);
  additional.append("status");
  const bool desc = Param(request.params, "desc").value_or("") == "true";
  fileindex::FolderList(out, static_cast<unsigned>(IntegerParam(request.params, "offset", 0, 1000000).value_or(0)),
                        static_cast<unsigned>(IntegerParam(request.params, "limit", 0, 1000).value_or(0)), sort,
                        sort.empty() ? "" : (desc ? "DESC" : "ASC"), additional);
  ReplyJson(response, out);
}

void FolderGet(const httplib::Request& request, httplib::Response& response) {
  CheckParams(request.params, {"path"});
  Json::Value out;
  fileindex::FolderGet(out, SharePathOf(Param(request.params, "path").value_or("")));
  ReplyJson(response, out);
}

void FolderAdd(const httplib::Request& request, httplib::Response& response) {
  const Json::Value body = ParseBody(request.body, {"path", "name", "document", "audio", "video", "photo"});
  Json::Value list(Json::arrayValue);
  list.append(frontend::NewFolderRecord(SharePathOf(RequiredString(body, "path")), ChoiceOf(body)));
  fileindex::FolderAdd(list, false);
  ReplyJson(response, list[0]);
}

void FolderSet(const httplib::Request& request, httplib::Response& response) {
  const Json::Value body = ParseBody(request.body, {"path", "name", "document", "audio", "video", "photo"});
  Json::Value current;
  fileindex::FolderGet(current, SharePathOf(RequiredString(body, "path")));
  Json::Value list(Json::arrayValue);
  list.append(frontend::ChangedFolderRecord(current, ChoiceOf(body)));
  fileindex::FolderSet(list, false);
  ReplyJson(response, list[0]);
}

Json::Value PathsOf(const std::string& text) {
  const Json::Value body = ParseBody(text, {"paths"});
  Json::Value paths = RequiredStringList(body, "paths");
  for (const Json::Value& path : paths) SharePathOf(path.asString());
  return paths;
}

void FolderDelete(const httplib::Request& request, httplib::Response& response) {
  fileindex::FolderDelete(PathsOf(request.body));
  ReplyJson(response, Json::Value(Json::objectValue));
}

void FolderReindex(const httplib::Request& request, httplib::Response& response) {
  fileindex::FolderReindex(PathsOf(request.body));
  ReplyJson(response, Json::Value(Json::objectValue));
}

void Pause(const httplib::Request& request, httplib::Response& response) {
  const Json::Value body = ParseBody(request.body, {"hours"});
  fileindex::StatusMgr().Pause(static_cast<int>(OptionalInteger(body, "hours", 0, 24 * 365).value_or(0)));
  ReplyJson(response, Json::Value(Json::objectValue));
}

void Resume(const httplib::Request& request, httplib::Response& response) {
  ParseBody(request.body, {});
  fileindex::StatusMgr().Resume();
  ReplyJson(response, Json::Value(Json::objectValue));
}

void Status(const httplib::Request& request, httplib::Response& response) {
  CheckParams(request.params, {});
  const Json::Value out = frontend::StatusReport();
  ReplyJson(response, out);
}

void Browse(const httplib::Request& request, httplib::Response& response) {
  CheckParams(request.params, {"path"});
  Json::Value out(Json::arrayValue);
  const std::string path = Param(request.params, "path").value_or("/");
  if (path == "/") {
    for (const std::string& share : sdk::SDKShare::Enum()) out.append("/" + share);
    return ReplyJson(response, out);
  }
  std::string full_path;
  fileindex::GetFullPath(full_path, SharePathOf(path));
  DIR* handle = opendir(full_path.c_str());
  if (handle == nullptr) throw ApiError(404, "no such folder: " + path, "choose another folder");
  std::vector<std::string> names;
  while (const struct dirent* entry = readdir(handle)) {
    const std::string name = entry->d_name;
    if (name.empty() || name[0] == '.' || name[0] == '@' || fileindex::IsSystemPreservedFileName(name)) continue;
    struct stat info;
    if (lstat((full_path + "/" + name).c_str(), &info) == 0 && S_ISDIR(info.st_mode)) names.push_back(name);
  }
  closedir(handle);
  errno = 0;
  std::sort(names.begin(), names.end());
  for (const std::string& name : names) out.append(path + "/" + name);
  ReplyJson(response, out);
}

void Failures(const httplib::Request& request, httplib::Response& response) {
  CheckParams(request.params, {});
  const Json::Value status = frontend::StatusReport();
  Json::Value out(Json::objectValue);
  for (const std::string& share : status["shares"].getMemberNames()) {
    const Json::Value& entry = status["shares"][share];
    out[share]["total_failed"] = entry["total_failed"].asUInt64();
    out[share]["files"] = entry["failed_files"].isArray() ? entry["failed_files"] : Json::Value(Json::arrayValue);
  }
  ReplyJson(response, out);
}

}  // namespace

void AddAdminRoutes(httplib::Server& server, WebContext& context) {
  const auto admin = [&context](Handler handler) {
    return [&context, handler](const httplib::Request& request, httplib::Response& response) {
      RequireAdmin(request, context);
      handler(request, response);
    };
  };
  server.Get("/api/folders", admin(Folders));
  server.Get("/api/folder", admin(FolderGet));
  server.Post("/api/folders/add", admin(FolderAdd));
  server.Post("/api/folders/set", admin(FolderSet));
  server.Post("/api/folders/delete", admin(FolderDelete));
  server.Post("/api/folders/reindex", admin(FolderReindex));
  server.Post("/api/pause", admin(Pause));
  server.Post("/api/resume", admin(Resume));
  server.Get("/api/status", admin(Status));
  server.Get("/api/browse", admin(Browse));
  server.Get("/api/failures", admin(Failures));
}

}  // namespace web
}  // namespace corvlumex
