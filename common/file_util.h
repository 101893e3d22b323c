// File-system helpers whose exact (sometimes unusual) semantics the path
// rules and the state files depend on.
#pragma once

#include <dirent.h>
#include <sys/types.h>

#include <string>

#include "common/export.h"

CORVLUMEX_API_BEGIN

namespace corvlumex {

// Regular file reached without following a final symbolic link.
bool IsFileExist(const std::string& path);
// Directory; a symbolic link counts only with follow_link, its target text
// tested as it stands (relative to the working directory), recursively.
bool IsDirExist(const std::string& path, bool follow_link);
// From the entry type; an unknown type is never taken for a directory.
bool IsDirentDir(const struct dirent* entry, const std::string& path);
bool StringStartWith(const std::string& text, const std::string& prefix);
// Text after the last "/" (empty for a trailing "/"; the whole text without "/").
std::string Basename(const std::string& path);
// Text before the last "/" (the whole text without "/"; empty for "/name").
std::string Dirname(const std::string& path);
// Text after the last "." of the base name; bytes lowered one by one.
std::string GetFileExtension(const std::string& path, bool lowercase);
// realpath, or empty on any failure.
std::string RealPath(const std::string& path);
// True when the file is gone afterwards (a missing file counts).
bool Unlink(const std::string& path);

// Replaces `path` with `content` so that a reader sees the old or the new
// file, never a part: temporary file beside it, fsync, rename, fsync dir.
bool WriteFileAtomically(const std::string& path, const std::string& content, mode_t mode);

}  // namespace corvlumex

CORVLUMEX_API_END
