// Dates written inside documents, as seconds since the epoch.
#pragma once

#include <cstdint>
#include <string>

namespace corvlumex {
namespace platform {
namespace extract {

// "2024-05-06", "2024-05-06T07:08:09", with "Z" or "+02:00"; a date without
// a zone is taken as UTC. False when the text is no such date.
bool ParseIsoDate(const std::string& text, int64_t* seconds);
// Photo dates "2024:05:06 07:08:09" (no zone: taken as UTC).
bool ParseExifDate(const std::string& text, int64_t* seconds);

}  // namespace extract
}  // namespace platform
}  // namespace corvlumex
