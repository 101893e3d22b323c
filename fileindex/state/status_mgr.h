// The status file: whether indexing as a whole is paused and until when, and
// a word of flag bits per share. A StatusMgr is a short-lived snapshot: the
// constructor loads the file, the changing operations take the status lock,
// change the loaded copy, save it whole and (pause, resume) tell fileindexd.
#pragma once

#include <json/json.h>

#include <string>

#include "common/export.h"

CORVLUMEX_API_BEGIN

namespace corvlumex {
namespace fileindex {

class StatusMgr {
 public:
  // Loads the status file; a missing file is an empty state. Throws Error
  // 504 when the file cannot be read or is not a JSON object. Takes no lock.
  StatusMgr();

  // The stored resume time: -1 not paused, 0 paused without end, else
  // paused until that time (seconds since the epoch).
  long long GetPauseInfo() const;
  // The flag bits of a share; 0 when none are stored.
  unsigned int GetShareStatus(const std::string& share) const;

  // Pauses indexing for `hours` hours (0: until resumed), saves and sends
  // "pause" {"resume_time": t} to fileindexd. Error 120 for a negative
  // length, before anything changes.
  void Pause(int hours);
  // Saves "resume_time" -1 and sends "resume" to fileindexd.
  void Resume();

  // OR / AND NOT the flag bits of a share, or drop its entry; each saves.
  void SetShareStatus(const std::string& share, unsigned int flags);
  void UnsetShareStatus(const std::string& share, unsigned int flags);
  void ClearShareStatus(const std::string& share);

  // Writes the file as user "root", mode 0644 (Error 505 / 502). Takes no
  // lock: the changing operations above hold it.
  void Save() const;

 private:
  Json::Value data_;
};

}  // namespace fileindex
}  // namespace corvlumex

CORVLUMEX_API_END
