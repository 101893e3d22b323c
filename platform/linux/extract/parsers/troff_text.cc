#include "platform/linux/extract/parsers/troff_text.h"

#include <cctype>
#include <sstream>

#include "platform/linux/extract/parsers/text_sink.h"

namespace corvlumex {
namespace platform {
namespace extract {
namespace {

// Macros whose arguments are text a reader sees (headings, fonts, tagged
// paragraphs); every other request (spacing, indents, definitions) is dropped.
bool CarriesText(const std::string& macro) {
  for (const char* name : {"SH", "SS", "B", "I", "BI", "BR", "IB", "IR", "RB", "RI", "SM", "SB", "IP", "TP", "TH",
                           "Nm", "Nd", "Ar", "Fl", "Op", "Xr", "Pa", "Em", "Sh", "Ss", "Dt", "It", "Fn", "Fa",
                           "Va", "Cm", "Dq", "Sq", "Ql", "Li", "UR", "MT"}) {
    if (macro == name) return true;
  }
  return false;
}

// Moves `i` (at the letter after the backslash) past the escape's name:
// "(xx" (two letters), "[name]" or one letter.
void SkipEscapeName(const std::string& line, size_t* i) {
  if (*i + 1 < line.size() && line[*i + 1] == '(') {
    *i += 3;
  } else if (*i + 1 < line.size() && line[*i + 1] == '[') {
    const size_t close = line.find(']', *i + 1);
    *i = close == std::string::npos ? line.size() : close;
  } else {
    *i += 1;
  }
}

// A line's text with the escapes resolved: font changes vanish, \- and
// \(xx become their characters' nearest plain forms, a comment ends it.
std::string Unescape(const std::string& line) {
  std::string out;
  for (size_t i = 0; i < line.size(); ++i) {
    if (line[i] != '\\' || i + 1 >= line.size()) {
      out += line[i];
      continue;
    }
    const char next = line[++i];
    switch (next) {
      case '"': return out;  // a comment to the end of the line
      case '-': out += '-'; break;
      case 'e': case '\\': out += '\\'; break;
      case '&': case '%': case '|': case '^': case ':': case 'c': break;
      case ' ': case '~': case '0': out += ' '; break;
      case 'f':  // \fB, \f(CW, \f[BI]
      case '*':  // a string: \*(xx, \*[name], \*x
        SkipEscapeName(line, &i);
        break;
      case '(':  // \(em, \(co: a special character, read as a blank
        i += 2;
        out += ' ';
        break;
      case '[': {
        const size_t close = line.find(']', i);
        i = close == std::string::npos ? line.size() : close;
        out += ' ';
        break;
      }
      case 's':  // \s+2, \s-1, \s0: size changes
        if (i + 1 < line.size() && (line[i + 1] == '+' || line[i + 1] == '-')) ++i;
        while (i + 1 < line.size() && isdigit(static_cast<unsigned char>(line[i + 1]))) ++i;
        break;
      default: out += next; break;
    }
  }
  return out;
}

// The arguments of a request line, quotes removed.
std::string Arguments(const std::string& rest) {
  std::string out;
  bool quoted = false;
  for (const char c : rest) {
    if (c == '"') {
      quoted = !quoted;
      continue;
    }
    out += c;
  }
  return out;
}

}  // namespace

void AppendTroffText(const std::string& utf8, TextSink& text) {
  std::istringstream lines(utf8);
  for (std::string line; std::getline(lines, line) && !text.full();) {
    if (!line.empty() && (line[0] == '.' || line[0] == '\'')) {
      size_t start = 1;
      while (start < line.size() && (line[start] == ' ' || line[start] == '\t')) ++start;
      size_t end = start;
      while (end < line.size() && line[end] != ' ' && line[end] != '\t') ++end;
      const std::string macro = line.substr(start, end - start);
      if (!CarriesText(macro)) continue;
      const std::string words = Unescape(Arguments(line.substr(end)));
      if (macro == "SH" || macro == "SS" || macro == "Sh" || macro == "Ss" || macro == "TH") text.Break();
      text.Append(words);
      text.Space();
      continue;
    }
    text.Append(Unescape(line));
    text.Space();
  }
}

bool IsManPageName(const std::string& name) {
  const size_t dot = name.rfind('.');
  if (dot == std::string::npos || dot == 0 || dot + 1 >= name.size()) return false;
  if (name[dot + 1] < '1' || name[dot + 1] > '9') return false;
  for (size_t i = dot + 2; i < name.size(); ++i) {
    if (!isalpha(static_cast<unsigned char>(name[i]))) return false;
  }
  return name.size() - dot <= 8;
}

}  // namespace extract
}  // namespace platform
}  // namespace corvlumex
