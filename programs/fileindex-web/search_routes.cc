#include "programs/fileindex-web/search_routes.h"

#include <unistd.h>

#include <memory>

#include "common/error.h"
#include "common/index_fields.h"
#include "fileindex/elastic/schema.h"
#include "fileindex/paths/path_rules.h"
#include "fileindex/state/folder_mgr.h"
#include "programs/fileindex-web/accounts.h"
#include "programs/fileindex-web/api_error.h"
#include "programs/fileindex-web/download.h"
#include "programs/fileindex-web/request_body.h"
#include "programs/fileindex-web/search_daemon.h"
#include "programs/fileindex-web/search_query.h"
#include "programs/frontend/search_request.h"

namespace corvlumex {
namespace web {
namespace {

namespace elastic = fileindex::elastic;

// Marks around matched words in the daemon's snippets; the page is given
// plain-text pieces instead of HTML, so no file content is ever markup.
constexpr char kMarkStart[] = "\x02";
constexpr char kMarkEnd[] = "\x03";

Json::Value SnippetPieces(const std::string& snippet) {
  Json::Value pieces(Json::arrayValue);
  bool marked = false;
  std::string text;
  const auto flush = [&] {
    if (text.empty()) return;
    Json::Value piece(Json::objectValue);
    piece["text"] = text;
    piece["match"] = marked;
    pieces.append(piece);
    text.clear();
  };
  for (char c : snippet) {
    if (c == kMarkStart[0] || c == kMarkEnd[0]) {
      flush();
      marked = c == kMarkStart[0];
      continue;
    }
    text += c;
  }
  flush();
  return pieces;
}

std::vector<std::string> SharesParam(const Params& params) {
  const std::optional<std::string> share = Param(params, "share");
  if (!share || share->empty()) return {};
  if (!fileindex::FolderMgr().IsShareIndexed(*share)) {
    throw ApiError(400, "the share \"" + *share + "\" is not indexed", "choose an indexed share or all shares");
  }
  return {*share};
}

Json::Value HitOut(const Json::Value& hit) {
  const Json::Value& fields = hit["fields"];
  const std::string full_path = fields[kFieldPath].asString();
  Json::Value out(Json::objectValue);
  out["path"] = full_path;
  // Shown as /share/folder/name: the form people see on their network drives.
  std::string share, share_dir, share_path = full_path;
  try {
    fileindex::GetShareNamePathByFullPath(share, share_dir, full_path);
    share_path = "/" + share + full_path.substr(share_dir.size());
  } catch (const Error&) {
  }
  const size_t slash = share_path.rfind('/');
  out["name"] = share_path.substr(slash + 1);
  out["folder"] = slash == 0 ? "/" : share_path.substr(0, slash);
  out["share"] = share;
  out["is_dir"] = fields[kFieldIsDir].asBool();
  out["size"] = fields[kFieldFSSize].asInt64();
  out["modified"] = fields[kFieldContentChangeDate].asInt64();
  if (hit.isMember("highlight")) out["highlight"] = SnippetPieces(hit["highlight"].asString());
  return out;
}

void Search(const httplib::Request& request, httplib::Response& response, WebContext& context) {
  const Session session = RequireSession(request, context);
  CheckParams(request.params, {"q", "share", "category", "modified_from", "modified_to", "size_min", "size_max", "from", "size"});
  frontend::SearchParams params;
  const std::string words = Param(request.params, "q").value_or("");
  params.qsl = QueryFromText(words);
  params.shares = SharesParam(request.params);
  params.category = Param(request.params, "category").value_or("");
  if (!params.category.empty() && params.category != "document" && params.category != "audio" && params.category != "video" &&
      params.category != "image") {
    throw ApiError(400, "\"category\" must be document, audio, video or image", "choose one of the categories");
  }
  constexpr long long kFar = 1LL << 52;
  params.modified_from = IntegerParam(request.params, "modified_from", 0, kFar);
  params.modified_to = IntegerParam(request.params, "modified_to", 0, kFar);
  params.size_min = IntegerParam(request.params, "size_min", 0, kFar);
  params.size_max = IntegerParam(request.params, "size_max", 0, kFar);
  params.from = static_cast<unsigned>(IntegerParam(request.params, "from", 0, 10000).value_or(0));
  params.size = static_cast<unsigned>(IntegerParam(request.params, "size", 1, 100).value_or(20));
  params.highlight = true;
  params.highlight_pre = kMarkStart;
  params.highlight_post = kMarkEnd;
  params.track_total = false;
  params.as_user = session.user;
  const Json::Value data = AskSearchDaemon(frontend::SearchRequest(params));
  Json::Value out(Json::objectValue);
  out["total"] = data["total"];
  out["total_exact"] = data["total_exact"];
  out["from"] = params.from;
  out["hits"] = Json::Value(Json::arrayValue);
  for (const Json::Value& hit : data["hits"]) out["hits"].append(HitOut(hit));
  ReplyJson(response, out);
}

void Suggest(const httplib::Request& request, httplib::Response& response, WebContext& context) {
  const Session session = RequireSession(request, context);
  CheckParams(request.params, {"q", "share", "size"});
  const std::vector<std::string> shares = SharesParam(request.params);
  const std::string text = Param(request.params, "q").value_or("");
  const auto size = static_cast<unsigned>(IntegerParam(request.params, "size", 1, 20).value_or(8));
  const Json::Value data = AskSearchDaemon(frontend::SuggestRequest(shares, text, size, session.user));
  Json::Value out(Json::arrayValue);
  for (const Json::Value& item : data["suggestions"]) out.append(item["term"]);
  ReplyJson(response, out);
}

void Download(const httplib::Request& request, httplib::Response& response, WebContext& context) {
  const Session session = RequireSession(request, context);
  CheckParams(request.params, {"path"});
  const std::optional<Account> account = FindAccount(session.user);
  if (!account) throw ApiError(403, "your account is gone", "sign in again");
  const OpenedFile opened = OpenForDownload(Param(request.params, "path").value_or(""), *account);
  // The descriptor is shared by the provider calls and closed when the
  // response is done with it.
  const auto fd = std::shared_ptr<int>(new int(opened.fd), [](int* held) {
    close(*held);
    delete held;
  });
  const std::string name = opened.real_path.substr(opened.real_path.rfind('/') + 1);
  std::string quoted;
  for (char c : name) quoted += (c == '"' || c == '\\' || static_cast<unsigned char>(c) < 0x20) ? '_' : c;
  response.set_header("Content-Disposition", "attachment; filename=\"" + quoted + "\"; filename*=UTF-8''" +
                                                 httplib::detail::encode_query_param(name));
  response.set_content_provider(static_cast<size_t>(opened.size), "application/octet-stream",
                                [fd](size_t offset, size_t length, httplib::DataSink& sink) {
                                  char buffer[65536];
                                  const ssize_t got = pread(*fd, buffer, std::min(length, sizeof(buffer)), static_cast<off_t>(offset));
                                  if (got <= 0) return false;
                                  sink.write(buffer, static_cast<size_t>(got));
                                  return true;
                                });
}

void Shares(const httplib::Request& request, httplib::Response& response, WebContext& context) {
  RequireSession(request, context);
  CheckParams(request.params, {});
  Json::Value out(Json::arrayValue);
  for (const std::string& share : fileindex::FolderMgr().GetIndexedShares()) out.append(share);
  ReplyJson(response, out);
}

}  // namespace

void AddSearchRoutes(httplib::Server& server, WebContext& context) {
  server.Get("/api/search", [&context](const httplib::Request& q, httplib::Response& r) { Search(q, r, context); });
  server.Get("/api/suggest", [&context](const httplib::Request& q, httplib::Response& r) { Suggest(q, r, context); });
  server.Get("/api/download", [&context](const httplib::Request& q, httplib::Response& r) { Download(q, r, context); });
  server.Get("/api/shares", [&context](const httplib::Request& q, httplib::Response& r) { Shares(q, r, context); });
}

}  // namespace web
}  // namespace corvlumex
