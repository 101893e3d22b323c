#include "platform/linux/extract/parsers/dates.h"

#include <cstdio>
#include <ctime>

namespace corvlumex {
namespace platform {
namespace extract {
namespace {

bool ToEpoch(int year, int month, int day, int hour, int minute, int second, int64_t* seconds) {
  if (year < 1 || month < 1 || month > 12 || day < 1 || day > 31 || hour < 0 || hour > 23 || minute < 0 ||
      minute > 59 || second < 0 || second > 60) {
    return false;
  }
  struct tm parts = {};
  parts.tm_year = year - 1900;
  parts.tm_mon = month - 1;
  parts.tm_mday = day;
  parts.tm_hour = hour;
  parts.tm_min = minute;
  parts.tm_sec = second;
  *seconds = static_cast<int64_t>(timegm(&parts));
  return true;
}

}  // namespace

bool ParseIsoDate(const std::string& text, int64_t* seconds) {
  int year = 0, month = 0, day = 0, hour = 0, minute = 0, second = 0, consumed = 0;
  const char* p = text.c_str();
  if (sscanf(p, "%4d-%2d-%2d%n", &year, &month, &day, &consumed) != 3) return false;
  p += consumed;
  if (*p == 'T' || *p == ' ') {
    consumed = 0;
    if (sscanf(p + 1, "%2d:%2d%n", &hour, &minute, &consumed) != 2) return false;
    p += 1 + consumed;
    if (*p == ':') {
      consumed = 0;
      if (sscanf(p + 1, "%2d%n", &second, &consumed) != 1) return false;
      p += 1 + consumed;
    }
    if (*p == '.') {  // fractions of a second are dropped
      ++p;
      while (*p >= '0' && *p <= '9') ++p;
    }
  }
  int64_t offset = 0;
  if (*p == '+' || *p == '-') {
    int zone_hour = 0, zone_minute = 0;
    if (sscanf(p + 1, "%2d:%2d", &zone_hour, &zone_minute) < 1 &&
        sscanf(p + 1, "%2d%2d", &zone_hour, &zone_minute) < 1) {
      return false;
    }
    offset = (zone_hour * 3600 + zone_minute * 60) * (*p == '+' ? 1 : -1);
  }
  if (!ToEpoch(year, month, day, hour, minute, second, seconds)) return false;
  *seconds -= offset;
  return true;
}

bool ParseExifDate(const std::string& text, int64_t* seconds) {
  int year = 0, month = 0, day = 0, hour = 0, minute = 0, second = 0;
  if (sscanf(text.c_str(), "%4d:%2d:%2d %2d:%2d:%2d", &year, &month, &day, &hour, &minute, &second) != 6) {
    return false;
  }
  return ToEpoch(year, month, day, hour, minute, second, seconds);
}

}  // namespace extract
}  // namespace platform
}  // namespace corvlumex
