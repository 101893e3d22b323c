// Whether a change notifier (corvnotifyd) is running for a configuration
// folder. While it runs the notifier holds a read lock on the folder (an
// open-file-description lock, which the kernel drops with the process, also
// on kill -9). Anyone can test for that lock without taking one, so asking
// never gets in the way of a notifier that is starting.
#pragma once

#include <string>

namespace corvlumex {
namespace platform {

// The notifier's configuration folder: SysPath("/etc/corvlumex/monitor.d").
std::string NotifierConfigDir();

// Called by the notifier on its open configuration folder; held until the
// descriptor is closed or the process ends. False (errno set) on failure.
bool HoldNotifierPresence(int config_dir_fd);

enum class NotifierState { kRunning, kNotRunning, kUnknown };

// kUnknown when the folder cannot be opened (the notifier creates it at its
// first start: a missing folder means it never ran, kNotRunning).
NotifierState ProbeNotifier(const std::string& config_dir);

}  // namespace platform
}  // namespace corvlumex
