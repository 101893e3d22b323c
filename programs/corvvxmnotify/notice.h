// One notice for the administrators, as the library and the daemons raise
// it, and where it is delivered on a Linux host.
#pragma once

#include <json/json.h>

#include <string>

namespace corvlumex {
namespace notify {

struct Notice {
  std::string application;   // -c: the application that owns the notice
  bool badge = false;        // -b: show a badge on the application
  bool email = false;        // -e: also send it by mail (not done on Linux: logged)
  std::string target;        // "@administrators" or a user name
  std::string title_key;     // "app:displayname"
  std::string message_key;   // "error:index_no_space", "error:lack_of_memory", ...
  std::string link_open;     // optional markup around a link to the settings page
  std::string link_close;
};

// The readable text for a message key; the key itself when unknown.
std::string MessageText(const std::string& message_key);

// The notice as one JSON object, with the time and the readable text.
Json::Value NoticeRecord(const Notice& notice, long long unix_time);

// Appends the record to SysPath("/var/log/corvlumex/notices.log") (one JSON
// object per line, the place `fileindex status` reads) and writes it to
// syslog. False when the log file cannot be written.
bool Deliver(const Notice& notice);

}  // namespace notify
}  // namespace corvlumex
