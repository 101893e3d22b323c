// Reading the file a worker was handed, only through its descriptor.
#pragma once

#include <cstddef>
#include <stdexcept>
#include <string>

namespace corvlumex {
namespace platform {
namespace extract {

// A file that cannot be understood; the message says what was wrong.
class ExtractError : public std::runtime_error {
 public:
  explicit ExtractError(const std::string& what) : std::runtime_error(what) {}
};

// Up to `limit` bytes from the start of the file.
std::string ReadHead(int fd, size_t limit);

// The whole file mapped read-only; throws ExtractError when it cannot be.
class MappedFile {
 public:
  explicit MappedFile(int fd);
  ~MappedFile();
  MappedFile(const MappedFile&) = delete;
  MappedFile& operator=(const MappedFile&) = delete;
  const char* data() const { return static_cast<const char*>(data_); }
  size_t size() const { return size_; }

 private:
  void* data_ = nullptr;
  size_t size_ = 0;
};

}  // namespace extract
}  // namespace platform
}  // namespace corvlumex
