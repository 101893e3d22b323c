#include "common/frame.h"

#include <unistd.h>

#include <cerrno>
#include <cstdint>
#include <cstring>
#include <string>

#include "common/error.h"

namespace corvlumex {
namespace {

constexpr unsigned int kChunk = 1024;
// Large frames of the search channel: as much as the socket takes at once.
constexpr unsigned int kLargeChunk = 1u << 20;
constexpr int kMaxEintr = 10;

template <typename Transfer>
void TransferAll(int fd, unsigned int size, Transfer transfer, const char* what, unsigned int max_chunk = kChunk) {
  unsigned int offset = 0;
  int interrupted = 0;  // a budget for the whole call, not reset by progress
  while (offset < size) {
    const unsigned int chunk = size - offset < max_chunk ? size - offset : max_chunk;
    const ssize_t n = transfer(fd, offset, chunk);
    if (n < 0) {
      if (errno == EINTR && ++interrupted <= kMaxEintr) continue;
      throw Error(kErrorSystem, std::string(what) + " failed, reason=" + strerror(errno));
    }
    // Zero is not an error: the loop simply asks again.
    offset += static_cast<unsigned int>(n);
  }
}

}  // namespace

void BufferRead(int fd, unsigned int size, unsigned char* buffer) {
  TransferAll(
      fd, size, [buffer](int f, unsigned int off, unsigned int len) { return read(f, buffer + off, len); },
      "read");
}

void BufferWrite(int fd, unsigned int size, const unsigned char* buffer) {
  TransferAll(
      fd, size, [buffer](int f, unsigned int off, unsigned int len) { return write(f, buffer + off, len); },
      "write");
}

void WriteFrame(int fd, const std::string& text) {
  const uint32_t length = static_cast<uint32_t>(text.size() + 1);
  BufferWrite(fd, sizeof(length), reinterpret_cast<const unsigned char*>(&length));
  BufferWrite(fd, length, reinterpret_cast<const unsigned char*>(text.c_str()));
}

void WriteFrameParts(int fd, const std::vector<std::string_view>& parts) {
  size_t total = 1;  // the trailing NUL
  for (const std::string_view part : parts) total += part.size();
  if (total > UINT32_MAX) throw Error(kErrorSystem, "write failed, reason=a frame of " + std::to_string(total) + " bytes");
  const uint32_t length = static_cast<uint32_t>(total);
  BufferWrite(fd, sizeof(length), reinterpret_cast<const unsigned char*>(&length));
  const auto write_all = [fd](std::string_view bytes) {
    TransferAll(
        fd, static_cast<unsigned int>(bytes.size()),
        [&bytes](int f, unsigned int off, unsigned int len) { return write(f, bytes.data() + off, len); }, "write",
        kLargeChunk);
  };
  for (const std::string_view part : parts) write_all(part);
  write_all(std::string_view("", 1));
}

std::string ReadFrame(int fd) {
  uint32_t length = 0;
  BufferRead(fd, sizeof(length), reinterpret_cast<unsigned char*>(&length));
  std::string body(length, '\0');
  if (length > 0) BufferRead(fd, length, reinterpret_cast<unsigned char*>(&body[0]));
  if (!body.empty() && body.back() == '\0') body.pop_back();
  return body;
}

Json::Value FailureAnswer(int code, const std::string& message) {
  Json::Value answer(Json::objectValue);
  answer["success"] = false;
  answer["error"]["code"] = code;
  answer["error"]["msg"] = message;
  return answer;
}

}  // namespace corvlumex
