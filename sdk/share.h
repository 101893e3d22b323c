// One share's platform record, owned for the wrapper's lifetime, and the
// questions the library asks about it. Every platform call is made under
// SDKMutex(); failures are Error exceptions (800 unknown share, 502 a failed
// query, 121 enumeration).
#pragma once

#include <cstdint>
#include <memory>
#include <set>
#include <string>

#include "common/export.h"
#include "platform/platform.h"

CORVLUMEX_API_BEGIN

namespace corvlumex {
namespace sdk {

class SDKShare {
 public:
  // Throws Error 800 when the share does not exist or its record is unreadable.
  explicit SDKShare(const std::string& share_name);
  ~SDKShare();
  SDKShare(const SDKShare&) = delete;
  SDKShare& operator=(const SDKShare&) = delete;

  // Neither encrypted nor read-only.
  bool CanBeIndexed() const;
  bool IsEncryption() const;
  bool IsEnableRecycleBin() const;
  // True only for a definite "hide unreadable"; a failed query is false.
  bool IsHideUnReadable() const;
  // False only when the platform reports a lack of space (volume or quota)
  // for 100 MiB; an unclear answer is true. Never throws.
  bool IsSpaceEnough() const;
  // platform::SharePrivilege of `user` on this share, as the platform says.
  int GetPrivilege(const std::string& user) const;
  // platform::FtpPrivilegeBits of this share.
  uint32_t GetFTPPrivilege() const;
  // The share's event queue file.
  std::string GetQueuePath() const;
  // The directory of the share's index database.
  std::string GetDBPath() const;
  // The share's index name ("fileindex_" + share name).
  std::string GetDBName() const;

  // The share's name and its own directory (/volume1/photo), from the record.
  const std::string& GetName() const;
  const std::string& GetPath() const;

  // Names of all shares, sorted. Throws Error 121.
  static std::set<std::string> Enum();

 private:
  std::unique_ptr<platform::ShareInfo> share_info_;
};

}  // namespace sdk
}  // namespace corvlumex

CORVLUMEX_API_END
