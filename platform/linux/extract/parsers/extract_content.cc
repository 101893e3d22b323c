#include "platform/linux/extract/parsers/extract_content.h"

#include <magic.h>
#include <unistd.h>

#include <cctype>
#include <map>

#include "common/file_util.h"
#include "platform/linux/extract/document_fields.h"
#include "platform/linux/extract/parsers/file_bytes.h"
#include "platform/linux/extract/parsers/formats.h"
#include "platform/linux/extract/parsers/text_sink.h"
#include "platform/linux/extract/parsers/troff_text.h"
#include "platform/linux/extract/plain_text.h"

namespace corvlumex {
namespace platform {
namespace extract {
namespace {

enum class Family { kText, kHtml, kXml, kPdf, kOffice, kAudio, kPhoto, kVideo, kManPage, kCompressed };

struct Format {
  Family family;
  OfficeFormat office;
};

const std::map<std::string, Format>& FormatsByExtension() {
  static const auto* formats = [] {
    auto* table = new std::map<std::string, Format>();
    for (const std::string& ext : PlainTextExtensions()) (*table)[ext] = {Family::kText, OfficeFormat::kDocx};
    for (const char* ext : {"html", "htm", "xhtml", "shtml"}) (*table)[ext] = {Family::kHtml, OfficeFormat::kDocx};
    for (const char* ext : {"xml", "svg", "rss", "atom", "plist"}) (*table)[ext] = {Family::kXml, OfficeFormat::kDocx};
    for (const char* ext : {"gz", "bz2", "xz", "zst"}) (*table)[ext] = {Family::kCompressed, OfficeFormat::kDocx};
    for (const char* ext : {"man", "roff", "troff", "mdoc"}) (*table)[ext] = {Family::kManPage, OfficeFormat::kDocx};
    (*table)["pdf"] = {Family::kPdf, OfficeFormat::kDocx};
    (*table)["docx"] = {Family::kOffice, OfficeFormat::kDocx};
    (*table)["docm"] = {Family::kOffice, OfficeFormat::kDocx};
    (*table)["xlsx"] = {Family::kOffice, OfficeFormat::kXlsx};
    (*table)["xlsm"] = {Family::kOffice, OfficeFormat::kXlsx};
    (*table)["pptx"] = {Family::kOffice, OfficeFormat::kPptx};
    (*table)["pptm"] = {Family::kOffice, OfficeFormat::kPptx};
    (*table)["odt"] = {Family::kOffice, OfficeFormat::kOdt};
    (*table)["ods"] = {Family::kOffice, OfficeFormat::kOds};
    (*table)["odp"] = {Family::kOffice, OfficeFormat::kOdp};
    (*table)["epub"] = {Family::kOffice, OfficeFormat::kEpub};
    for (const char* ext : {"mp3", "flac", "ogg", "oga", "opus", "spx", "m4a", "m4b", "aac", "wav", "aif", "aiff",
                            "wma", "ape", "wv", "mpc", "tta", "dsf"}) {
      (*table)[ext] = {Family::kAudio, OfficeFormat::kDocx};
    }
    for (const char* ext : {"jpg", "jpeg", "jpe", "tif", "tiff", "png", "webp", "gif", "bmp", "psd", "jp2", "dng",
                            "cr2", "crw", "nef", "arw", "orf", "rw2", "pef", "srw", "raf", "mrw"}) {
      (*table)[ext] = {Family::kPhoto, OfficeFormat::kDocx};
    }
    for (const char* ext : {"mp4", "m4v", "mov", "mkv", "webm", "avi", "wmv", "asf", "flv", "mpg", "mpeg", "m2v",
                            "ts", "mts", "m2ts", "vob", "3gp", "3g2", "ogv", "divx", "rm", "rmvb"}) {
      (*table)[ext] = {Family::kVideo, OfficeFormat::kDocx};
    }
    return table;
  }();
  return *formats;
}

magic_t& Magic() {
  static magic_t magic = nullptr;
  return magic;
}

std::string MediaType(int fd) {
  if (Magic() == nullptr) InitContentDetection();
  if (Magic() == nullptr) return std::string();
  // libmagic reads from the descriptor's offset and leaves it moved.
  lseek(fd, 0, SEEK_SET);
  const char* type = magic_descriptor(Magic(), fd);
  lseek(fd, 0, SEEK_SET);
  return type != nullptr ? type : std::string();
}

bool StartsWith(const std::string& text, const char* head) { return text.rfind(head, 0) == 0; }

// The start of the content after a byte-order mark and blanks, lower-cased.
std::string Signature(int fd) {
  std::string head = ReadHead(fd, 512);
  lseek(fd, 0, SEEK_SET);
  size_t start = StartsWith(head, "\xEF\xBB\xBF") ? 3 : 0;
  while (start < head.size() && isspace(static_cast<unsigned char>(head[start]))) ++start;
  head = head.substr(start, 64);
  for (char& c : head) c = static_cast<char>(tolower(static_cast<unsigned char>(c)));
  return head;
}

// Text that libmagic names by the language it guesses (a Perl module as
// JavaScript, a shell script): still text to index.
bool IsProgramText(const std::string& type) {
  for (const char* word : {"script", "json", "perl", "php", "ruby", "python", "x-tex", "x-awk", "x-m4", "troff"}) {
    if (type.find(word) != std::string::npos) return true;
  }
  return false;
}

// The family for a name whose extension we do not know, from the content.
// Markup is parsed as markup only on a clear signature: libmagic calls many
// sources HTML for a tag in a comment, and an HTML parser then drops half
// their words; anything else textual is read as plain text.
bool FamilyByContent(int fd, const std::string& type, Format* format) {
  if (type == "application/pdf") {
    *format = {Family::kPdf, OfficeFormat::kDocx};
    return true;
  }
  if (!StartsWith(type, "text/") && !IsProgramText(type)) return false;
  if (type == "text/troff") {
    *format = {Family::kManPage, OfficeFormat::kDocx};
    return true;
  }
  const std::string signature = Signature(fd);
  if (StartsWith(signature, "<!doctype html") || StartsWith(signature, "<html")) {
    *format = {Family::kHtml, OfficeFormat::kDocx};
  } else if (StartsWith(signature, "<?xml")) {
    *format = {Family::kXml, OfficeFormat::kDocx};
  } else {
    *format = {Family::kText, OfficeFormat::kDocx};
  }
  return true;
}

}  // namespace

void InitContentDetection() {
  if (Magic() != nullptr) return;
  // No decompression (MAGIC_COMPRESS would start helper programs).
  magic_t magic = magic_open(MAGIC_MIME_TYPE | MAGIC_NO_CHECK_COMPRESS | MAGIC_ERROR);
  if (magic == nullptr) return;
  if (magic_load(magic, nullptr) != 0) {
    magic_close(magic);
    return;
  }
  // The type shows in the first bytes; the default (megabytes) only makes
  // the text tests slow on large files.
  const size_t bytes_max = 256 * 1024;
  magic_setparam(magic, MAGIC_PARAM_BYTES_MAX, &bytes_max);
  Magic() = magic;
}

Json::Value ExtractContent(int fd, const std::string& name, bool need_meta, size_t text_cap) {
  Json::Value fields(Json::objectValue);
  const std::string media_type = MediaType(fd);
  if (!media_type.empty()) fields[kFieldMediaTypes] = media_type;

  Format format;
  const auto known = FormatsByExtension().find(GetFileExtension(name, true));
  if (known != FormatsByExtension().end()) {
    format = known->second;
  } else if (IsManPageName(name)) {
    format = {Family::kManPage, OfficeFormat::kDocx};
  } else if (!FamilyByContent(fd, media_type, &format)) {
    return fields;  // a file we have nothing to read from: its name and status suffice
  }

  TextSink text(text_cap);
  switch (format.family) {
    case Family::kText:
      ExtractPlainText(fd, text);
      break;
    case Family::kHtml:
      ExtractHtml(fd, text, fields);
      break;
    case Family::kXml:
      ExtractXml(fd, text);
      break;
    case Family::kManPage:
      ExtractManPage(fd, text);
      break;
    case Family::kCompressed:
      lseek(fd, 0, SEEK_SET);
      ExtractCompressed(fd, name.substr(0, name.rfind('.')), text);
      break;
    case Family::kPdf:
      ExtractPdf(fd, text, fields);
      break;
    case Family::kOffice:
      ExtractOffice(fd, format.office, text, fields);
      break;
    case Family::kAudio:
      if (need_meta) ExtractAudio(fd, name, fields);
      break;
    case Family::kPhoto:
      if (need_meta) ExtractPhoto(fd, fields);
      break;
    case Family::kVideo:
      if (need_meta) ExtractVideo(fd, fields);
      break;
  }
  {
    // Taken from the sink and dropped once in the fields: the text is held
    // twice at most, never three times.
    const std::string content = text.TakeTrimmed();
    if (!content.empty()) fields[kFieldTextContent] = content;
  }
  return fields;
}

}  // namespace extract
}  // namespace platform
}  // namespace corvlumex
