// The readable text of a manual page written in troff (man macros): the
// words of headings and paragraphs without the requests, font changes and
// escapes around them.
#pragma once

#include <string>

namespace corvlumex {
namespace platform {
namespace extract {

class TextSink;

// Appends the text of the troff source `utf8` to `text`.
void AppendTroffText(const std::string& utf8, TextSink& text);

// A manual page by its name: "ls.1", "printf.3p", "ssl.3ssl", "zshall.1"
// (a section digit after the last dot, maybe followed by letters).
bool IsManPageName(const std::string& name);

}  // namespace extract
}  // namespace platform
}  // namespace corvlumex
