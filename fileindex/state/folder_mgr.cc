#include "fileindex/state/folder_mgr.h"

#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <functional>

#include "common/error.h"
#include "common/file_util.h"
#include "common/json_util.h"
#include "common/log.h"
#include "common/path_below.h"
#include "common/sys.h"
#include "fileindex/paths/file_type.h"
#include "fileindex/paths/path_rules.h"
#include "fileindex/state/constants.h"
#include "sdk/credentials.h"

namespace corvlumex {
namespace fileindex {
namespace {

// Matches the folder whose share-form path is exactly `path`.
auto PathIs(const std::string& path) {
  return [&path](const std::shared_ptr<Folder>& folder) { return folder->GetPath() == path; };
}

// Orders two folders by one stored field; negative, zero or positive.
using FieldCompare = std::function<int(const Folder&, const Folder&)>;

int CompareText(const std::string& a, const std::string& b) {
  const size_t common = std::min(a.size(), b.size());
  for (size_t i = 0; i < common; ++i) {
    const int ca = tolower(static_cast<unsigned char>(a[i]));
    const int cb = tolower(static_cast<unsigned char>(b[i]));
    if (ca != cb) return ca < cb ? -1 : 1;
  }
  if (a.size() != b.size()) return a.size() < b.size() ? -1 : 1;
  return a.compare(b);
}

int CompareFlag(bool a, bool b) { return static_cast<int>(a) - static_cast<int>(b); }

bool FieldComparator(const std::string& sort_by, FieldCompare* compare) {
  using Text = const std::string& (Folder::*)() const;
  using Flag = bool (Folder::*)() const;
  const auto text = [compare](Text get) {
    *compare = [get](const Folder& a, const Folder& b) { return CompareText((a.*get)(), (b.*get)()); };
  };
  const auto flag = [compare](Flag get) {
    *compare = [get](const Folder& a, const Folder& b) { return CompareFlag((a.*get)(), (b.*get)()); };
  };
  if (sort_by == "path") text(&Folder::GetPath);
  else if (sort_by == "name") text(&Folder::GetName);
  else if (sort_by == "volume_to_be_clean") text(&Folder::GetVolumeToBeClean);
  else if (sort_by == "document") flag(&Folder::IsDocument);
  else if (sort_by == "audio") flag(&Folder::IsAudio);
  else if (sort_by == "video") flag(&Folder::IsVideo);
  else if (sort_by == "photo") flag(&Folder::IsPhoto);
  else if (sort_by == "paused") flag(&Folder::IsPaused);
  else if (sort_by == "privileged") flag(&Folder::IsPrivileged);
  else return false;
  return true;
}

}  // namespace

FolderMgr::FolderMgr() {
  const std::string path = SysPath(kFileIndexFoldersCfgPath);
  Json::Value folders;
  CORV_CHECK_THROW_TEXT(IsFileExist(path) && !JsonFromFile(folders, path),
                        "IsFileExist(kFileIndexFoldersCfgPath) && !folders.fromFile(kFileIndexFoldersCfgPath)",
                        kErrorLoadJson, "Cannot load json: " + path);
  // Valid JSON that is not a list is as unusable as a torn file.
  CORV_CHECK_THROW(!folders.isNull() && !folders.isArray(), kErrorLoadJson, "Cannot load json: " + path);
  for (const Json::Value& element : folders) {
    try {
      folders_.push_back(std::make_shared<Folder>(element));
    } catch (const Error& error) {
      // The JSON getters only throw; the line tells the administrator that
      // it is the folder file that holds the bad entry.
      CORV_CHECK_THROW_TEXT(true, "make_shared<Folder>(element)", error.code, error.reason);
    }
  }
}

void FolderMgr::Save() const {
  // Written by hand rather than through Json::Value so that each folder
  // keeps its stored member order; replaced atomically all the same.
  std::string text = "[";
  for (const std::shared_ptr<Folder>& folder : folders_) {
    if (text.size() > 1) text += ",";
    text += folder->GetStoredText();
  }
  text += "]\n";
  const sdk::SDKCredentials as_root("root");
  const std::string path = SysPath(kFileIndexFoldersCfgPath);
  CORV_CHECK_THROW_TEXT(!WriteFileAtomically(path, text, 0644), "!folders.toFile(kFileIndexFoldersCfgPath)",
                        kErrorSaveJson, path);
  CORV_CHECK_THROW_TEXT(-1 == chmod(path.c_str(), 0644), "-1 == chmod(kFileIndexFoldersCfgPath, 0644)", kErrorSystem,
                        path);
}

void FolderMgr::Get(std::shared_ptr<Folder>& folder, const std::string& path) const {
  const auto it = std::find_if(folders_.begin(), folders_.end(), PathIs(path));
  CORV_CHECK_THROW(it == folders_.end(), kErrorFolderNotFound, "Folder not found: " + path);
  folder = *it;
}

bool FolderMgr::HasFolder(const std::string& path) const {
  return std::any_of(folders_.begin(), folders_.end(), PathIs(path));
}

void FolderMgr::Upsert(std::shared_ptr<Folder>& old, std::shared_ptr<Folder> folder_new) {
  const std::shared_ptr<Folder> cfg = GetMostSuitableCfg(folder_new->GetFullPath());
  old = DiffCfg(folder_new, cfg);
  const std::string& path = folder_new->GetPath();
  folders_.erase(std::remove_if(folders_.begin(), folders_.end(), PathIs(path)), folders_.end());
  folders_.push_back(folder_new);
  CORV_CHECK_THROW(folders_.size() > kFileIndexFoldersMax, kErrorTooManyFolders);
}

void FolderMgr::Delete(std::shared_ptr<Folder>& removed, const std::string& path) {
  const auto it = std::find_if(folders_.begin(), folders_.end(), PathIs(path));
  CORV_CHECK_THROW(it == folders_.end(), kErrorFolderNotFound, "Folder not found: " + path);
  removed = *it;
  folders_.erase(it);
}

std::vector<std::shared_ptr<Folder>> FolderMgr::DeleteByShare(const std::string& share) {
  std::vector<std::shared_ptr<Folder>> removed;
  std::vector<std::shared_ptr<Folder>> kept;
  for (const std::shared_ptr<Folder>& folder : folders_) {
    (folder->GetShare() == share ? removed : kept).push_back(folder);
  }
  folders_.swap(kept);
  return removed;
}

void FolderMgr::List(std::vector<std::shared_ptr<Folder>>& folders, unsigned int& total, unsigned int offset,
                     unsigned int limit, const std::string& sort_by, const std::string& sort_direction) const {
  FieldCompare compare;
  CORV_CHECK_THROW_TEXT(!sort_by.empty() && !FieldComparator(sort_by, &compare), "!FieldComparator(sort_by)",
                        kErrorBadArgument, "Unknown sort key: " + sort_by);
  CORV_CHECK_THROW_TEXT(!sort_direction.empty() && sort_direction != "ASC" && sort_direction != "DESC",
                        "\"ASC\" != sort_direction && \"DESC\" != sort_direction", kErrorBadArgument,
                        "Unknown sort direction: " + sort_direction);
  std::vector<std::shared_ptr<Folder>> sorted = folders_;
  if (compare) {
    const bool descending = sort_direction == "DESC";
    std::stable_sort(sorted.begin(), sorted.end(),
                     [&compare, descending](const std::shared_ptr<Folder>& a, const std::shared_ptr<Folder>& b) {
                       const int order = compare(*a, *b);
                       return descending ? order > 0 : order < 0;
                     });
  }
  total = static_cast<unsigned int>(sorted.size());
  folders.clear();
  if (offset >= sorted.size()) return;
  const size_t end = limit == 0 ? sorted.size() : std::min<size_t>(sorted.size(), size_t{offset} + limit);
  folders.assign(sorted.begin() + offset, sorted.begin() + end);
}

std::set<std::string> FolderMgr::GetIndexedShares() const {
  std::set<std::string> shares;
  for (const std::shared_ptr<Folder>& folder : folders_) shares.insert(folder->GetShare());
  return shares;
}

bool FolderMgr::IsShareIndexed(const std::string& share) const {
  for (const std::shared_ptr<Folder>& folder : folders_) {
    std::string folder_share;
    GetShareNameByPath(folder_share, folder->GetPath());
    if (folder_share == share) return true;
  }
  return false;
}

std::shared_ptr<Folder> FolderMgr::GetMostSuitableCfg(const std::string& full_path) const {
  std::shared_ptr<Folder> best;
  size_t best_length = 0;
  for (const std::shared_ptr<Folder>& folder : folders_) {
    const std::string folder_full_path = folder->GetFullPath();
    if (!IsPathAtOrBelow(full_path, folder_full_path)) continue;
    // Strictly longer: on a tie the earlier folder stays.
    if (!best || folder_full_path.size() > best_length) {
      best = folder;
      best_length = folder_full_path.size();
    }
  }
  return best;
}

bool FolderMgr::IsFullPathIndexed(const std::string& full_path) const {
  return std::any_of(folders_.begin(), folders_.end(), [&full_path](const std::shared_ptr<Folder>& folder) {
    return IsPathAtOrBelow(full_path, folder->GetFullPath());
  });
}

bool FolderMgr::IsFullPathHasOwnCfg(const std::string& full_path) const {
  return std::any_of(folders_.begin(), folders_.end(),
                     [&full_path](const std::shared_ptr<Folder>& folder) { return folder->GetFullPath() == full_path; });
}

bool FolderMgr::IsFullPathNeedMeta(const std::string& full_path) const {
  const std::shared_ptr<Folder> folder = GetMostSuitableCfg(full_path);
  if (!folder) return false;
  switch (GetFileTypeByFullPath(full_path)) {
    case kFileTypeDocument:
      return folder->IsDocument();
    case kFileTypeAudio:
      return folder->IsAudio();
    case kFileTypeVideo:
      return folder->IsVideo();
    case kFileTypeImage:
      return folder->IsPhoto();
    default:
      return false;
  }
}

std::shared_ptr<Folder> FolderMgr::DiffCfg(std::shared_ptr<Folder> folder_new, std::shared_ptr<Folder> cfg) {
  if (!cfg) {
    return std::make_shared<Folder>(folder_new->GetPath(), folder_new->GetName(), true, true, true, true, false,
                                    false);
  }
  return std::make_shared<Folder>(folder_new->GetPath(), folder_new->GetName(),
                                  folder_new->IsDocument() != cfg->IsDocument(), folder_new->IsAudio() != cfg->IsAudio(),
                                  folder_new->IsVideo() != cfg->IsVideo(), folder_new->IsPhoto() != cfg->IsPhoto(),
                                  false, false);
}

}  // namespace fileindex
}  // namespace corvlumex
