// A single compressed file (.gz, .bz2, .xz, .zst) read like the file inside
// it: libarchive's raw format with its decompression filters (zlib, libbz2,
// liblzma, libzstd). Only as many bytes are unpacked as plain text of the
// same cap would read, so a compression bomb is cut at that limit, never
// followed; and the worker's memory and time limits hold as for any file.
#include <archive.h>
#include <archive_entry.h>

#include <memory>

#include "platform/linux/extract/parsers/encoding.h"
#include "platform/linux/extract/parsers/file_bytes.h"
#include "platform/linux/extract/parsers/formats.h"
#include "platform/linux/extract/parsers/text_sink.h"
#include "platform/linux/extract/parsers/troff_text.h"

namespace corvlumex {
namespace platform {
namespace extract {
namespace {

// Troff source whatever its name: a title request or a comment line first.
bool LooksLikeTroff(const std::string& head) {
  return head.rfind(".TH ", 0) == 0 || head.rfind(".\\\"", 0) == 0 || head.rfind("'\\\"", 0) == 0 ||
         head.rfind(".Dd ", 0) == 0;
}

// Text, not an archive or a binary: no NUL byte at the start, unless it is
// UTF-16 with its byte-order mark.
bool LooksLikeText(const std::string& head) {
  if (head.rfind("\xFF\xFE", 0) == 0 || head.rfind("\xFE\xFF", 0) == 0) return true;
  return head.substr(0, 8192).find('\0') == std::string::npos;
}

}  // namespace

void ExtractCompressed(int fd, const std::string& inner_name, TextSink& text) {
  struct ArchiveFree {
    void operator()(struct archive* a) const { archive_read_free(a); }
  };
  std::unique_ptr<struct archive, ArchiveFree> archive(archive_read_new());
  archive_read_support_filter_gzip(archive.get());
  archive_read_support_filter_bzip2(archive.get());
  archive_read_support_filter_xz(archive.get());
  archive_read_support_filter_zstd(archive.get());
  archive_read_support_format_raw(archive.get());
  if (archive_read_open_fd(archive.get(), fd, 65536) != ARCHIVE_OK) {
    throw ExtractError(std::string("not a compressed file: ") + archive_error_string(archive.get()));
  }
  struct archive_entry* entry;
  if (archive_read_next_header(archive.get(), &entry) != ARCHIVE_OK) {
    throw ExtractError(std::string("not a compressed file: ") + archive_error_string(archive.get()));
  }
  // The raw format takes any bytes; without a filter they were not compressed.
  if (archive_filter_code(archive.get(), 0) == ARCHIVE_FILTER_NONE) {
    throw ExtractError("not compressed data (gzip, bzip2, xz or zstd) despite its name");
  }
  const size_t limit = 4 * text.cap();  // as plain text reads at most
  // Reserved at once: growing by doubling would hold the old and the new
  // copy together, and pages never written cost nothing.
  std::string data;
  data.reserve(limit);
  char buffer[65536];
  while (data.size() < limit) {
    const la_ssize_t got = archive_read_data(archive.get(), buffer, sizeof(buffer));
    if (got < 0) {
      if (data.empty()) throw ExtractError(std::string("damaged compressed data: ") + archive_error_string(archive.get()));
      break;  // a damaged tail: keep what came before it
    }
    if (got == 0) break;
    data.append(buffer, std::min(static_cast<size_t>(got), limit - data.size()));
  }
  if (!LooksLikeText(data)) return;  // an archive (.tar.gz) or a binary: its name and status suffice
  const bool troff = IsManPageName(inner_name) || LooksLikeTroff(data.substr(0, 16));
  std::string utf8;
  ConvertToUtf8(data, &utf8);
  std::string().swap(data);  // up to 4 × the text cap: gone before the text is collected
  if (troff) {
    AppendTroffText(utf8, text);
  } else {
    text.Append(utf8);
  }
}

}  // namespace extract
}  // namespace platform
}  // namespace corvlumex
