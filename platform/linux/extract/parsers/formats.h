// One function per family of formats. Each reads the file only through `fd`,
// fills the content fields it knows into `fields`, and throws ExtractError
// (or the library's own exception) when the file cannot be understood.
#pragma once

#include <json/json.h>

#include <string>

namespace corvlumex {
namespace platform {
namespace extract {

class TextSink;

enum class OfficeFormat { kDocx, kXlsx, kPptx, kOdt, kOds, kOdp, kEpub };

void ExtractPlainText(int fd, TextSink& text);
void ExtractHtml(int fd, TextSink& text, Json::Value& fields);
void ExtractXml(int fd, TextSink& text);
// A manual page's troff source, as its readable text.
void ExtractManPage(int fd, TextSink& text);
// The text inside a single compressed file whose name without the
// compression suffix is `inner_name`: plain text, or a manual page.
void ExtractCompressed(int fd, const std::string& inner_name, TextSink& text);
void ExtractPdf(int fd, TextSink& text, Json::Value& fields);
void ExtractOffice(int fd, OfficeFormat format, TextSink& text, Json::Value& fields);
void ExtractAudio(int fd, const std::string& name, Json::Value& fields);
void ExtractPhoto(int fd, Json::Value& fields);
void ExtractVideo(int fd, Json::Value& fields);

// Quiets the parser libraries' own diagnostics (they would go to the
// daemon's stderr, once per corrupt file).
void SilenceParserLibraries();

}  // namespace extract
}  // namespace platform
}  // namespace corvlumex
