#include "platform/linux/extract/plain_text.h"

#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <unordered_map>

#include "common/error.h"
#include "common/file_util.h"
#include "platform/linux/extract/document_fields.h"
#include "platform/linux/extract/parsers/text_sink.h"

namespace corvlumex {
namespace platform {
namespace extract {

const std::unordered_set<std::string>& PlainTextExtensions() {
  static const auto* extensions = new std::unordered_set<std::string>{
      "txt", "text", "log", "md", "markdown", "rst", "csv", "tsv", "json", "yaml", "yml", "ini", "conf", "cfg",
      "toml", "tex", "srt", "vtt", "sub", "nfo", "c", "h", "cc", "cpp", "cxx", "hpp", "hh", "java", "py", "sh",
      "bash", "js", "ts", "css", "go", "rs", "rb", "pl", "php", "sql", "lua", "swift", "kt", "cs", "properties",
      "diff", "patch",
      // More source code and plain-text formats whose content libmagic may take for
      // something else (a Perl module for JavaScript, a Pascal unit for HTML).
      "pm", "pod", "t", "pas", "pp", "dpr", "inc", "el", "lisp", "scm", "hs", "ml", "mli", "tcl", "awk", "m4",
      "cmake", "mk", "mak", "am", "ac", "in", "vim", "r", "f", "f90", "for", "adb", "ads", "d", "nim", "zig",
      "dart", "scala", "groovy", "gradle", "erl", "hrl", "ex", "exs", "clj", "jsx", "tsx", "mjs", "cjs", "vue",
      "scss", "less", "sass", "po", "pot", "texi", "texinfo", "asm", "s", "bat", "ps1", "cmd", "y", "l", "proto",
      "hxx", "ipp", "tcc", "inl", "m", "mm", "jl", "pyi", "pyx", "rake", "gemspec", "cabal", "bib", "sty", "cls",
      "dtx", "ltx", "adoc", "asciidoc", "org", "license", "changelog", "readme", "news", "todo", "authors",
      "copying", "install"};
  return *extensions;
}

std::string PlainTextMediaType(const std::string& extension) {
  // libmagic's own guesses for such files vary with their content (it takes
  // Markdown for JavaScript, a Pascal unit for Algol); the name is what the
  // file's owner chose, and it is stable.
  static const auto* types = new std::unordered_map<std::string, std::string>{
      {"c", "text/x-c"},          {"h", "text/x-c"},          {"cc", "text/x-c++"},
      {"cpp", "text/x-c++"},      {"cxx", "text/x-c++"},      {"hpp", "text/x-c++"},
      {"hh", "text/x-c++"},       {"hxx", "text/x-c++"},      {"ipp", "text/x-c++"},
      {"tcc", "text/x-c++"},      {"inl", "text/x-c++"},      {"pl", "text/x-perl"},
      {"pm", "text/x-perl"},      {"py", "text/x-script.python"}, {"sh", "text/x-shellscript"},
      {"bash", "text/x-shellscript"}, {"json", "application/json"}, {"java", "text/x-java"},
      {"php", "text/x-php"},      {"rb", "text/x-ruby"},      {"tex", "text/x-tex"},
      {"m4", "text/x-m4"},        {"awk", "text/x-awk"},      {"diff", "text/x-diff"},
      {"patch", "text/x-diff"},   {"csv", "text/csv"}};
  const auto type = types->find(extension);
  return type != types->end() ? type->second : "text/plain";
}

bool ReadPlainTextInProcess(int fd, const std::string& name, size_t size, size_t text_cap, Json::Value& fields) {
  const std::string extension = GetFileExtension(name, true);
  if (size == 0 || size > kInProcessTextBytes || PlainTextExtensions().count(extension) == 0) return false;
  // One read for the whole file; it may have changed size since its status was taken.
  std::string bytes(size + 1, '\0');
  ssize_t got;
  while ((got = pread(fd, &bytes[0], bytes.size(), 0)) < 0 && errno == EINTR) {
  }
  if (got < 0) throw Error(kErrorParseDocument, std::string("cannot read the file: ") + strerror(errno));
  if (static_cast<size_t>(got) > size) return false;  // it grew: the worker reads it as it is now
  bytes.resize(static_cast<size_t>(got));
  // Zero bytes mean UTF-16 or UTF-32 text, or no text at all; anything but
  // UTF-8 needs the worker's encoding guess. A UTF-8 mark is left out, as
  // the worker does.
  if (bytes.find('\0') != std::string::npos) return false;
  const bool marked = bytes.compare(0, 3, "\xEF\xBB\xBF") == 0;
  if (!marked && !IsValidUtf8(bytes)) return false;

  TextSink text(text_cap);
  text.Append(bytes.data() + (marked ? 3 : 0), bytes.size() - (marked ? 3 : 0));
  fields[kFieldMediaTypes] = PlainTextMediaType(extension);
  const std::string content = text.TakeTrimmed();
  if (!content.empty()) fields[kFieldTextContent] = content;
  return true;
}

}  // namespace extract
}  // namespace platform
}  // namespace corvlumex
