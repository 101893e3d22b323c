#include "programs/corvnotifyd/inotify_reader.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/eventfd.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <cstring>

#include "common/log.h"
#include "common/sys.h"

namespace corvlumex {
namespace notifyd {
namespace {
// One read takes up to this much; the kernel never splits a record.
constexpr size_t kReadSize = 256 * 1024;
// How often the test hook's pause file is looked at.
constexpr int kPausePollMs = 5;
}  // namespace

InotifyReader::InotifyReader(int inotify_fd, RawEventQueue* queue, std::string pause_file)
    : fd_(inotify_fd), wake_fd_(eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)), queue_(queue),
      pause_file_(std::move(pause_file)), buffer_(kReadSize) {
  CORV_CHECK_THROW(wake_fd_ < 0, kErrorSystem, std::string("eventfd failed: ") + strerror(errno));
}

InotifyReader::~InotifyReader() {
  if (thread_.joinable()) Stop();
  close(wake_fd_);
}

void InotifyReader::Start() { thread_ = std::thread([this] { Run(); }); }

void InotifyReader::Stop() {
  const uint64_t one = 1;
  if (write(wake_fd_, &one, sizeof(one)) < 0) CORV_LOG("cannot wake the inotify reader: %s", strerror(errno));
  if (thread_.joinable()) thread_.join();
}

bool InotifyReader::Drain() {
  for (;;) {
    const ssize_t n = read(fd_, buffer_.data(), buffer_.size());
    if (n < 0) {
      if (errno == EINTR) continue;
      if (errno == EAGAIN) return true;
      CORV_LOG("reading inotify events failed: %s", strerror(errno));
      return false;
    }
    if (n == 0) return true;
    // A copy of the exact size: queued chunks hold no slack.
    queue_->Push(std::string(buffer_.data(), static_cast<size_t>(n)));
  }
}

void InotifyReader::WaitWhilePaused() {
  if (pause_file_.empty() || access(pause_file_.c_str(), F_OK) != 0) return;
  const std::string marker = pause_file_ + ".paused";
  close(open(marker.c_str(), O_WRONLY | O_CREAT | O_CLOEXEC, 0644));
  while (access(pause_file_.c_str(), F_OK) == 0) {
    SleepFor(std::chrono::milliseconds(kPausePollMs));
    uint64_t stop = 0;
    if (read(wake_fd_, &stop, sizeof(stop)) == sizeof(stop)) {
      // Asked to stop while paused: keep the request for the main loop.
      if (write(wake_fd_, &stop, sizeof(stop)) < 0) break;
      break;
    }
  }
  unlink(marker.c_str());
  errno = 0;
}

void InotifyReader::Run() {
  const int timeout = pause_file_.empty() ? -1 : kPausePollMs;
  for (;;) {
    WaitWhilePaused();
    struct pollfd fds[2] = {{fd_, POLLIN, 0}, {wake_fd_, POLLIN, 0}};
    const int ready = poll(fds, 2, timeout);
    if (ready < 0 && errno != EINTR) {
      CORV_LOG("waiting for inotify events failed: %s", strerror(errno));
      break;
    }
    if (ready > 0 && (fds[0].revents & POLLIN) && !Drain()) break;
    if (ready > 0 && (fds[1].revents & POLLIN)) break;
  }
  // Whatever the kernel queued before the stop is still handed over.
  Drain();
  queue_->Close();
}

}  // namespace notifyd
}  // namespace corvlumex
