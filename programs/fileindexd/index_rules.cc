#include "programs/fileindexd/index_rules.h"

#include "common/file_util.h"
#include "common/path_below.h"
#include "fileindex/paths/file_type.h"
#include "fileindex/paths/path_rules.h"
#include "platform/platform.h"

namespace corvlumex {
namespace fileindexd {
namespace {

bool HasComponent(const std::string& path, const std::string& name) {
  const std::string needle = "/" + name;
  for (size_t pos = path.find(needle); pos != std::string::npos; pos = path.find(needle, pos + 1)) {
    const size_t end = pos + needle.size();
    if (end == path.size() || path[end] == '/') return true;
  }
  return false;
}

}  // namespace

IndexRules::IndexRules(const fileindex::FolderMgr& folders, const std::string& share_dir)
    : folders_(folders), share_dir_(share_dir) {}

bool IndexRules::IsExcludedName(const std::string& name) { return fileindex::IsSystemPreservedFileName(name); }

bool IndexRules::IsExcluded(const std::string& full_path) const {
  // Components below the share directory; the share's own path is the
  // administrator's choice and is not judged by name.
  size_t start = IsPathStrictlyBelow(full_path, share_dir_) ? share_dir_.size() + 1 : 1;
  while (start < full_path.size()) {
    size_t end = full_path.find('/', start);
    if (end == std::string::npos) end = full_path.size();
    if (end > start && IsExcludedName(full_path.substr(start, end - start))) return true;
    start = end + 1;
  }
  // The platform questions below read the share registry: ask them only
  // when the path names a bin or a snapshot at all.
  if (HasComponent(full_path, "#recycle") && fileindex::IsFullPathInRecycleBin(full_path)) return true;
  if (HasComponent(full_path, "#snapshot")) {
    const size_t pos = full_path.find("/#snapshot");
    int in_snapshot = 0;
    const std::string top = full_path.substr(0, pos + 10);
    if (platform::Current()->FhsPathInSnapshot(top, &in_snapshot) == 0 && in_snapshot == 1) return true;
  }
  return false;
}

std::string IndexRules::CategoryKey(const std::string& full_path) {
  switch (fileindex::GetFileTypeByFullPath(full_path)) {
    case fileindex::kFileTypeDocument: return "document";
    case fileindex::kFileTypeAudio: return "audio";
    case fileindex::kFileTypeVideo: return "video";
    case fileindex::kFileTypeImage: return "photo";
    default: return "";
  }
}

bool IndexRules::CategoryOn(const fileindex::Folder& folder, const std::string& full_path) {
  switch (fileindex::GetFileTypeByFullPath(full_path)) {
    case fileindex::kFileTypeDocument: return folder.IsDocument();
    case fileindex::kFileTypeAudio: return folder.IsAudio();
    case fileindex::kFileTypeVideo: return folder.IsVideo();
    case fileindex::kFileTypeImage: return folder.IsPhoto();
    default: return true;
  }
}

Verdict IndexRules::Judge(const std::string& full_path, bool is_dir) const {
  Verdict verdict;
  verdict.folder = folders_.GetMostSuitableCfg(full_path);
  if (!verdict.folder || IsExcluded(full_path)) return verdict;
  if (is_dir) {
    verdict.index = true;
    return verdict;
  }
  verdict.index = CategoryOn(*verdict.folder, full_path);
  verdict.need_meta = verdict.index && !CategoryKey(full_path).empty();
  return verdict;
}

}  // namespace fileindexd
}  // namespace corvlumex
