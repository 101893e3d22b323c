#include "programs/corvnotifyd/loss_advice.h"

#include <fstream>

namespace corvlumex {
namespace notifyd {
namespace {

// One kernel limit: its sysctl, what reaching it means, when a new value
// takes effect, and the value proposed (a multiple of the one in force).
struct Limit {
  const char* key;
  const char* reached;      // what happened, before " at <key>=<value>"
  const char* in_force_is;  // which value that is
  const char* raised;       // after "it was raised to <value> since"
  const char* raise_then;   // after the proposed sysctl command
  long factor;
  long fallback;  // proposed when the value in force is unknown
};

constexpr Limit kQueueLength{"fs.inotify.max_queued_events", "the kernel's inotify event queue overflowed",
                             "the length in force since corvnotifyd started",
                             ", which takes effect when corvnotifyd is restarted",
                             ", then restart corvnotifyd, which reads it when it starts", 4, 65536};
constexpr Limit kWatches{"fs.inotify.max_user_watches", "the kernel has no inotify watch left",
                         "the limit when a watch was refused",
                         ", so the folders are watched again with the next crash marker", ", which takes effect at once",
                         2, 1048576};

std::string Advise(const Limit& limit, long in_force, long now) {
  const std::string key = limit.key;
  std::string text = std::string(limit.reached) + " at " +
                     (in_force > 0 ? key + "=" + std::to_string(in_force) : key + " (value unknown)") + ", " +
                     limit.in_force_is;
  if (in_force > 0 && now > in_force) return text + "; it was raised to " + std::to_string(now) + " since" + limit.raised;
  return text + "; raise it, e.g. sysctl -w " + key + "=" +
         std::to_string(in_force > 0 ? in_force * limit.factor : limit.fallback) +
         " (and in /etc/sysctl.d/ to keep it)" + limit.raise_then;
}

}  // namespace

long ReadInotifyLimit(const char* name) {
  std::ifstream in(std::string("/proc/sys/fs/inotify/") + name);
  long value = -1;
  if (!(in >> value)) return -1;
  return value;
}

std::string LossAdvice(LossKind kind, long in_force, long now) {
  switch (kind) {
    case LossKind::kKernelOverflow: return Advise(kQueueLength, in_force, now);
    case LossKind::kNoWatches: return Advise(kWatches, in_force, now);
    case LossKind::kQueueUnwritable:
      return "the queue could not be written for too long and its pending lines were dropped";
  }
  return std::string();
}

}  // namespace notifyd
}  // namespace corvlumex
