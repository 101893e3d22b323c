#include "platform/linux/extract/parsers/file_bytes.h"

#include <sys/mman.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>

namespace corvlumex {
namespace platform {
namespace extract {

std::string ReadHead(int fd, size_t limit) {
  std::string bytes;
  // Sized once from the file's status: growing by doubling would hold two
  // copies of a large file for a moment.
  struct stat st;
  if (fstat(fd, &st) == 0 && st.st_size > 0) bytes.reserve(std::min(limit, static_cast<size_t>(st.st_size)));
  char buffer[65536];
  off_t offset = 0;
  while (bytes.size() < limit) {
    const size_t want = limit - bytes.size() < sizeof(buffer) ? limit - bytes.size() : sizeof(buffer);
    const ssize_t got = pread(fd, buffer, want, offset);
    if (got < 0 && errno == EINTR) continue;
    if (got < 0) throw ExtractError(std::string("cannot read the file: ") + strerror(errno));
    if (got == 0) break;
    bytes.append(buffer, static_cast<size_t>(got));
    offset += got;
  }
  return bytes;
}

MappedFile::MappedFile(int fd) {
  struct stat st;
  if (fstat(fd, &st) != 0) throw ExtractError(std::string("cannot read the file's status: ") + strerror(errno));
  if (st.st_size <= 0) throw ExtractError("the file is empty");
  size_ = static_cast<size_t>(st.st_size);
  data_ = mmap(nullptr, size_, PROT_READ, MAP_PRIVATE, fd, 0);
  if (data_ == MAP_FAILED) {
    data_ = nullptr;
    throw ExtractError(std::string("cannot map the file: ") + strerror(errno));
  }
}

MappedFile::~MappedFile() {
  if (data_ != nullptr) munmap(data_, size_);
}

}  // namespace extract
}  // namespace platform
}  // namespace corvlumex
