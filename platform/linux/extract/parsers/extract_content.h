// What the worker does with one file: picks the parser by the name's
// extension (or, for an unknown extension, by the content's media type) and
// returns the content fields. Runs inside the confined worker process; the
// parsers trust nothing in the file, but the process boundary is what keeps
// a parser's fault away from the indexer.
#pragma once

#include <json/json.h>

#include <string>

namespace corvlumex {
namespace platform {
namespace extract {

// Loads the media-type database (before confinement: it is a file to open).
void InitContentDetection();

// The content fields of the regular file open on `fd`. The text of a
// document always; the audio, photo and video fields with `need_meta`.
// Throws std::exception (ExtractError with a clear message, or a library's
// own) when the file cannot be understood. At most `text_cap` bytes of text
// are kept.
Json::Value ExtractContent(int fd, const std::string& name, bool need_meta, size_t text_cap);

}  // namespace extract
}  // namespace platform
}  // namespace corvlumex
