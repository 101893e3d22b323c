// The failure codes the daemon answers with, and the exception that carries
// one from deep inside a command to the answer envelope.
#pragma once

#include <stdexcept>
#include <string>

namespace corvlumex {
namespace elasticd {

// Every code is part of the wire protocol (docs/corvelasticd.md lists them).
// 1400 and 1401 are the busy codes the library retries on.
enum DaemonCode : int {
  kCodeBusy = 1400,             // writes cannot be taken now (paused index, writer backlog, too many clients)
  kCodeOpening = 1401,          // the index is still being opened
  kCodeBadRequest = 2000,       // not JSON, not an object, no "command"
  kCodeUnknownCommand = 2001,   // "command" names nothing the daemon knows
  kCodeBadArgument = 2002,      // a member of "data" is missing or has the wrong type
  kCodeFrameTooLarge = 2003,    // the frame is longer than the daemon accepts
  kCodePermissionDenied = 2004, // an index-changing command from an ordinary user
  kCodeIndexNotFound = 2010,
  kCodeIndexExists = 2011,      // index_create / index_config_set onto an id or path already in use
  kCodeIndexPath = 2012,        // the index directory cannot be created, moved or removed
  kCodeBadMappings = 2013,
  kCodeIndexFailed = 2014,      // the index could not be opened (damaged database, ...)
  kCodeDocumentNotFound = 2020,
  kCodeBadDocument = 2021,      // a document field has the wrong type, or a required one is missing
  kCodeBadQuery = 2030,
  kCodeStorage = 2040,          // the database failed
  kCodeNoSpace = 2041,          // the database's volume is full
  kCodeInternal = 2099,
};

class DaemonError : public std::runtime_error {
 public:
  DaemonError(int code, const std::string& message) : std::runtime_error(message), code_(code) {}
  int code() const { return code_; }

 private:
  int code_;
};

}  // namespace elasticd
}  // namespace corvlumex
