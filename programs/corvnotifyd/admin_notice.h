// Desktop notices to the administrators, through the platform's
// notification tool, for trouble they have to fix on the server.
#pragma once

namespace corvlumex {
namespace notifyd {

// The kernel's inotify event queue overflowed: shares are being reindexed;
// fs.inotify.max_queued_events should be raised.
constexpr char kNoticeInotifyOverflow[] = "error:inotify_overflow";
// The kernel had no inotify watch left: some folders are not watched;
// fs.inotify.max_user_watches should be raised.
constexpr char kNoticeInotifyWatchLimit[] = "error:inotify_watch_limit";

// Starts the notification tool for `notice` without waiting for it; the
// event thread must not hang on a slow desktop. Returns the platform's result.
int SendAdminNotice(const char* notice);

}  // namespace notifyd
}  // namespace corvlumex
