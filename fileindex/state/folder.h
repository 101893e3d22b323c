// One indexed folder: which folder (in share form, /share/dir), its display
// name, which kinds of content are indexed in it, and its state flags. Held
// by shared pointers in FolderMgr's list and by callers.
#pragma once

#include <json/json.h>

#include <string>

#include "common/export.h"

CORVLUMEX_API_BEGIN

namespace corvlumex {
namespace fileindex {

class Folder {
 public:
  Folder(const std::string& path, const std::string& name, bool document, bool audio, bool video, bool photo,
         bool privileged, bool paused);
  // From the stored form. Throws Error 120 (GetJsonValue) for a non-object
  // or a missing or mistyped "path", "name", "document", "audio", "video"
  // or "photo"; "privileged", "paused" (false) and "volume_to_be_clean"
  // (empty) are optional.
  explicit Folder(const Json::Value& data);

  const std::string& GetPath() const { return path_; }
  // Share name, derived from the path on first use (Error 120 for a path
  // without the leading "/").
  std::string GetShare() const;
  // Absolute path, derived on first use from the share's record (Error 800
  // for an unknown share). Kept as derived: SetShare does not change it.
  std::string GetFullPath() const;
  // Moves the folder to another share name: the path's share component is
  // replaced and the share cache set. The full-path cache stays as it was;
  // a caller that needs the new full path makes a fresh Folder.
  void SetShare(const std::string& new_share);

  const std::string& GetName() const { return name_; }
  bool IsDocument() const { return document_; }
  bool IsAudio() const { return audio_; }
  bool IsVideo() const { return video_; }
  bool IsPhoto() const { return photo_; }
  bool IsPrivileged() const { return privileged_; }
  bool IsPaused() const { return paused_; }
  const std::string& GetVolumeToBeClean() const { return volume_to_be_clean_; }
  void SetPaused(bool paused) { paused_ = paused; }
  void SetPrivileged(bool privileged) { privileged_ = privileged; }
  void SetVolumeToBeClean(const std::string& volume) { volume_to_be_clean_ = volume; }

  // The stored form: "path", "name", "document", "audio", "video", "photo",
  // "paused", "privileged", "volume_to_be_clean".
  Json::Value GetData() const;
  // The stored form as one line of JSON text with the members in that
  // order (a Json::Value object keeps its members sorted by name).
  std::string GetStoredText() const;
  // {"document", "audio", "video", "photo"}.
  Json::Value GetIndexCfg() const;

  // True while the share's queue still holds an event on this folder or
  // below it.
  bool IsIndexing() const;
  // out["text"]: "error" (with out["desc"] "invalid_path"), "need_reindex",
  // "finished", "processing" or "paused", the first that applies.
  void GetStatus(Json::Value& out) const;
  // GetData() plus out["additional"][name] for each name of the array
  // `additional`; "status" is the only name known. Error 120 otherwise.
  Json::Value GetDataWithAdditional(const Json::Value& additional) const;

 private:
  std::string path_;
  std::string name_;
  std::string volume_to_be_clean_;
  bool document_ = false;
  bool audio_ = false;
  bool video_ = false;
  bool photo_ = false;
  bool privileged_ = false;
  bool paused_ = false;
  mutable std::string share_;      // empty: not derived yet
  mutable std::string full_path_;  // empty: not derived yet
};

}  // namespace fileindex
}  // namespace corvlumex

CORVLUMEX_API_END
