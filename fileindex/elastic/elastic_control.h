// Index commands: one search index per share, one document per file or
// folder keyed by its full path. Each command is one request to corvelasticd;
// a busy daemon is waited for without limit.
#pragma once

#include <json/json.h>
#include <sys/types.h>

#include <chrono>
#include <initializer_list>
#include <string>
#include <vector>

#include "common/export.h"

CORVLUMEX_API_BEGIN

namespace corvlumex {
namespace fileindex {
namespace elastic {

// "fileindex_" followed by the share name as it stands.
std::string GetFileIndexID(const std::string& share_name);

// Sends `req` until the daemon stops answering busy (1400/1401), sleeping
// 15 to 19 minutes between attempts; after the 10th retry the administrators
// are told, once, that memory is lacking. Other failures propagate.
void SendRequestWithRetry(Json::Value& res, const Json::Value& req);
// The same, for commands whose answer is not needed.
void SendRequestNoResult(const Json::Value& req);
// For a person waiting for an answer (a search typed at the command line, a
// status): a busy daemon, most often one still opening an index after its
// start, is asked again every quarter second for up to `patience`; then its
// busy error propagates, so the person is told to try again instead of
// waiting a quarter of an hour in silence.
void SendRequestWithPatience(Json::Value& res, const Json::Value& req,
                             std::chrono::milliseconds patience = std::chrono::seconds(10));

// False while the search daemon cannot take the share's requests at once:
// it does not run, or it is still opening the share's index after a start
// (a request would then be answered busy, which the busy retry waits out for
// a quarter of an hour). One request, without the busy retry.
bool IsIndexReady(const std::string& share);

// Share indexes.
void ShareIndexCreate(const std::string& share);
void ShareIndexDelete(const std::string& share);
void ShareIndexPause(const std::string& share);
void ShareIndexResume(const std::string& share);
// The index of `share_from` becomes the index of `share_to`, stored at `path`.
void ShareIndexRename(const std::string& share_from, const std::string& share_to, const std::string& path);
// The share's index database moves to `path`.
void ShareIndexMigrate(const std::string& share, const std::string& path);

// Documents. `path` is the full path, which is also the document key.
void IndexDel(const std::string& share, const std::string& path);
// Deletes the documents below the folder `path` (not the folder's own).
void IndexDelDir(const std::string& share, const std::string& path);
// Extracts the file's fields (with its metadata when `need_meta`) and
// stores them; Error 914 when the file cannot be extracted.
void IndexUpsert(const std::string& share, const std::string& path, bool need_meta);
// IndexUpsert's request, extracted and written out as text: the document's
// JSON value is gone before the text waits to be sent, so a large text is
// held once. Error 914 when the file cannot be extracted.
std::string IndexUpsertRequest(const std::string& share, const std::string& path, bool need_meta);
// Sends requests written out as text (IndexUpsertRequest's) in one compound
// exchange, retrying the whole while the daemon is busy, as
// SendRequestWithRetry does. Returns one answer per request, in order, each
// an object with a bool "success" and, when false, "error" {"code", "msg"}.
// A failure of the exchange itself is thrown.
Json::Value SendRequestTexts(const std::vector<std::string>& requests);
// Updates the file-system fields of an existing document.
void IndexAttr(const std::string& share, const std::string& path);
// Rewrites the path fields of the document at `path_from` and of every
// document below it. The documents keep their keys (the old full paths).
void IndexRename(const std::string& share, const std::string& path_from, const std::string& path_to);
// The documents below the folder `path` (not the folder's own), uncommitted
// writes included, each holding only `fields`; Error 916 when the answer
// carries no list.
Json::Value IndexDocumentsBelow(const std::string& share, const std::string& path, std::initializer_list<const char*> fields);
// Appends the paths of the documents below `prefix` to `paths`, in the
// daemon's order; Error 916 when the answer carries no list.
void IndexGetByPrefixPath(const std::string& share, const std::string& prefix, std::vector<std::string>& paths);
// The paths of the documents of one file, by its device and inode (every
// name of a file with hard links that the index holds).
std::vector<std::string> IndexPathsOfFile(const std::string& share, dev_t device, ino_t inode);
// "<device>:<inode>", the value of the file-identity field.
std::string FileIdentity(dev_t device, ino_t inode);
// Makes the share's changes durable. When that fails on a volume short of
// space, the share is marked for reindexing and Error 1003 is thrown.
void IndexCommit(const std::string& share);

// Rebuilds the term suggestions of the database `db_name` from each field,
// in one compound request; nothing is sent for an empty list.
void UpdateTermSuggestion(const std::string& db_name, const std::vector<std::string>& fields);

}  // namespace elastic
}  // namespace fileindex
}  // namespace corvlumex

CORVLUMEX_API_END
