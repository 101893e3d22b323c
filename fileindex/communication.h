// The length-framed JSON channel to fileindexd, and the framing shared by
// every Unix-socket peer of the system.
#pragma once

#include <json/json.h>

#include <string>

namespace corvlumex {
namespace fileindex {

// Sends {"type": command, "data": data} to fileindexd and waits for its reply.
void SendCommandToDaemon(const std::string& command, const Json::Value& data);

// Read / write exactly `size` bytes, at most 1024 per system call; throw
// Error 502 on failure (no log line).
void BufferRead(int fd, unsigned int size, unsigned char* buffer);
void BufferWrite(int fd, unsigned int size, const unsigned char* buffer);

// One frame: 4-byte host-order length (counting a trailing NUL), then the
// text and the NUL.
void WriteFrame(int fd, const std::string& text);
// Reads one frame body; a trailing NUL, when present, is dropped.
std::string ReadFrame(int fd);

}  // namespace fileindex
}  // namespace corvlumex
