#include "sdk/sdk_mutex.h"

namespace corvlumex {
namespace sdk {

Mutex& SDKMutex() {
  static Mutex mutex;
  return mutex;
}

}  // namespace sdk
}  // namespace corvlumex
