// Plain text read in the indexer's own process. Most files of a file server
// full of sources and notes are small UTF-8 text: reading them needs no
// parser library, only a check that the bytes are UTF-8, so they skip the
// confined worker's round trip and libmagic's content heuristics (most of
// the time such a file used to cost). Anything that would need a parser or
// an encoding guess — another encoding, a byte-order mark of UTF-16 or
// UTF-32, zero bytes, a large file — still goes to the worker.
#pragma once

#include <json/json.h>

#include <cstddef>
#include <string>
#include <unordered_set>

namespace corvlumex {
namespace platform {
namespace extract {

// Extensions (lower case, without the dot) of files read as plain text.
const std::unordered_set<std::string>& PlainTextExtensions();

// The largest file read here; larger ones go to the worker, so that the
// indexer never holds more than this of one file's bytes.
constexpr size_t kInProcessTextBytes = 1u << 20;

// For a regular file open on `fd` of `size` bytes named `name`: when its
// extension is a plain-text one and its bytes are UTF-8 without zero bytes,
// fills `fields` exactly as the worker would with its text content and,
// from the name, its media type, and returns true. False (nothing filled)
// when the file needs the worker. Throws Error 914 when it cannot be read.
bool ReadPlainTextInProcess(int fd, const std::string& name, size_t size, size_t text_cap, Json::Value& fields);

// The media type of a plain-text file named by its extension: the language
// for sources ("text/x-c", "text/x-perl"), otherwise "text/plain".
std::string PlainTextMediaType(const std::string& extension);

}  // namespace extract
}  // namespace platform
}  // namespace corvlumex
