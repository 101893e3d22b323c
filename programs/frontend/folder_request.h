// The folder records the management operations take, built the same way by
// every front end: a new folder indexes every category unless told
// otherwise, and a change keeps what it does not name.
#pragma once

#include <json/json.h>

#include <optional>
#include <string>

namespace corvlumex {
namespace frontend {

struct FolderChoice {
  std::string name;  // empty: the folder's own name (add) or unchanged (set)
  std::optional<bool> document, audio, video, photo;
};

// The record FolderAdd takes for `share_path` (/share/dir).
Json::Value NewFolderRecord(const std::string& share_path, const FolderChoice& choice);
// `current` (FolderGet's record) with the choices applied, for FolderSet.
Json::Value ChangedFolderRecord(Json::Value current, const FolderChoice& choice);

}  // namespace frontend
}  // namespace corvlumex
