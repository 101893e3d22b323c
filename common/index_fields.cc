#include "common/index_fields.h"

#include "common/file_util.h"

namespace corvlumex {

void SetNameFields(const std::string& path, Json::Value& document) {
  const std::string name = Basename(path);
  // Taken from the name alone, folders included.
  const std::string extension = GetFileExtension(path, true);
  document[kFieldPath] = path;
  document[kFieldParent] = Dirname(path);
  document[kFieldFSName] = name;
  document[kFieldDisplayName] = name;
  document[kFieldExtension] = extension;
  document[kFieldKind] = extension;
}

}  // namespace corvlumex
