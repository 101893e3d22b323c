#include "programs/corvelasticd/dispatcher.h"

#include <algorithm>
#include <unordered_map>

#include "common/frame.h"
#include "common/log.h"
#include "programs/corvelasticd/daemon_error.h"
#include "programs/corvelasticd/json_text.h"
#include "programs/corvelasticd/request_args.h"
#include "programs/corvelasticd/search.h"

namespace corvlumex {
namespace elasticd {
namespace {

constexpr Json::ArrayIndex kMaxUserCompound = 64;

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

struct Request {
  IndexRegistry& registry;
  const Json::Value& data;
  const PeerIdentity& peer;
  int backlog;
};

struct CommandInfo {
  Json::Value (*run)(const Request&);
  // Index-changing commands, and reads that bypass the access filter: root
  // and the service user only.
  bool changes_indexes;
  // Reads filtered by the asker's access, which root and the service user
  // may ask on behalf of another user ("as_user").
  bool acts_for_user = false;
};

Json::Value Empty() { return Json::Value(Json::objectValue); }

// The writer's turn at the index the request names ("id").
WriterTurn TurnAt(const Request& r, bool takes_writes) {
  return WriterTurn(r.registry.Get(NonEmptyString(r.data, "id")), takes_writes, r.backlog);
}

// Commits the index and tells its event handler what changed.
void CommitAndTell(WriterTurn& turn) {
  const CommitChanges changes = turn.store().Commit();
  if (turn.plugin() != nullptr) turn.plugin()->Committed(changes);
}

// ---- one function per command

Json::Value Search(const Request& r) { return RunSearch(r.registry, r.data, AccessFilter(r.peer)); }

Json::Value Suggest(const Request& r) { return RunSuggest(r.registry, r.data, AccessFilter(r.peer)); }

Json::Value IndexList(const Request& r) { return r.registry.List(); }

Json::Value IndexCreate(const Request& r) {
  const Json::Value settings = r.data.isMember("settings") ? RequiredObject(r.data, "settings") : Empty();
  const Json::Value handler = r.data.isMember("event_handler") ? RequiredObject(r.data, "event_handler") : Empty();
  Json::Value out(Json::objectValue);
  out["created"] = r.registry.Create(NonEmptyString(r.data, "id"), NonEmptyString(r.data, "path"),
                                     RequiredObject(r.data, "mappings"), settings, handler);
  return out;
}

Json::Value IndexDelete(const Request& r) {
  r.registry.Delete(NonEmptyString(r.data, "id"));
  return Empty();
}

Json::Value IndexPause(const Request& r) {
  r.registry.SetPaused(NonEmptyString(r.data, "id"), true);
  return Empty();
}

Json::Value IndexResume(const Request& r) {
  r.registry.SetPaused(NonEmptyString(r.data, "id"), false);
  return Empty();
}

Json::Value IndexConfigSet(const Request& r) {
  const Json::Value& changes = RequiredObject(r.data, "data");
  const std::string new_id = OptionalString(changes, "id", "");
  const std::string new_path = OptionalString(changes, "path", "");
  if (new_id.empty() && new_path.empty()) throw DaemonError(kCodeBadArgument, "\"data\" needs a new \"id\" or \"path\"");
  r.registry.Configure(NonEmptyString(r.data, "id"), new_id, new_path);
  return Empty();
}

Json::Value DocumentUpsertById(const Request& r) {
  WriterTurn turn = TurnAt(r, true);
  turn.store().Upsert(NonEmptyString(r.data, "doc_id"), RequiredObject(r.data, "data"));
  return Empty();
}

Json::Value DocumentSetById(const Request& r) {
  WriterTurn turn = TurnAt(r, true);
  turn.store().SetById(NonEmptyString(r.data, "doc_id"), RequiredObject(r.data, "data"));
  return Empty();
}

Json::Value DocumentDelById(const Request& r) {
  WriterTurn turn = TurnAt(r, true);
  Json::Value out(Json::objectValue);
  out["deleted"] = turn.store().DeleteById(NonEmptyString(r.data, "doc_id")) ? 1 : 0;
  return out;
}

Json::Value DocumentDelByQuery(const Request& r) {
  WriterTurn turn = TurnAt(r, true);
  const Query query = Query::Parse(QueryClause(r.data), turn.store().schema());
  Json::Value out(Json::objectValue);
  out["deleted"] = static_cast<Json::Int64>(turn.store().DeleteByQuery(query));
  return out;
}

Json::Value DocumentGetByQuery(const Request& r) {
  // Read through the writer so a rename sees its own uncommitted writes.
  WriterTurn turn = TurnAt(r, false);
  const Query query = Query::Parse(QueryClause(r.data), turn.store().schema());
  std::vector<std::string> fields = OptionalStrings(QueryObject(r.data), "load_field");
  if (fields.empty()) fields = OptionalStrings(r.data, "load_field");
  return turn.store().GetByQuery(query, fields);
}

Json::Value Commit(const Request& r) {
  WriterTurn turn = TurnAt(r, false);
  CommitAndTell(turn);
  return Empty();
}

Json::Value UpdateTermSuggestion(const Request& r) {
  const std::string id = r.data.isMember("id") ? NonEmptyString(r.data, "id") : NonEmptyString(r.data, "db_name");
  WriterTurn turn(r.registry.Get(id), true, r.backlog);
  turn.store().UpdateSuggestions(NonEmptyString(r.data, "doc_id_field"));
  // Suggestions are for searches, which see committed data only.
  CommitAndTell(turn);
  return Empty();
}

// Built once: every request looks its command up here.
const std::unordered_map<std::string, CommandInfo>& Commands() {
  static const auto* const commands = new std::unordered_map<std::string, CommandInfo>{
      {"search", {Search, false, true}},
      {"suggest", {Suggest, false, true}},
      {"index_list", {IndexList, false}},
      {"index_create", {IndexCreate, true}},
      {"index_delete", {IndexDelete, true}},
      {"index_pause", {IndexPause, true}},
      {"index_resume", {IndexResume, true}},
      {"index_config_set", {IndexConfigSet, true}},
      {"document_upsert_by_id", {DocumentUpsertById, true}},
      {"document_set_by_id", {DocumentSetById, true}},
      {"document_del_by_id", {DocumentDelById, true}},
      {"document_del_by_query", {DocumentDelByQuery, true}},
      {"document_get_by_query", {DocumentGetByQuery, true}},
      {"commit", {Commit, true}},
      {"update_term_suggestion", {UpdateTermSuggestion, true}},
  };
  return *commands;
}

}  // namespace

std::string Dispatcher::ErrorAnswer(int code, const std::string& message) { return JsonText(FailureAnswer(code, message)); }

bool Dispatcher::MayWrite(const PeerIdentity& peer) const {
  return peer.uid == 0 || std::find(options_.writer_uids.begin(), options_.writer_uids.end(), peer.uid) != options_.writer_uids.end();
}

std::string Dispatcher::Handle(std::string text, const PeerIdentity& peer) {
  Json::Value request;
  if (!ParseJsonText(text, &request)) return ErrorAnswer(kCodeBadRequest, "The request is not valid JSON");
  std::string().swap(text);
  return JsonText(HandleRequest(request, peer, false));
}

Json::Value Dispatcher::HandleRequest(const Json::Value& request, const PeerIdentity& peer, bool nested) {
  if (!request.isObject()) return FailureAnswer(kCodeBadRequest, "The request must be a JSON object");
  if (request.isMember("compound")) {
    if (nested) return FailureAnswer(kCodeBadRequest, "Compound requests cannot be nested");
    return HandleCompound(request["compound"], peer);
  }
  if (!request["command"].isString()) return FailureAnswer(kCodeBadRequest, "The request has no string \"command\"");
  const std::string command = request["command"].asString();
  const Json::Value& data = request["data"];
  if (!data.isNull() && !data.isObject()) return FailureAnswer(kCodeBadRequest, "\"data\" must be an object");
  return AnswerCommand(command, data.isNull() ? Json::Value(Json::objectValue) : data, peer);
}

Json::Value Dispatcher::HandleCompound(const Json::Value& elements, const PeerIdentity& peer) {
  if (!elements.isArray()) return FailureAnswer(kCodeBadRequest, "\"compound\" must be an array of requests");
  // The library renames a folder's descendants in one compound of any
  // size; anybody else's compound is bounded, or one frame could carry a
  // million searches.
  if (!MayWrite(peer) && elements.size() > kMaxUserCompound) {
    return FailureAnswer(kCodeBadRequest, "A compound request may hold at most " + std::to_string(kMaxUserCompound) +
                                                         " requests; send the others separately");
  }
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

Json::Value Dispatcher::AnswerCommand(const std::string& command, const Json::Value& data, const PeerIdentity& peer) {
  try {
    return Success(Run(command, data, peer));
  } catch (const DaemonError& error) {
    return FailureAnswer(error.code(), error.what());
  } catch (const std::exception& error) {
    CORV_LOG("%s failed unexpectedly: %s", command.c_str(), error.what());
    return FailureAnswer(kCodeInternal, std::string("Internal error: ") + error.what());
  }
}

Json::Value Dispatcher::Run(const std::string& command, const Json::Value& data, const PeerIdentity& peer) {
  const auto found = Commands().find(command);
  if (found == Commands().end()) throw DaemonError(kCodeUnknownCommand, "Unknown command \"" + command + "\"");
  if (found->second.changes_indexes && !MayWrite(peer)) {
    throw DaemonError(kCodePermissionDenied, "\"" + command + "\" is allowed to root and the service user only");
  }
  if (!data.isMember("as_user")) return found->second.run(Request{registry_, data, peer, options_.max_writer_backlog});
  // A front end (the web daemon) searching for a signed-in user: the filter
  // runs here, before paging, with that user's own ids and groups.
  if (!found->second.acts_for_user) throw DaemonError(kCodeBadArgument, "\"as_user\" is taken by search and suggest only");
  if (!MayWrite(peer)) throw DaemonError(kCodePermissionDenied, "\"as_user\" is allowed to root and the service user only");
  const std::string name = RequiredString(data, "as_user");
  PeerIdentity user;
  if (!IdentityOfUser(name, &user)) throw DaemonError(kCodeBadArgument, "\"as_user\": no such user \"" + name + "\"");
  return found->second.run(Request{registry_, data, user, options_.max_writer_backlog});
}

}  // namespace elasticd
}  // namespace corvlumex
