// Content extraction of the Linux platform: the file-system fields come from
// the file's status in this process, and so does the text of small UTF-8
// plain-text files (plain_text.h); everything else read from inside a file
// comes from a confined worker process (worker_client.h).
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <utility>

#include "common/error.h"
#include "common/json_util.h"
#include "platform/linux/extract/document_fields.h"
#include "platform/linux/extract/file_fields.h"
#include "platform/linux/extract/plain_text.h"
#include "platform/linux/extract/worker_client.h"
#include "platform/linux/linux_platform.h"

namespace corvlumex {
namespace platform {

namespace {

[[noreturn]] void FailWithErrno(const std::string& what, const std::string& path) {
  const std::string reason = what + " " + path + ": " + strerror(errno);
  errno = 0;
  throw Error(kErrorParseDocument, reason);
}

// Closes the descriptor on every way out.
class OpenFile {
 public:
  explicit OpenFile(int fd) : fd_(fd) {}
  ~OpenFile() {
    if (fd_ >= 0) close(fd_);
  }
  OpenFile(const OpenFile&) = delete;
  OpenFile& operator=(const OpenFile&) = delete;
  int fd() const { return fd_; }

 private:
  int fd_;
};

void MarkFailed(const std::string& reason, Json::Value& fields) {
  fields[kFieldExtractionFailed] = true;
  fields[kFieldExtractionError] = reason;
}

}  // namespace

void LinuxPlatform::ParseFile(const std::string& path, const Json::Value& options, Json::Value& document) {
  bool need_meta = false;
  GetJsonValue(need_meta, options, "need_meta", false);

  extract::FileStatus status;
  if (!extract::ReadFileStatus(path, &status)) FailWithErrno("cannot read the status of", path);
  Json::Value fields(Json::objectValue);
  extract::FillFileFields(path, status, fields);

  // Only a regular file's own bytes are read: a link's target may lie outside
  // the share, and a device or a pipe is no document.
  if (S_ISREG(status.mode) && status.size > 0) {
    try {
      const OpenFile file(open(path.c_str(), O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC));
      if (file.fd() < 0) FailWithErrno("cannot open", path);
      struct stat opened;
      if (fstat(file.fd(), &opened) != 0) FailWithErrno("cannot read the status of", path);
      if (!S_ISREG(opened.st_mode)) throw Error(kErrorParseDocument, "no longer a regular file: " + path);
      Json::Value content(Json::objectValue);
      if (!extract::ReadPlainTextInProcess(file.fd(), path, static_cast<size_t>(opened.st_size),
                                           extract::CurrentExtractLimits().text_cap, content)) {
        content = extract::ExtractInWorker(file.fd(), path, need_meta);
      }
      // Moved, not copied: a text of megabytes is held once.
      for (const std::string& name : content.getMemberNames()) fields[name] = std::move(content[name]);
    } catch (const Error& error) {
      // The file exists: it stays findable by everything but its content.
      MarkFailed(error.reason.empty() ? error.what() : error.reason, fields);
    } catch (const std::exception& error) {
      MarkFailed(error.what(), fields);
    }
  }
  document = std::move(fields);
}

}  // namespace platform
}  // namespace corvlumex
