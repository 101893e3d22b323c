#include "platform/linux/extract/parsers/html_text.h"

#include <libxml/HTMLparser.h>
#include <libxml/parser.h>
#include <libxml/parserInternals.h>

#include <strings.h>

#include <algorithm>
#include <cstring>
#include <memory>
#include <vector>

#include "platform/linux/extract/parsers/text_sink.h"
#include "platform/linux/extract/parsers/xml_text.h"

namespace corvlumex {
namespace platform {
namespace extract {
namespace {

// Elements that stand on lines of their own.
constexpr const char* kBlocks[] = {"p",     "div",     "br",         "li",      "tr",     "td",     "th",
                                   "h1",    "h2",      "h3",         "h4",      "h5",     "h6",     "title",
                                   "pre",   "section", "blockquote", "article", "header", "footer", "table",
                                   "ul",    "ol",      "dt",         "dd"};
// Elements whose content is not the page's text.
constexpr const char* kSkipped[] = {"script", "style", "head", "template"};

// The tree builder refuses an element deeper than this and stops the parse
// (libxml2's nodePush without XML_PARSE_HUGE); the reader does the same, so a
// page nested without end gives the text it always gave.
constexpr size_t kTreeDepthLimit = 256;

// The parser looks ahead a little past where it stands (a doctype, the
// blanks before a tag) and takes a short read for the end of the page: each
// piece it is handed is at least this large, like the reads of a file.
constexpr size_t kSmallestChunk = 4096;

// The title is read into a sink of its own, like any short metadata value.
constexpr size_t kTitleCap = 64 * 1024;

template <size_t N>
bool OneOf(const char* name, const char* const (&names)[N]) {
  return std::any_of(std::begin(names), std::end(names), [name](const char* n) { return strcmp(name, n) == 0; });
}

// One open element of the tree the parser would have built.
struct Frame {
  bool skipped;  // in script, style, head or template: no body text
  bool block;    // ends a line when it closes
  bool in_body;  // a <body> is open at or above it: its metas do not count
};

class HtmlReader {
 public:
  HtmlReader(TextSink& text, HtmlHeadFields& head) : text_(text), head_(head), title_(kTitleCap) {}

  void set_parser(htmlParserCtxtPtr parser) { parser_ = parser; }

  void Start(const char* name, const char** attributes) {
    if (open_.size() > kTreeDepthLimit) {
      xmlStopParser(parser_);
      return;
    }
    const Frame* parent = open_.empty() ? nullptr : &open_.back();
    bool is_root = false;
    if (parent == nullptr) {
      // An element opened with nothing open: the first is the page's root.
      // A later one (text after </html>) goes where the tree builder puts
      // it: into the root when the root is the document's first node, else
      // (after a doctype or a comment) beside it, outside the root.
      if (!root_started_) {
        root_started_ = true;
        is_root = true;
        in_root_ = true;
        if (!document_started_) root_first_ = true;
        document_started_ = true;
      } else {
        in_root_ = root_first_;
        if (root_first_) parent = &root_;
      }
    }
    const bool skipped = (parent != nullptr && parent->skipped) || OneOf(name, kSkipped);
    const bool block = !skipped && OneOf(name, kBlocks);
    const bool in_body = (parent != nullptr && parent->in_body) || strcmp(name, "body") == 0;
    open_.push_back({skipped, block, in_body});
    if (is_root) root_ = open_.back();
    if (block) text_.Break();
    if (!in_root_) return;
    if (title_depth_ == 0 && !title_seen_ && strcmp(name, "title") == 0) {
      title_depth_ = open_.size();
      title_seen_ = true;
    }
    if (!in_body && strcmp(name, "meta") == 0) ReadMeta(attributes);
  }

  // A node that is no element, at the top of the document: when it comes
  // first, the document's later top-level elements are the root's siblings.
  void TopLevelNode() {
    if (open_.empty() && !document_started_) document_started_ = true;
  }

  // A doctype: the tree builder puts it first in the document, wherever it
  // stood (the first one only).
  void Doctype() {
    if (doctype_seen_) return;
    doctype_seen_ = true;
    document_started_ = true;
    root_first_ = false;
  }

  void End() {
    if (open_.empty()) return;
    if (open_.back().block) text_.Break();
    if (open_.size() == title_depth_) title_depth_ = 0;
    open_.pop_back();
  }

  void Text(const char* data, size_t size) {
    // Text with no element open has no place in the tree: the builder drops it.
    if (open_.empty()) return;
    if (title_depth_ != 0) title_.Append(data, size);
    if (!open_.back().skipped) text_.Append(data, size);
  }

  // Closes what the page left open (each block still ends its line).
  void Finish() {
    while (!open_.empty()) End();
    head_.title = title_.text();
  }

 private:
  void ReadMeta(const char** attributes) {
    // The first "name" and "content" attributes, as the tree would keep them
    // (the parser drops repeated attributes); a missing value reads as "".
    const char* name = nullptr;
    const char* content = nullptr;
    for (const char** a = attributes; a != nullptr && a[0] != nullptr; a += 2) {
      const char* value = a[1] != nullptr ? a[1] : "";
      if (name == nullptr && strcmp(a[0], "name") == 0) name = value;
      if (content == nullptr && strcmp(a[0], "content") == 0) content = value;
    }
    if (name == nullptr) return;
    // The last of each name wins, as in the reverse walk of the head the
    // tree reader made.
    std::string* field = nullptr;
    if (strcasecmp(name, "description") == 0) field = &head_.description;
    if (strcasecmp(name, "author") == 0) field = &head_.author;
    if (strcasecmp(name, "keywords") == 0) field = &head_.keywords;
    if (field != nullptr) *field = content != nullptr ? content : "";
  }

  TextSink& text_;
  HtmlHeadFields& head_;
  htmlParserCtxtPtr parser_ = nullptr;
  std::vector<Frame> open_;
  bool document_started_ = false;  // the document has a first node
  bool root_first_ = false;        // that node is the root element
  bool doctype_seen_ = false;
  bool in_root_ = false;           // the open top-level element is the root
  bool root_started_ = false;
  Frame root_{false, false, false};
  TextSink title_;
  bool title_seen_ = false;
  size_t title_depth_ = 0;  // depth of the open <title>, 0 when none is open
};

HtmlReader& ReaderOf(void* user) { return *static_cast<HtmlReader*>(user); }

void OnStart(void* user, const xmlChar* name, const xmlChar** attributes) {
  ReaderOf(user).Start(reinterpret_cast<const char*>(name), reinterpret_cast<const char**>(attributes));
}

void OnEnd(void* user, const xmlChar*) { ReaderOf(user).End(); }

void OnText(void* user, const xmlChar* data, int size) {
  ReaderOf(user).Text(reinterpret_cast<const char*>(data), static_cast<size_t>(size));
}

void OnComment(void* user, const xmlChar*) { ReaderOf(user).TopLevelNode(); }

void OnInstruction(void* user, const xmlChar*, const xmlChar*) { ReaderOf(user).TopLevelNode(); }

void OnDoctype(void* user, const xmlChar*, const xmlChar*, const xmlChar*) { ReaderOf(user).Doctype(); }

struct ParserFree {
  void operator()(htmlParserCtxtPtr parser) const { htmlFreeParserCtxt(parser); }
};

// The page handed to the parser piece by piece, as it asks for more.
struct PageFeed {
  const char* data;
  size_t size;
  size_t offset;
  size_t chunk;
};

int ReadPage(void* context, char* buffer, int wanted) {
  PageFeed& feed = *static_cast<PageFeed*>(context);
  const size_t piece = std::min({feed.chunk, feed.size - feed.offset, static_cast<size_t>(std::max(wanted, 0))});
  memcpy(buffer, feed.data + feed.offset, piece);
  feed.offset += piece;
  return static_cast<int>(piece);
}

}  // namespace

bool ReadHtmlStream(const char* utf8, size_t size, size_t chunk, TextSink& text, HtmlHeadFields& head) {
  // The pull parser reading from a callback: the very parse a page read
  // from memory gets (libxml2's push parser loses the text after </html>
  // and splits scripts at chunk ends), over a window of the page. Only the
  // events that shape the tree or carry text are handled: no document, DTD
  // or comment is built.
  std::unique_ptr<htmlParserCtxt, ParserFree> parser(htmlNewParserCtxt());
  if (!parser || parser->sax == nullptr) return false;
  PageFeed feed{utf8, size, 0, std::max(kSmallestChunk, chunk)};
  xmlParserInputBufferPtr input = xmlParserInputBufferCreateIO(ReadPage, nullptr, &feed, XML_CHAR_ENCODING_NONE);
  if (input == nullptr) return false;
  xmlParserInputPtr stream = xmlNewIOInputStream(parser.get(), input, XML_CHAR_ENCODING_NONE);
  if (stream == nullptr) {
    xmlFreeParserInputBuffer(input);
    return false;
  }
  inputPush(parser.get(), stream);
  HtmlReader reader(text, head);
  reader.set_parser(parser.get());
  memset(parser->sax, 0, sizeof(htmlSAXHandler));
  parser->sax->startElement = OnStart;
  parser->sax->endElement = OnEnd;
  parser->sax->characters = OnText;
  parser->sax->cdataBlock = OnText;
  parser->sax->comment = OnComment;
  parser->sax->processingInstruction = OnInstruction;
  parser->sax->internalSubset = OnDoctype;
  parser->userData = &reader;
  htmlCtxtUseOptions(parser.get(), SafeHtmlOptions());
  // The bytes are UTF-8 already, and so declared: a <meta charset> in the
  // page must not switch them to another encoding.
  xmlCharEncodingHandlerPtr utf8_handler = xmlFindCharEncodingHandler("UTF-8");
  if (utf8_handler != nullptr) {
    xmlSwitchToEncoding(parser.get(), utf8_handler);
    if (parser->input->encoding != nullptr) xmlFree(const_cast<xmlChar*>(parser->input->encoding));
    parser->input->encoding = xmlStrdup(BAD_CAST "UTF-8");
  }
  htmlParseDocument(parser.get());
  reader.Finish();
  return true;
}

}  // namespace extract
}  // namespace platform
}  // namespace corvlumex
