// Plain text and markup: converted to UTF-8 first (encoding.h); HTML and XML
// then keep only their text.
#include <libxml/parser.h>

#include <algorithm>
#include <memory>

#include "platform/linux/extract/document_fields.h"
#include "platform/linux/extract/parsers/encoding.h"
#include "platform/linux/extract/parsers/file_bytes.h"
#include "platform/linux/extract/parsers/formats.h"
#include "platform/linux/extract/parsers/html_text.h"
#include "platform/linux/extract/parsers/text_sink.h"
#include "platform/linux/extract/parsers/troff_text.h"
#include "platform/linux/extract/parsers/xml_text.h"

namespace corvlumex {
namespace platform {
namespace extract {
namespace {

// Input read for a text file: enough for the text cap in any encoding
// (UTF-16 takes two bytes a character, most CJK encodings up to three).
size_t TextInputCap(const TextSink& text) { return 4 * text.cap(); }
// Markup carries much more than its text; a page beyond this is cut.
size_t MarkupInputCap(const TextSink& text) { return std::max<size_t>(32u << 20, TextInputCap(text)); }

std::string ReadAsUtf8(int fd, size_t limit) {
  std::string utf8;
  ConvertToUtf8(ReadHead(fd, limit), &utf8);
  return utf8;
}

void SetIfPresent(Json::Value& fields, const char* field, const std::string& value) {
  const std::string clean = CleanUtf8(value);
  if (!clean.empty()) fields[field] = clean;
}

}  // namespace

void ExtractPlainText(int fd, TextSink& text) { text.Append(ReadAsUtf8(fd, TextInputCap(text))); }

void ExtractManPage(int fd, TextSink& text) { AppendTroffText(ReadAsUtf8(fd, TextInputCap(text)), text); }

void ExtractHtml(int fd, TextSink& text, Json::Value& fields) {
  const std::string utf8 = ReadAsUtf8(fd, MarkupInputCap(text));
  HtmlHeadFields head;
  if (!ReadHtmlStream(utf8.data(), utf8.size(), kHtmlChunk, text, head)) throw ExtractError("not an HTML document");
  SetIfPresent(fields, kFieldTitle, head.title);
  SetIfPresent(fields, kFieldDescription, head.description);
  SetIfPresent(fields, kFieldAuthors, head.author);
  SetIfPresent(fields, kFieldKeywords, head.keywords);
}

void ExtractXml(int fd, TextSink& text) {
  // The XML declaration names the encoding; the parser converts by itself.
  const std::string bytes = ReadHead(fd, MarkupInputCap(text));
  std::unique_ptr<xmlDoc, XmlDocFree> doc(
      xmlReadMemory(bytes.data(), static_cast<int>(bytes.size()), nullptr, nullptr, SafeXmlOptions()));
  if (!doc || xmlDocGetRootElement(doc.get()) == nullptr) throw ExtractError("not a well-formed XML document");
  // Data files put one value in each element: keep them apart.
  CollectText(xmlDocGetRootElement(doc.get()), "*", nullptr, text);
}

}  // namespace extract
}  // namespace platform
}  // namespace corvlumex
