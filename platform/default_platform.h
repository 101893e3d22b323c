// The platform that Current() installs when none was installed: made by the
// implementation this build runs on (platform/linux/default_platform.cc), so
// the interface's own file names no implementation.
#pragma once

#include <memory>

#include "platform/platform.h"

namespace corvlumex {
namespace platform {

std::shared_ptr<Platform> MakeDefaultPlatform();

}  // namespace platform
}  // namespace corvlumex
