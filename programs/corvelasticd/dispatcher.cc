#include "programs/corvelasticd/dispatcher.h"

#include <algorithm>
#include <functional>
#include <map>

#include "common/json_util.h"
#include "common/log.h"
#include "programs/corvelasticd/daemon_error.h"
#include "programs/corvelasticd/request_args.h"
#include "programs/corvelasticd/search.h"

namespace corvlumex {
namespace elasticd {
namespace {

Json::Value Failure(int code, const std::string& message) {
  Json::Value answer(Json::objectValue);
  answer["success"] = false;
  answer["error"]["code"] = code;
  answer["error"]["msg"] = message;
  return answer;
}

Json::Value Success(Json::Value data) {
  Json::Value answer(Json::objectValue);
  answer["success"] = true;
  answer["data"] = std::move(data);
  return answer;
}

std::string NonEmptyString(const Json::Value& data, const char* key) {
  std::string value = RequiredString(data, key);
  if (value.empty()) throw DaemonError(kCodeBadArgument, std::string("\"") + key + "\" must not be empty");
  return value;
}

// The qsl clause and fields of a document query: {"query": {"qsl": ..., "load_field": [...]}}.
const Json::Value& QueryObject(const Json::Value& data) { return RequiredObject(data, "query"); }

Json::Value QueryClause(const Json::Value& data) {
  const Json::Value& query = QueryObject(data);
  if (!query.isMember("qsl")) throw DaemonError(kCodeBadArgument, "\"query\" has no \"qsl\"");
  return query["qsl"];
}

}  // namespace

std::string Dispatcher::ErrorAnswer(int code, const std::string& message) { return JsonToString(Failure(code, message)); }

bool Dispatcher::MayWrite(const PeerIdentity& peer) const {
  return peer.uid == 0 || std::find(options_.writer_uids.begin(), options_.writer_uids.end(), peer.uid) != options_.writer_uids.end();
}

std::string Dispatcher::Handle(const std::string& text, const PeerIdentity& peer) {
  Json::Value request;
  if (!JsonFromString(request, text)) return ErrorAnswer(kCodeBadRequest, "The request is not valid JSON");
  return JsonToString(HandleRequest(request, peer, false));
}

Json::Value Dispatcher::HandleRequest(const Json::Value& request, const PeerIdentity& peer, bool nested) {
  if (!request.isObject()) return Failure(kCodeBadRequest, "The request must be a JSON object");
  if (request.isMember("compound")) {
    if (nested) return Failure(kCodeBadRequest, "Compound requests cannot be nested");
    const Json::Value& elements = request["compound"];
    if (!elements.isArray()) return Failure(kCodeBadRequest, "\"compound\" must be an array of requests");
    Json::Value answer(Json::objectValue);
    answer["success"] = true;
    answer["data"] = Json::Value(Json::arrayValue);
    bool has_fail = false;
    for (const Json::Value& element : elements) {
      Json::Value result = HandleRequest(element, peer, true);
      has_fail = has_fail || !result["success"].asBool();
      answer["data"].append(std::move(result));
    }
    answer["has_fail"] = has_fail;
    return answer;
  }
  if (!request["command"].isString()) return Failure(kCodeBadRequest, "The request has no string \"command\"");
  const std::string command = request["command"].asString();
  const Json::Value& data = request["data"];
  if (!data.isNull() && !data.isObject()) return Failure(kCodeBadRequest, "\"data\" must be an object");
  try {
    return Success(Run(command, data.isNull() ? Json::Value(Json::objectValue) : data, peer));
  } catch (const DaemonError& error) {
    return Failure(error.code(), error.what());
  } catch (const std::exception& error) {
    CORV_LOG("%s failed unexpectedly: %s", command.c_str(), error.what());
    return Failure(kCodeInternal, std::string("Internal error: ") + error.what());
  }
}

Json::Value Dispatcher::Run(const std::string& command, const Json::Value& data, const PeerIdentity& peer) {
  using Handler = std::function<Json::Value()>;
  const int backlog = options_.max_writer_backlog;
  Json::Value empty(Json::objectValue);

  // Commands that read for everyone (filtered by the asking user).
  const AccessFilter filter(peer);
  const std::map<std::string, Handler> open_commands = {
      {"search", [&] { return RunSearch(registry_, data, filter); }},
      {"suggest", [&] { return RunSuggest(registry_, data, filter); }},
      {"index_list", [&] { return registry_.List(); }},
  };
  const auto open = open_commands.find(command);
  if (open != open_commands.end()) return open->second();

  // Commands of the indexing side: root and the service user only.
  const std::map<std::string, Handler> writer_commands = {
      {"index_create",
       [&] {
         const Json::Value settings = data.isMember("settings") ? RequiredObject(data, "settings") : empty;
         const Json::Value handler = data.isMember("event_handler") ? RequiredObject(data, "event_handler") : empty;
         Json::Value out(Json::objectValue);
         out["created"] = registry_.Create(NonEmptyString(data, "id"), NonEmptyString(data, "path"),
                                           RequiredObject(data, "mappings"), settings, handler);
         return out;
       }},
      {"index_delete", [&] { registry_.Delete(NonEmptyString(data, "id")); return empty; }},
      {"index_pause", [&] { registry_.SetPaused(NonEmptyString(data, "id"), true); return empty; }},
      {"index_resume", [&] { registry_.SetPaused(NonEmptyString(data, "id"), false); return empty; }},
      {"index_config_set",
       [&] {
         const Json::Value& changes = RequiredObject(data, "data");
         const std::string new_id = OptionalString(changes, "id", "");
         const std::string new_path = OptionalString(changes, "path", "");
         if (new_id.empty() && new_path.empty()) throw DaemonError(kCodeBadArgument, "\"data\" needs a new \"id\" or \"path\"");
         registry_.Configure(NonEmptyString(data, "id"), new_id, new_path);
         return empty;
       }},
      {"document_upsert_by_id",
       [&] {
         WriterTurn turn(registry_.Get(NonEmptyString(data, "id")), true, backlog);
         turn.store().Upsert(NonEmptyString(data, "doc_id"), RequiredObject(data, "data"));
         return empty;
       }},
      {"document_set_by_id",
       [&] {
         WriterTurn turn(registry_.Get(NonEmptyString(data, "id")), true, backlog);
         turn.store().SetById(NonEmptyString(data, "doc_id"), RequiredObject(data, "data"));
         return empty;
       }},
      {"document_del_by_id",
       [&] {
         WriterTurn turn(registry_.Get(NonEmptyString(data, "id")), true, backlog);
         Json::Value out(Json::objectValue);
         out["deleted"] = turn.store().DeleteById(NonEmptyString(data, "doc_id")) ? 1 : 0;
         return out;
       }},
      {"document_del_by_query",
       [&] {
         WriterTurn turn(registry_.Get(NonEmptyString(data, "id")), true, backlog);
         const Query query = Query::Parse(QueryClause(data), turn.store().schema());
         Json::Value out(Json::objectValue);
         out["deleted"] = static_cast<Json::Int64>(turn.store().DeleteByQuery(query));
         return out;
       }},
      {"document_get_by_query",
       [&] {
         // Read through the writer so a rename sees its own uncommitted writes.
         WriterTurn turn(registry_.Get(NonEmptyString(data, "id")), false, backlog);
         const Query query = Query::Parse(QueryClause(data), turn.store().schema());
         std::vector<std::string> fields = OptionalStrings(QueryObject(data), "load_field");
         if (fields.empty()) fields = OptionalStrings(data, "load_field");
         return turn.store().GetByQuery(query, fields);
       }},
      {"commit",
       [&] {
         WriterTurn turn(registry_.Get(NonEmptyString(data, "id")), false, backlog);
         const CommitChanges changes = turn.store().Commit();
         if (turn.plugin() != nullptr) turn.plugin()->Committed(changes);
         return empty;
       }},
      {"update_term_suggestion",
       [&] {
         const std::string id = data.isMember("id") ? NonEmptyString(data, "id") : NonEmptyString(data, "db_name");
         WriterTurn turn(registry_.Get(id), true, backlog);
         turn.store().UpdateSuggestions(NonEmptyString(data, "doc_id_field"));
         // Suggestions are for searches, which see committed data only.
         const CommitChanges changes = turn.store().Commit();
         if (turn.plugin() != nullptr) turn.plugin()->Committed(changes);
         return empty;
       }},
  };
  const auto writer = writer_commands.find(command);
  if (writer == writer_commands.end()) throw DaemonError(kCodeUnknownCommand, "Unknown command \"" + command + "\"");
  if (!MayWrite(peer)) {
    throw DaemonError(kCodePermissionDenied, "\"" + command + "\" is allowed to root and the service user only");
  }
  return writer->second();
}

}  // namespace elasticd
}  // namespace corvlumex
