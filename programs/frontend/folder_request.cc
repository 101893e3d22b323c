#include "programs/frontend/folder_request.h"

#include "common/file_util.h"

namespace corvlumex {
namespace frontend {
namespace {

void ApplyCategories(Json::Value& folder, const FolderChoice& choice, bool fallback_on) {
  const auto pick = [&](const char* key, const std::optional<bool>& value) {
    folder[key] = value.has_value() ? *value : (fallback_on ? true : folder[key].asBool());
  };
  pick("document", choice.document);
  pick("audio", choice.audio);
  pick("video", choice.video);
  pick("photo", choice.photo);
}

}  // namespace

Json::Value NewFolderRecord(const std::string& share_path, const FolderChoice& choice) {
  Json::Value folder(Json::objectValue);
  folder["path"] = share_path;
  folder["name"] = choice.name.empty() ? Basename(share_path) : choice.name;
  ApplyCategories(folder, choice, true);
  return folder;
}

Json::Value ChangedFolderRecord(Json::Value current, const FolderChoice& choice) {
  if (!choice.name.empty()) current["name"] = choice.name;
  ApplyCategories(current, choice, false);
  return current;
}

}  // namespace frontend
}  // namespace corvlumex
