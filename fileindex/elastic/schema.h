// What the search daemon needs to create a share's index: the settings, the
// field mappings and the event-handler plug-in, plus the names of the
// document fields that the index commands write themselves.
#pragma once

#include <json/json.h>

#include "common/export.h"

CORVLUMEX_API_BEGIN

namespace corvlumex {
namespace fileindex {
namespace elastic {

// Document fields written by the index commands (the mappings list them all).
inline constexpr char kFieldPath[] = "CORVMDPath";  // the document key
inline constexpr char kFieldParent[] = "CORVMDParent";
inline constexpr char kFieldFSName[] = "CORVMDFSName";
inline constexpr char kFieldSearchFileName[] = "CORVMDSearchFileName";
inline constexpr char kFieldDisplayName[] = "CORVMDDisplayName";
inline constexpr char kFieldKind[] = "CORVMDKind";
inline constexpr char kFieldExtension[] = "CORVMDExtension";
// "<device>:<inode>" of a file: the names of one file (hard links) share it.
inline constexpr char kFieldFileID[] = "CORVMDFSFileID";
// Set by content extraction when the content could not be read (with the
// reason); the document then holds the file-system fields only.
inline constexpr char kFieldExtractionFailed[] = "CORVMDExtractionFailed";
inline constexpr char kFieldExtractionError[] = "CORVMDExtractionError";
// Content-extraction option: also extract the file's metadata.
inline constexpr char kOptionNeedMeta[] = "need_meta";

// The built-in source texts, tab-indented; exposed so their member order can
// be checked (a parsed Json::Value keeps members sorted by name).
extern const char kFileIndexMappingsText[];
extern const char kFileIndexEventHandlerText[];

// Each call parses the built-in text afresh and returns a new value; a text
// that does not parse is Error 502.
Json::Value GetFileIndexSettings();
Json::Value GetFileIndexMappings();
// {"lib_path": <handler library>}, the path relocated by the system root.
Json::Value GetFileIndexEventHandler();

}  // namespace elastic
}  // namespace fileindex
}  // namespace corvlumex

CORVLUMEX_API_END
