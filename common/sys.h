// The process-wide seams that let the whole system run in a sandbox and be
// tested without waiting: a relocatable root for fixed paths and a
// replaceable sleep.
#pragma once

#include <chrono>
#include <functional>
#include <string>

#include "common/export.h"

CORVLUMEX_API_BEGIN

namespace corvlumex {

// Value of CORVLUMEX_ROOT (read at each call) followed by `path`. Only the
// system's fixed absolute paths go through this; share directories, queue
// files and full paths are real paths and are never prefixed.
std::string SysPath(const std::string& path);

// True when CORVLUMEX_ROOT is set and not empty.
bool InSandbox();

// Every wait of the library goes through here so tests can observe and skip it.
void SleepFor(std::chrono::microseconds duration);

// Replaces SleepFor's behaviour; an empty function restores real sleeping.
void SetSleepHook(std::function<void(std::chrono::microseconds)> hook);

}  // namespace corvlumex

CORVLUMEX_API_END
