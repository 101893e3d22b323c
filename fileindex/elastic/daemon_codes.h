// The failure codes corvelasticd answers with ("error": {"code", "msg"}).
// The daemon raises them and every client (the library's request channel,
// fileindexd, the command line, the web and Spotlight front ends) tells them
// apart by these names, so a code means the same on both ends of the socket.
// docs/corvelasticd.md lists them with what each covers.
#pragma once

#include "common/export.h"

CORVLUMEX_API_BEGIN

namespace corvlumex {
namespace elasticd {

constexpr int kCodeBusy = 1400;             // writes cannot be taken now (paused index, writer backlog, too many clients)
constexpr int kCodeOpening = 1401;          // the index is still being opened
constexpr int kCodeBadRequest = 2000;       // not JSON, not an object, no "command"
constexpr int kCodeUnknownCommand = 2001;   // "command" names nothing the daemon knows
constexpr int kCodeBadArgument = 2002;      // a member of "data" is missing or has the wrong type
constexpr int kCodeFrameTooLarge = 2003;    // the frame is longer than the daemon accepts
constexpr int kCodePermissionDenied = 2004; // an index-changing command from an ordinary user
constexpr int kCodeIndexNotFound = 2010;
constexpr int kCodeIndexExists = 2011;      // index_create / index_config_set onto an id or path already in use
constexpr int kCodeIndexPath = 2012;        // the index directory cannot be created, moved or removed
constexpr int kCodeBadMappings = 2013;
constexpr int kCodeIndexFailed = 2014;      // the index could not be opened (damaged database, ...)
constexpr int kCodeDocumentNotFound = 2020;
constexpr int kCodeBadDocument = 2021;      // a document field has the wrong type, or a required one is missing
constexpr int kCodeBadQuery = 2030;
constexpr int kCodeStorage = 2040;          // the database failed
constexpr int kCodeNoSpace = 2041;          // the database's volume is full
constexpr int kCodeInternal = 2099;

}  // namespace elasticd

// The daemon cannot take the request now (1400, 1401); callers treat both
// alike and ask again later.
inline bool IsElasticBusyCode(int code) { return code == elasticd::kCodeBusy || code == elasticd::kCodeOpening; }

}  // namespace corvlumex

CORVLUMEX_API_END
