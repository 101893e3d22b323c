#include "platform/default_platform.h"

#include "platform/linux/linux_platform.h"

namespace corvlumex {
namespace platform {

std::shared_ptr<Platform> MakeDefaultPlatform() { return std::make_shared<LinuxPlatform>(); }

}  // namespace platform
}  // namespace corvlumex
