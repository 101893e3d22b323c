#include "fileindex/elastic/elastic_control.h"

#include <sys/stat.h>

#include <cerrno>
#include <chrono>
#include <cstdlib>
#include <utility>

#include "common/error.h"
#include "common/file_util.h"
#include "common/json_util.h"
#include "common/log.h"
#include "common/path_below.h"
#include "common/sys.h"
#include "fileindex/elastic/comm.h"
#include "fileindex/elastic/schema.h"
#include "fileindex/queue/custom_event.h"
#include "fileindex/state/constants.h"
#include "fileindex/state/status_mgr.h"
#include "platform/platform.h"
#include "sdk/share.h"

namespace corvlumex {
namespace fileindex {
namespace elastic {
namespace {

// After this many busy answers in a row the daemon is probably starved of
// memory, which only an administrator can fix.
constexpr unsigned int kBusyRetriesBeforeNotice = 10;

// {"command": command, "data": {"id": <index of share>}}
Json::Value MakeRequest(const std::string& command, const std::string& share) {
  Json::Value req(Json::objectValue);
  req["command"] = command;
  req["data"]["id"] = GetFileIndexID(share);
  return req;
}

// Matches the documents below folder `path`. The trailing "/" keeps a sibling
// whose name merely begins with the folder's name (b2 next to b) out.
Json::Value DescendantsQuery(const std::string& path) {
  Json::Value query(Json::objectValue);
  query["qsl"]["prefix"][kFieldPath] = PrefixOfPathsBelow(path);
  return query;
}

Json::Value LoadFields(std::initializer_list<const char*> fields) {
  Json::Value list(Json::arrayValue);
  for (const char* field : fields) list.append(field);
  return list;
}

// The query answer's document list; Error 916 when there is none.
const Json::Value& QueryDocuments(const Json::Value& res, const std::string& prefix) {
  CORV_CHECK_THROW(!res.isMember("data") || !res["data"].isArray(), kErrorQueryAnswer,
                   "No document list in the answer, prefix=" + prefix + "/");
  return res["data"];
}

// Name search runs on its own field, analysed for matches inside names: a
// copy of the name, wherever a document's name is written.
void AddSearchName(Json::Value& document) { document[kFieldSearchFileName] = document[kFieldFSName]; }

// The document of `path` as the platform's content extraction sees it.
Json::Value ExtractDocument(const std::string& path, bool need_meta) {
  Json::Value options(Json::objectValue);
  options[kOptionNeedMeta] = need_meta;
  Json::Value document;
  try {
    platform::Current()->ParseFile(path, options, document);
  } catch (const std::exception& e) {
    // The caller learns which file failed; the log keeps the extractor's why.
    CORV_LOG_FN("Parse failed, path=%s, reason=%s", path.c_str(), e.what());
    throw Error(kErrorParseDocument, "Parse failed, path=" + path);
  } catch (...) {
    CORV_LOG_FN("Parse failed, path=%s, reason=unknown exception", path.c_str());
    throw Error(kErrorParseDocument, "Parse failed, path=" + path);
  }
  CORV_CHECK_THROW(!document.isObject(), kErrorParseDocument, "Parse failed, path=" + path);
  AddSearchName(document);
  // The names of one file find each other by it, so that a change through
  // one of its hard links reaches them all.
  struct stat st;
  if (lstat(path.c_str(), &st) == 0 && !S_ISDIR(st.st_mode)) document[kFieldFileID] = FileIdentity(st.st_dev, st.st_ino);
  errno = 0;
  return document;
}

// The document is moved into the request: a large text is held once less.
Json::Value DocumentRequest(const std::string& command, const std::string& share, const std::string& path,
                            Json::Value document) {
  Json::Value req = MakeRequest(command, share);
  req["data"]["doc_id"] = path;
  req["data"]["data"] = std::move(document);
  return req;
}

void SendDocument(const std::string& command, const std::string& share, const std::string& path,
                  Json::Value document) {
  SendRequestNoResult(DocumentRequest(command, share, path, std::move(document)));
}

// Calls `attempt` until it does not fail with a busy code, sleeping 15 to 19
// minutes between attempts; after the 10th retry the administrators are
// told, once, that memory is lacking.
template <typename Attempt>
void RetryWhileBusy(const Attempt& attempt, const std::string& command, const std::string& db) {
  unsigned int retry = 0;
  bool notified = false;
  for (;;) {
    try {
      attempt();
      return;
    } catch (const Error& error) {
      if (!IsElasticBusyCode(error.code)) throw error;
      CORV_LOG("Retry[%u] since corvelasticd is busy. Command: %s, db: %s", retry, command.c_str(), db.c_str());
    }
    ++retry;
    if (retry > kBusyRetriesBeforeNotice && !notified) {
      NotifyLackOfMemory();
      notified = true;
    }
    // Spread the retries of several waiting callers apart.
    SleepFor(std::chrono::seconds(900 + 60 * (rand() % 5)));
  }
}

}  // namespace

std::string GetFileIndexID(const std::string& share_name) { return "fileindex_" + share_name; }

void SendRequestWithRetry(Json::Value& res, const Json::Value& req) {
  RetryWhileBusy([&] { SendRequestImpl(res, req); }, req["command"].asString(), req["data"]["id"].asString());
}

void SendRequestWithPatience(Json::Value& res, const Json::Value& req, std::chrono::milliseconds patience) {
  const auto give_up = std::chrono::steady_clock::now() + patience;
  for (;;) {
    try {
      SendRequestImpl(res, req);
      return;
    } catch (const Error& error) {
      if (!IsElasticBusyCode(error.code) || std::chrono::steady_clock::now() >= give_up) throw;
    }
    SleepFor(std::chrono::milliseconds(250));
  }
}

void SendRequestNoResult(const Json::Value& req) {
  Json::Value res;
  SendRequestWithRetry(res, req);
}

bool IsIndexReady(const std::string& share) {
  Json::Value req(Json::objectValue);
  req["command"] = "index_list";
  Json::Value res;
  try {
    SendRequestImpl(res, req);
  } catch (const Error& error) {
    // Not running, or not taking requests yet. Any other answer is for the
    // real requests to meet and report.
    return error.code != kErrorSearchRequest && !IsElasticBusyCode(error.code);
  }
  const std::string id = GetFileIndexID(share);
  for (const Json::Value& index : res["data"]) {
    if (index.isObject() && index["id"] == id) return index["state"] != "opening";
  }
  return true;  // no such index: its requests fail at once, not busy
}

void ShareIndexCreate(const std::string& share) {
  Json::Value req = MakeRequest("index_create", share);
  req["data"]["path"] = sdk::SDKShare(share).GetDBPath();
  req["data"]["settings"] = GetFileIndexSettings();
  req["data"]["mappings"] = GetFileIndexMappings();
  req["data"]["event_handler"] = GetFileIndexEventHandler();
  SendRequestNoResult(req);
}

void ShareIndexDelete(const std::string& share) { SendRequestNoResult(MakeRequest("index_delete", share)); }

void ShareIndexPause(const std::string& share) { SendRequestNoResult(MakeRequest("index_pause", share)); }

void ShareIndexResume(const std::string& share) { SendRequestNoResult(MakeRequest("index_resume", share)); }

void ShareIndexRename(const std::string& share_from, const std::string& share_to, const std::string& path) {
  Json::Value req = MakeRequest("index_config_set", share_from);
  req["data"]["data"]["id"] = GetFileIndexID(share_to);
  req["data"]["data"]["path"] = path;
  SendRequestNoResult(req);
}

void ShareIndexMigrate(const std::string& share, const std::string& path) {
  Json::Value req = MakeRequest("index_config_set", share);
  req["data"]["data"]["path"] = path;
  SendRequestNoResult(req);
}

void IndexDel(const std::string& share, const std::string& path) {
  Json::Value req = MakeRequest("document_del_by_id", share);
  req["data"]["doc_id"] = path;
  SendRequestNoResult(req);
}

void IndexDelDir(const std::string& share, const std::string& path) {
  Json::Value req = MakeRequest("document_del_by_query", share);
  req["data"]["query"] = DescendantsQuery(path);
  SendRequestNoResult(req);
}

void IndexUpsert(const std::string& share, const std::string& path, bool need_meta) {
  SendDocument("document_upsert_by_id", share, path, ExtractDocument(path, need_meta));
}

std::string IndexUpsertRequest(const std::string& share, const std::string& path, bool need_meta) {
  return JsonToString(DocumentRequest("document_upsert_by_id", share, path, ExtractDocument(path, need_meta)));
}

Json::Value SendRequestTexts(const std::vector<std::string>& requests) {
  Json::Value answers(Json::arrayValue);
  if (requests.empty()) return answers;
  std::vector<std::string_view> parts;
  parts.reserve(2 * requests.size() + 1);
  parts.emplace_back("{\"compound\":[");
  for (const std::string& request : requests) {
    if (parts.size() > 1) parts.emplace_back(",");
    parts.emplace_back(request);
  }
  parts.emplace_back("]}");
  RetryWhileBusy(
      [&] {
        Json::Value res;
        SendRequestTextImpl(res, parts);
        answers = CompoundOutcomes(res, requests.size());
        for (const Json::Value& answer : answers) {
          if (!answer["success"].asBool()) ThrowIfBusy(answer);
        }
      },
      "compound of " + std::to_string(requests.size()), "");
  return answers;
}

void IndexAttr(const std::string& share, const std::string& path) {
  SendDocument("document_set_by_id", share, path, ExtractDocument(path, false));
}

void IndexRename(const std::string& share, const std::string& path_from, const std::string& path_to) {
  Json::Value res;

  // The moved document keeps its key; only its path and name fields change.
  Json::Value fields(Json::objectValue);
  SetNameFields(path_to, fields);
  AddSearchName(fields);
  Json::Value set_req = MakeRequest("document_set_by_id", share);
  set_req["data"]["doc_id"] = path_from;
  set_req["data"]["data"] = fields;
  SendRequestWithRetry(res, set_req);

  const Json::Value descendants = IndexDocumentsBelow(share, path_from, {kFieldPath, kFieldFSName, kFieldParent});

  // Every descendant in one exchange. The prefix query guarantees that each
  // parent begins with path_from, so its head is replaced by position.
  const std::string index_id = GetFileIndexID(share);
  Json::Value compound(Json::arrayValue);
  for (const Json::Value& doc : descendants) {
    std::string child_name;
    std::string parent;
    GetJsonValue(child_name, doc, kFieldFSName, true);
    GetJsonValue(parent, doc, kFieldParent, true);
    const std::string new_parent = parent.replace(0, path_from.size(), path_to);
    Json::Value element(Json::objectValue);
    element["command"] = "document_set_by_id";
    element["data"]["id"] = index_id;
    element["data"]["doc_id"] = doc[kFieldPath];
    element["data"]["data"][kFieldParent] = new_parent;
    element["data"]["data"][kFieldPath] = new_parent + "/" + child_name;
    element["data"]["data"][kFieldSearchFileName] = child_name;
    compound.append(element);
  }
  Json::Value compound_req(Json::objectValue);
  compound_req["compound"] = compound;
  SendRequestNoResult(compound_req);
}

Json::Value IndexDocumentsBelow(const std::string& share, const std::string& path, std::initializer_list<const char*> fields) {
  Json::Value req = MakeRequest("document_get_by_query", share);
  req["data"]["query"] = DescendantsQuery(path);
  req["data"]["query"]["load_field"] = LoadFields(fields);
  Json::Value res;
  SendRequestWithRetry(res, req);
  QueryDocuments(res, path);
  return std::move(res["data"]);
}

void IndexGetByPrefixPath(const std::string& share, const std::string& prefix, std::vector<std::string>& paths) {
  for (const Json::Value& doc : IndexDocumentsBelow(share, prefix, {kFieldPath})) {
    std::string path;
    GetJsonValue(path, doc, kFieldPath, true);
    paths.push_back(path);
  }
}

std::string FileIdentity(dev_t device, ino_t inode) {
  return std::to_string(static_cast<unsigned long long>(device)) + ":" +
         std::to_string(static_cast<unsigned long long>(inode));
}

std::vector<std::string> IndexPathsOfFile(const std::string& share, dev_t device, ino_t inode) {
  Json::Value req = MakeRequest("document_get_by_query", share);
  const std::string identity = FileIdentity(device, inode);
  req["data"]["query"]["qsl"]["term"][kFieldFileID] = identity;
  req["data"]["query"]["load_field"] = LoadFields({kFieldPath});
  Json::Value res;
  SendRequestWithRetry(res, req);
  std::vector<std::string> paths;
  for (const Json::Value& doc : QueryDocuments(res, identity)) {
    if (doc[kFieldPath].isString()) paths.push_back(doc[kFieldPath].asString());
  }
  return paths;
}

void IndexCommit(const std::string& share) {
  try {
    SendRequestNoResult(MakeRequest("commit", share));
  } catch (const Error& error) {
    // A commit that fails on a full volume leaves the index behind the disk:
    // it must be rebuilt once there is room again.
    if (sdk::SDKShare(share).IsSpaceEnough()) throw error;
    StatusMgr().SetShareStatus(share, kShareStatusNeedReindex);
    throw Error(kErrorNoSpace, "Share (" + share + ") space not enough");
  }
}

void UpdateTermSuggestion(const std::string& db_name, const std::vector<std::string>& fields) {
  if (fields.empty()) return;
  Json::Value compound(Json::arrayValue);
  for (const std::string& field : fields) {
    Json::Value element(Json::objectValue);
    element["command"] = "update_term_suggestion";
    element["data"]["doc_id_field"] = field;
    element["data"]["db_name"] = db_name;
    compound.append(element);
  }
  Json::Value req(Json::objectValue);
  req["compound"] = compound;
  SendRequestNoResult(req);
}

}  // namespace elastic
}  // namespace fileindex
}  // namespace corvlumex
