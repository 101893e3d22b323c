// What the administrator reads when events were lost: which kernel limit was
// reached, at which value, and how to raise it. The value quoted is the one
// the kernel applied, not whatever the sysctl says by the time the line is
// written: the event-queue length is fixed for an inotify instance when it is
// made (a later sysctl changes only instances made after it), so the notifier
// reads it when it opens its instance; the watch limit is read when a watch
// is refused.
#pragma once

#include <string>

#include "programs/corvnotifyd/event_translator.h"

namespace corvlumex {
namespace notifyd {

// /proc/sys/fs/inotify/<name> ("max_queued_events", "max_user_watches");
// -1 when it cannot be read.
long ReadInotifyLimit(const char* name);

// `in_force`: the limit the kernel applied when events were lost; `now`: the
// sysctl's value as the line is written (-1 for either: unknown).
std::string LossAdvice(LossKind kind, long in_force, long now);

}  // namespace notifyd
}  // namespace corvlumex
