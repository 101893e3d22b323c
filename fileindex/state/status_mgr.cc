#include "fileindex/state/status_mgr.h"

#include <sys/stat.h>

#include <cerrno>
#include <cstdint>
#include <cstring>
#include <ctime>

#include "common/error.h"
#include "common/file_util.h"
#include "common/json_util.h"
#include "common/lock_file.h"
#include "common/log.h"
#include "common/sys.h"
#include "fileindex/state/communication.h"
#include "fileindex/state/constants.h"
#include "sdk/credentials.h"

namespace corvlumex {
namespace fileindex {
namespace {

constexpr char kResumeTime[] = "resume_time";
constexpr char kShare[] = "share";
constexpr long long kNotPaused = -1;

// Every change holds the status lock across its save and, for pause and
// resume, across the command to the daemon.
LockFile StatusLock() { return LockFile(SysPath(kFileIndexStatusLockPath), true); }

}  // namespace

StatusMgr::StatusMgr() {
  const std::string path = SysPath(kFileIndexStatusCfgPath);
  CORV_CHECK_THROW_TEXT(IsFileExist(path) && !JsonFromFile(data_, path),
                        "IsFileExist(kFileIndexStatusCfgPath) && !data_.fromFile(kFileIndexStatusCfgPath)",
                        kErrorLoadJson, "Cannot load json: " + path);
  // Valid JSON of another shape would make every later read or write fail
  // in a less helpful way.
  CORV_CHECK_THROW(!data_.isNull() && !data_.isObject(), kErrorLoadJson, "Cannot load json: " + path);
}

long long StatusMgr::GetPauseInfo() const {
  long long resume_time = kNotPaused;
  GetJsonValue(resume_time, data_, kResumeTime, false);
  return resume_time;
}

unsigned int StatusMgr::GetShareStatus(const std::string& share) const {
  Json::Value shares;
  GetJsonValue(shares, data_, kShare, false);
  unsigned int flags = 0;
  GetJsonValue(flags, shares, share, false);
  return flags;
}

void StatusMgr::Pause(int hours) {
  const LockFile lock = StatusLock();
  CORV_CHECK_THROW(0 > hours, kErrorBadArgument, "Pause length should NOT be negative");
  // Unsigned 32-bit arithmetic on purpose: the daemon keeps the time so.
  uint32_t resume_time = 0;
  if (hours != 0) {
    resume_time = static_cast<uint32_t>(time(nullptr)) + static_cast<uint32_t>(hours) * 3600u;
  }
  data_[kResumeTime] = static_cast<Json::Int64>(resume_time);
  Save();
  Json::Value command(Json::objectValue);
  command[kResumeTime] = static_cast<Json::Int64>(resume_time);
  SendCommandToDaemon("pause", command);
}

void StatusMgr::Resume() {
  const LockFile lock = StatusLock();
  data_[kResumeTime] = static_cast<Json::Int64>(kNotPaused);
  Save();
  SendCommandToDaemon("resume", Json::Value());
}

void StatusMgr::SetShareStatus(const std::string& share, unsigned int flags) {
  const LockFile lock = StatusLock();
  data_[kShare][share] = GetShareStatus(share) | flags;
  Save();
}

void StatusMgr::UnsetShareStatus(const std::string& share, unsigned int flags) {
  const LockFile lock = StatusLock();
  data_[kShare][share] = GetShareStatus(share) & ~flags;
  Save();
}

void StatusMgr::ClearShareStatus(const std::string& share) {
  const LockFile lock = StatusLock();
  if (data_.isMember(kShare) && data_[kShare].isObject()) data_[kShare].removeMember(share);
  Save();
}

void StatusMgr::Save() const {
  const sdk::SDKCredentials as_root("root");
  const std::string path = SysPath(kFileIndexStatusCfgPath);
  // A state that never held anything is still written as an object.
  const Json::Value& stored = data_.isNull() ? Json::Value(Json::objectValue) : data_;
  CORV_CHECK_THROW_TEXT(!JsonToFile(stored, path), "!data_.toFile(kFileIndexStatusCfgPath)", kErrorSaveJson,
                        "Failed to save json: " + path);
  CORV_CHECK_THROW_TEXT(-1 == chmod(path.c_str(), 0644), "-1 == chmod(kFileIndexStatusCfgPath, 0644)", kErrorSystem,
                        std::string("chmod failed, reason=") + strerror(errno));
}

}  // namespace fileindex
}  // namespace corvlumex
