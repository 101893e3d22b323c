// The one process-wide mutex that serialises calls into the platform's share
// and user services, which are not thread-safe.
#pragma once

#include "common/export.h"
#include "common/mutex.h"

CORVLUMEX_API_BEGIN

namespace corvlumex {
namespace sdk {

Mutex& SDKMutex();

}  // namespace sdk
}  // namespace corvlumex

CORVLUMEX_API_END
