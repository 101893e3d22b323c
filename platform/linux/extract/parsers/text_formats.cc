// Plain text and markup: converted to UTF-8 first (encoding.h); HTML and XML
// then keep only their text.
#include <libxml/HTMLparser.h>
#include <libxml/parser.h>

#include <algorithm>
#include <memory>

#include "platform/linux/extract/document_fields.h"
#include "platform/linux/extract/parsers/encoding.h"
#include "platform/linux/extract/parsers/file_bytes.h"
#include "platform/linux/extract/parsers/formats.h"
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

constexpr char kHtmlBlocks[] =
    "p div br li tr td th h1 h2 h3 h4 h5 h6 title pre blockquote section article header footer table ul ol dt dd";

// <meta name="..." content="..."> of an HTML head.
std::string MetaContent(const xmlNode* node, const char* wanted) {
  std::vector<const xmlNode*> stack = {node};
  while (!stack.empty()) {
    const xmlNode* current = stack.back();
    stack.pop_back();
    if (current->type == XML_ELEMENT_NODE && LocalName(current) == "body") continue;
    if (current->type == XML_ELEMENT_NODE && LocalName(current) == "meta") {
      xmlChar* name = xmlGetProp(current, BAD_CAST "name");
      const bool match = name != nullptr && xmlStrcasecmp(name, BAD_CAST wanted) == 0;
      xmlFree(name);
      if (match) {
        xmlChar* content = xmlGetProp(current, BAD_CAST "content");
        std::string value = content != nullptr ? reinterpret_cast<const char*>(content) : "";
        xmlFree(content);
        return value;
      }
    }
    for (const xmlNode* child = current->children; child != nullptr; child = child->next) stack.push_back(child);
  }
  return std::string();
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
  std::unique_ptr<xmlDoc, XmlDocFree> doc(
      htmlReadMemory(utf8.data(), static_cast<int>(utf8.size()), nullptr, "UTF-8", SafeHtmlOptions()));
  if (!doc) throw ExtractError("not an HTML document");
  const xmlNode* root = xmlDocGetRootElement(doc.get());
  if (root == nullptr) return;
  SetIfPresent(fields, kFieldTitle, FirstElementText(root, "title"));
  SetIfPresent(fields, kFieldDescription, MetaContent(root, "description"));
  SetIfPresent(fields, kFieldAuthors, MetaContent(root, "author"));
  SetIfPresent(fields, kFieldKeywords, MetaContent(root, "keywords"));
  // From the document node, not the root element: a page may carry text
  // after its </html>, and the parser leaves that beside the root. A
  // <noscript> holds what most readers see (the text for those without
  // scripts), so it is kept.
  CollectText(reinterpret_cast<const xmlNode*>(doc.get()), kHtmlBlocks, "script style head template", text);
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
