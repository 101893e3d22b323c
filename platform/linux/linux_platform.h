// The platform on a Debian host: plain files, the kernel and systemd stand
// in for the appliance's own services.
#pragma once

#include "platform/platform.h"

namespace corvlumex {
namespace platform {

class LinuxPlatform : public Platform {
 public:
  int AclPermGet(const std::string& path) override;
  int DirIsMountPoint(const std::string& path) override;
  int FileCopy(const std::string& src, const std::string& dst, const CopyArgs& args, int flags) override;
  bool UserGet(const std::string& name, UserRecord* user) override;
  void ParseFile(const std::string& path, const Json::Value& options, Json::Value& document) override;
};

}  // namespace platform
}  // namespace corvlumex
