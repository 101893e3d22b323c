// The conversation between the library and the extraction worker over one
// Unix stream socket pair. A request is one byte carrying the open file as
// SCM_RIGHTS, then a frame {"name", "need_meta", "text_cap"}; the reply is one frame
// {"ok": true, "fields": {...}} or {"ok": false, "error": "..."}. The worker
// never opens the file itself: it reads through the descriptor it was given.
#pragma once

#include <cstdint>
#include <string>

namespace corvlumex {
namespace platform {
namespace extract {

// A reply larger than this is refused: the text cap escaped as JSON (a CJK
// character's \uXXXX takes twice its UTF-8 bytes) plus room for metadata.
constexpr uint64_t MaxReplyBytes(uint64_t text_cap) { return 3 * text_cap + (1u << 20); }

// The worker's program name; it is looked up beside the calling program and
// at the package's install path unless CORVLUMEX_EXTRACT_WORKER names it.
constexpr const char kWorkerProgram[] = "corvcontentextractd";
constexpr const char kWorkerInstallPath[] = "/var/packages/CorvLumex/target/bin/corvcontentextractd";

// Sends `fd` with one byte; false with errno on failure. Never raises SIGPIPE.
bool SendDescriptor(int socket, int fd);
// Receives a descriptor sent by SendDescriptor: the descriptor, -1 on end of
// stream or failure (errno 0 at a clean end of stream, EPROTO when the byte
// came without a descriptor).
int ReceiveDescriptor(int socket);

}  // namespace extract
}  // namespace platform
}  // namespace corvlumex
