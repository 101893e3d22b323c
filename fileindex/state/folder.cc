#include "fileindex/state/folder.h"

#include <ctime>

#include "common/error.h"
#include "common/json_util.h"
#include "common/log.h"
#include "fileindex/paths/path_rules.h"
#include "fileindex/queue/queue_mgr.h"
#include "fileindex/state/constants.h"
#include "fileindex/state/status_mgr.h"
#include "sdk/share.h"

namespace corvlumex {
namespace fileindex {
namespace {

constexpr char kPath[] = "path";
constexpr char kName[] = "name";
constexpr char kDocument[] = "document";
constexpr char kAudio[] = "audio";
constexpr char kVideo[] = "video";
constexpr char kPhoto[] = "photo";
constexpr char kPaused[] = "paused";
constexpr char kPrivileged[] = "privileged";
constexpr char kVolumeToBeClean[] = "volume_to_be_clean";

// Member order of the stored form.
const char* const kStoredKeys[] = {kPath, kName, kDocument, kAudio, kVideo, kPhoto, kPaused, kPrivileged,
                                   kVolumeToBeClean};

template <typename T>
T Required(const Json::Value& data, const char* key) {
  T value{};
  GetJsonValue(value, data, key, true);
  return value;
}

template <typename T>
T Optional(const Json::Value& data, const char* key, T fallback) {
  GetJsonValue(fallback, data, key, false);
  return fallback;
}

}  // namespace

Folder::Folder(const std::string& path, const std::string& name, bool document, bool audio, bool video, bool photo,
               bool privileged, bool paused)
    : path_(path),
      name_(name),
      document_(document),
      audio_(audio),
      video_(video),
      photo_(photo),
      privileged_(privileged),
      paused_(paused) {}

// Members are initialised in declaration order, which is not the order in
// which the keys must be read (the first missing key is the one reported);
// the body reads them in the stored order instead.
Folder::Folder(const Json::Value& data) {
  path_ = Required<std::string>(data, kPath);
  name_ = Required<std::string>(data, kName);
  document_ = Required<bool>(data, kDocument);
  audio_ = Required<bool>(data, kAudio);
  video_ = Required<bool>(data, kVideo);
  photo_ = Required<bool>(data, kPhoto);
  privileged_ = Optional<bool>(data, kPrivileged, false);
  paused_ = Optional<bool>(data, kPaused, false);
  volume_to_be_clean_ = Optional<std::string>(data, kVolumeToBeClean, std::string());
}

std::string Folder::GetShare() const {
  if (share_.empty()) GetShareNameByPath(share_, path_);
  return share_;
}

std::string Folder::GetFullPath() const {
  if (full_path_.empty()) fileindex::GetFullPath(full_path_, path_);
  return full_path_;
}

void Folder::SetShare(const std::string& new_share) {
  const std::string old_share = GetShare();
  path_ = ReplacePathShare(path_, new_share, old_share);
  share_ = new_share;
}

Json::Value Folder::GetData() const {
  Json::Value data = GetIndexCfg();
  data[kPath] = path_;
  data[kName] = name_;
  data[kPaused] = paused_;
  data[kPrivileged] = privileged_;
  data[kVolumeToBeClean] = volume_to_be_clean_;
  return data;
}

std::string Folder::GetStoredText() const {
  const Json::Value data = GetData();
  std::string text = "{";
  for (const char* key : kStoredKeys) {
    if (text.size() > 1) text += ",";
    text += JsonToString(Json::Value(key)) + ":" + JsonToString(data[key]);
  }
  return text + "}";
}

Json::Value Folder::GetIndexCfg() const {
  Json::Value cfg(Json::objectValue);
  cfg[kDocument] = document_;
  cfg[kAudio] = audio_;
  cfg[kVideo] = video_;
  cfg[kPhoto] = photo_;
  return cfg;
}

bool Folder::IsIndexing() const {
  const sdk::SDKShare share(GetShare());
  QueueMgr queue(share.GetQueuePath());
  return queue.IsFullPathProcessing(GetFullPath());
}

void Folder::GetStatus(Json::Value& out) const {
  const StatusMgr status;
  if (!CanPathBeIndexed(path_)) {
    out["text"] = "error";
    out["desc"] = "invalid_path";
  } else if (status.GetShareStatus(GetShare()) & kShareStatusNeedReindex) {
    out["text"] = "need_reindex";
  } else if (!IsIndexing()) {
    out["text"] = "finished";
  } else {
    // -1 (never paused, or resumed) counts as a time long past.
    const long long resume_time = status.GetPauseInfo();
    const bool running = resume_time != 0 && static_cast<long long>(time(nullptr)) >= resume_time;
    out["text"] = running ? "processing" : "paused";
  }
}

Json::Value Folder::GetDataWithAdditional(const Json::Value& additional) const {
  Json::Value result = GetData();
  CORV_CHECK_THROW_TEXT(!additional.isArray(), "!addiitionals.isArray()", kErrorBadArgument,
                        JsonToString(additional));
  for (const Json::Value& it : additional) {
    CORV_CHECK_THROW(!it.isString(), kErrorBadArgument, JsonToString(it));
    const std::string name = it.asString();
    CORV_CHECK_THROW_TEXT(name != "status", "\"status\" != it.asString()", kErrorBadArgument,
                          "Unknown additioal: " + name);
    GetStatus(result["additional"]["status"]);
  }
  return result;
}

}  // namespace fileindex
}  // namespace corvlumex
