// The appliance's platform services as one interface. The library never asks
// the operating system a platform question directly: it asks Current(), which
// is the Linux implementation unless a test or program installed another.
#pragma once

#include <json/json.h>
#include <sys/types.h>

#include <memory>
#include <string>

namespace corvlumex {
namespace platform {

struct UserRecord {
  std::string name;
  uid_t uid = 0;
  gid_t gid = 0;
  std::string home;
};

// Options of a file copy.
struct CopyArgs {
  bool keep_attributes = false;  // keep mode, owner and times where allowed
  bool move = false;             // remove the source once the copy is complete
};

class Platform {
 public:
  virtual ~Platform() = default;

  // --- Files and users (foundations) ---
  // Permission bits (R_OK | W_OK | X_OK) the calling identity holds on `path`,
  // ACLs included; negative when the path cannot be examined.
  virtual int AclPermGet(const std::string& path) = 0;
  // >0 when `path` is a mount point, 0 when not, <0 on failure.
  virtual int DirIsMountPoint(const std::string& path) = 0;
  // 0 on success, negative on failure. `flags` is reserved (1 = overwrite).
  virtual int FileCopy(const std::string& src, const std::string& dst, const CopyArgs& args, int flags) = 0;
  // Looks a user up by name; false when unknown. In a sandbox root, "root"
  // and "CorvLumex" stand for the user running the process.
  virtual bool UserGet(const std::string& name, UserRecord* user) = 0;

  // --- Content extraction ---
  // Fills `document` with the search fields of `path`; options carry
  // "need_meta". Throws on failure.
  virtual void ParseFile(const std::string& path, const Json::Value& options, Json::Value& document) = 0;
};

// The installed platform (the Linux implementation by default).
std::shared_ptr<Platform> Current();
// Replaces the installed platform; an empty pointer restores the default.
void Install(std::shared_ptr<Platform> platform);

}  // namespace platform
}  // namespace corvlumex
