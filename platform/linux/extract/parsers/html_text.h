// The text of an HTML page read with libxml2's SAX parser, without its tree.
//
// A tree of a large page costs about fifteen times the page in memory (an
// 8 MB manual took 130 MB); the events the tree is built from are enough to
// keep what the index wants. The reader mirrors the tree the parser would have
// built (the same events build it), so its text is exactly what a walk of that
// tree gives:
//   - the body's text in document order, one line break before and after each
//     block element (paragraphs, cells, headings, ...);
//   - <script>, <style>, <template> and the whole <head> left out with their
//     content; <noscript> kept (it is what readers without scripts see);
//   - text after </html> kept (the parser opens a new <html> for it);
//   - the title: the text of the first <title> of the page's first <html>;
//   - description, author, keywords: the last <meta name=... content=...>
//     of that name outside any <body> of the first <html>.
#pragma once

#include <cstddef>
#include <string>

namespace corvlumex {
namespace platform {
namespace extract {

class TextSink;

// The fields an HTML head names (empty when it names none).
struct HtmlHeadFields {
  std::string title;
  std::string description;
  std::string author;
  std::string keywords;
};

// Reads `size` bytes of UTF-8 at `utf8`, handing them to the parser `chunk`
// bytes at a time (at least 4 KiB; the parser holds a window of the page,
// not a copy of it), into `text` (body text) and `head`. The text is the
// same whatever the chunk. Returns false when the parser could not be
// started.
bool ReadHtmlStream(const char* utf8, size_t size, size_t chunk, TextSink& text, HtmlHeadFields& head);

// The chunk the extraction uses: large enough that the parser's own per-call
// work does not show, small enough to be nothing beside the page.
constexpr size_t kHtmlChunk = 256u << 10;

}  // namespace extract
}  // namespace platform
}  // namespace corvlumex
