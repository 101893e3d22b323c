// Runs content extraction in a separate, confined worker process
// (corvcontentextractd --worker), so that a hostile or broken file can crash,
// hang or exhaust only the worker: the caller gets an Error for that one file
// and the next file gets a fresh worker.
#pragma once

#include <json/json.h>

#include <chrono>
#include <string>

#include "platform/linux/extract/parsers/text_sink.h"

namespace corvlumex {
namespace platform {
namespace extract {

struct ExtractLimits {
  std::chrono::milliseconds timeout{20000};  // wall-clock time per file
  unsigned int memory_mb = 1024;             // address space of a worker
  int files_per_worker = 256;                // a worker is replaced after this many files
  size_t text_cap = kTextContentCap;         // text content kept per file, bytes of UTF-8
};

// The defaults, changed by CORVLUMEX_EXTRACT_TIMEOUT_MS,
// CORVLUMEX_EXTRACT_MEMORY_MB and CORVLUMEX_EXTRACT_TEXT_MB (read at each
// call; bad values are ignored).
ExtractLimits CurrentExtractLimits();

// The worker program: $CORVLUMEX_EXTRACT_WORKER, else the one built in
// $FILEINDEX_BUILD_DIR (test runs), else corvcontentextractd beside the
// running program, else the one of the build tree the running program lies
// in (up to five folders up, the one holding CMakeCache.txt), else the
// package's install path (under the system root). Empty when none is
// executable.
std::string FindWorkerProgram();

// Extracts the content fields of the regular file open on `fd` (its full
// path is `path`) in a worker. Returns only fields of the content table with
// values of their declared type. Throws Error 914 naming what went wrong.
Json::Value ExtractInWorker(int fd, const std::string& path, bool need_meta);

// Ends every idle worker; the next extraction starts a new one with the
// environment of that moment.
void StopIdleExtractWorkers();

}  // namespace extract
}  // namespace platform
}  // namespace corvlumex
