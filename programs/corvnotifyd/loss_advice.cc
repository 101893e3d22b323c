#include "programs/corvnotifyd/loss_advice.h"

#include <fstream>

namespace corvlumex {
namespace notifyd {
namespace {

// "sysctl -w <key>=<value>": `factor` times the limit in force, or
// `fallback` when it is unknown.
std::string RaiseCommand(const std::string& key, long in_force, long factor, long fallback) {
  return "sysctl -w " + key + "=" + std::to_string(in_force > 0 ? in_force * factor : fallback) +
         " (and in /etc/sysctl.d/ to keep it)";
}

std::string Quoted(const std::string& key, long value) {
  return value > 0 ? key + "=" + std::to_string(value) : key + " (value unknown)";
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
    case LossKind::kKernelOverflow: {
      const std::string key = "fs.inotify.max_queued_events";
      std::string text = "the kernel's inotify event queue overflowed at " + Quoted(key, in_force) +
                         ", the length in force since corvnotifyd started";
      if (in_force > 0 && now > in_force) {
        return text + "; it was raised to " + std::to_string(now) +
               " since, which takes effect when corvnotifyd is restarted";
      }
      return text + "; raise it, e.g. " + RaiseCommand(key, in_force, 4, 65536) +
             ", then restart corvnotifyd, which reads it when it starts";
    }
    case LossKind::kNoWatches: {
      const std::string key = "fs.inotify.max_user_watches";
      std::string text = "the kernel has no inotify watch left at " + Quoted(key, in_force) +
                         ", the limit when a watch was refused";
      if (in_force > 0 && now > in_force) {
        return text + "; it was raised to " + std::to_string(now) +
               " since, so the folders are watched again with the next crash marker";
      }
      return text + "; raise it, e.g. " + RaiseCommand(key, in_force, 2, 1048576) + ", which takes effect at once";
    }
    case LossKind::kQueueUnwritable:
      return "the queue could not be written for too long and its pending lines were dropped";
  }
  return std::string();
}

}  // namespace notifyd
}  // namespace corvlumex
