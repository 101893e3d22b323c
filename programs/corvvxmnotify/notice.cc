#include "programs/corvvxmnotify/notice.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

#include <ctime>
#include <filesystem>
#include <map>

#include "common/file_util.h"
#include "common/json_util.h"
#include "common/sys.h"

namespace corvlumex {
namespace notify {

std::string MessageText(const std::string& message_key) {
  static const std::map<std::string, std::string> kTexts = {
      {"error:index_no_space",
       "The volume that holds a share's search index is full: indexing of that share has stopped. "
       "Free at least 100 MiB on the volume, then resume indexing."},
      {"error:lack_of_memory",
       "The search engine is short of memory and keeps answering busy: indexing is slowed down. "
       "Close other services or add memory."},
      {"error:inotify_overflow",
       "File changes came faster than the notifier could read them: the affected shares are being "
       "reindexed. Raise fs.inotify.max_queued_events (sysctl) to avoid it."},
      {"error:inotify_watch_limit",
       "The system ran out of inotify watches: some folders are not watched for changes. Raise "
       "fs.inotify.max_user_watches (sysctl)."},
  };
  const auto it = kTexts.find(message_key);
  return it == kTexts.end() ? message_key : it->second;
}

Json::Value NoticeRecord(const Notice& notice, long long unix_time) {
  Json::Value record(Json::objectValue);
  record["time"] = static_cast<Json::Int64>(unix_time);
  record["application"] = notice.application;
  record["target"] = notice.target;
  record["title"] = notice.title_key;
  record["message"] = notice.message_key;
  record["text"] = MessageText(notice.message_key);
  record["badge"] = notice.badge;
  record["email"] = notice.email;
  record["has_link"] = !notice.link_open.empty();
  return record;
}

bool Deliver(const Notice& notice) {
  const Json::Value record = NoticeRecord(notice, static_cast<long long>(time(nullptr)));
  openlog("corvvxmnotify", LOG_PID, LOG_USER);
  syslog(LOG_WARNING, "%s: %s", notice.target.c_str(), record["text"].asCString());
  closelog();

  const std::string path = SysPath("/var/log/corvlumex/notices.log");
  std::error_code ignored;
  std::filesystem::create_directories(Dirname(path), ignored);
  // One whole line per append, so concurrent notices never interleave.
  const int fd = open(path.c_str(), O_WRONLY | O_APPEND | O_CREAT | O_CLOEXEC, 0644);
  if (fd < 0) return false;
  const std::string line = JsonToString(record) + "\n";
  const bool ok = write(fd, line.data(), line.size()) == static_cast<ssize_t>(line.size());
  close(fd);
  return ok;
}

}  // namespace notify
}  // namespace corvlumex
