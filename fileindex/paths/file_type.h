// File classification by extension: what kind of file a user would say a
// path is, for search filters and result icons.
#pragma once

#include <string>
#include <vector>

#include "common/export.h"

CORVLUMEX_API_BEGIN

namespace corvlumex {
namespace fileindex {

// The numbers are stable: they are stored and compared by clients.
enum FileType : int {
  kFileTypeDocument = 0,
  kFileTypeAudio = 1,
  kFileTypeVideo = 2,
  kFileTypeImage = 3,
  kFileTypeUnknown = 4,
};

// Type of a lower-cased extension without the dot ("pdf"); unknown for others.
FileType GetFileTypeByExtension(const std::string& extension);

// Type of a path by its file name's extension, in any letter case.
FileType GetFileTypeByFullPath(const std::string& full_path);

// The category names "document", "audio", "video", "photo" and "unknown".
const char* FileTypeName(FileType type);

// The type of a category name ("document", "audio", "video", "photo");
// false for any other name.
bool GetFileTypeByCategory(const std::string& category, FileType* type);

// Every extension of a category, sorted; empty for an unknown category.
std::vector<std::string> GetExtensionsByCategory(const std::string& category);

}  // namespace fileindex
}  // namespace corvlumex

CORVLUMEX_API_END
