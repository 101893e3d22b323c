#include "fileindex/queue/op_line_reader.h"

#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

namespace corvlumex {
namespace fileindex {
namespace {
constexpr size_t kReadSize = 1 << 20;
constexpr size_t kSmallestBuffer = 4096;

// Large reads for large queues, without a megabyte for a queue of three lines.
size_t FirstBufferSize(int fd) {
  struct stat info {};
  if (fstat(fd, &info) != 0 || !S_ISREG(info.st_mode)) return kReadSize;
  const size_t wanted = static_cast<size_t>(info.st_size) + 1;
  return wanted < kSmallestBuffer ? kSmallestBuffer : wanted > kReadSize ? kReadSize : wanted;
}

}  // namespace

LineReader::LineReader(int fd) : fd_(fd), buffer_(FirstBufferSize(fd)) {}

LineReader::~LineReader() {
  if (fd_ >= 0) close(fd_);
}

bool LineReader::Next(std::string_view& line) {
  size_t scanned = begin_;
  for (;;) {
    const void* newline = memchr(buffer_.data() + scanned, '\n', end_ - scanned);
    if (newline != nullptr) {
      const size_t at = static_cast<size_t>(static_cast<const char*>(newline) - buffer_.data());
      line = std::string_view(buffer_.data() + begin_, at - begin_);
      begin_ = at + 1;
      return true;
    }
    if (eof_ || failed_) break;
    scanned = end_ - begin_;  // after Fill moves the partial line to the front
    if (!Fill()) break;
  }
  if (failed_ || begin_ == end_) return false;
  line = std::string_view(buffer_.data() + begin_, end_ - begin_);
  begin_ = end_;
  return true;
}

bool LineReader::Fill() {
  // Move the unfinished line to the front; grow when it fills the buffer.
  if (begin_ > 0) {
    memmove(buffer_.data(), buffer_.data() + begin_, end_ - begin_);
    end_ -= begin_;
    begin_ = 0;
  }
  if (buffer_.size() - end_ < buffer_.size() / 2) buffer_.resize(buffer_.size() * 2);
  for (;;) {
    const ssize_t got = read(fd_, buffer_.data() + end_, buffer_.size() - end_);
    if (got > 0) {
      end_ += static_cast<size_t>(got);
      return true;
    }
    if (got == 0) {
      eof_ = true;
      return false;
    }
    if (errno == EINTR) continue;
    failed_ = true;
    return false;
  }
}

}  // namespace fileindex
}  // namespace corvlumex
