// PDF with poppler's C++ interface: the text page by page until the cap,
// and the document information dictionary.
#include <poppler/cpp/poppler-document.h>
#include <poppler/cpp/poppler-global.h>
#include <poppler/cpp/poppler-page.h>

#include <memory>

#include "platform/linux/extract/document_fields.h"
#include "platform/linux/extract/parsers/file_bytes.h"
#include "platform/linux/extract/parsers/formats.h"
#include "platform/linux/extract/parsers/text_sink.h"

namespace corvlumex {
namespace platform {
namespace extract {
namespace {

std::string Utf8(const poppler::ustring& text) {
  const poppler::byte_array bytes = text.to_utf8();
  return CleanUtf8(std::string(bytes.begin(), bytes.end()));
}

void SetText(Json::Value& fields, const char* field, const poppler::ustring& value) {
  const std::string text = Utf8(value);
  if (!text.empty()) fields[field] = text;
}

void SetDate(Json::Value& fields, const char* field, time_t value) {
  if (value > 0) fields[field] = static_cast<Json::Int64>(value);
}

}  // namespace

void ExtractPdf(int fd, TextSink& text, Json::Value& fields) {
  const MappedFile file(fd);
  if (file.size() > static_cast<size_t>(INT32_MAX)) throw ExtractError("the PDF is larger than 2 GiB");
  std::unique_ptr<poppler::document> doc(
      poppler::document::load_from_raw_data(file.data(), static_cast<int>(file.size())));
  if (!doc) throw ExtractError("not a readable PDF document");
  if (doc->is_locked()) throw ExtractError("the PDF is protected by a password");
  SetText(fields, kFieldTitle, doc->get_title());
  SetText(fields, kFieldAuthors, doc->get_author());
  SetText(fields, kFieldDescription, doc->get_subject());
  SetText(fields, kFieldKeywords, doc->get_keywords());
  SetText(fields, kFieldCreator, doc->get_creator());
  SetDate(fields, kFieldContentCreationDate, doc->get_creation_date_t());
  SetDate(fields, kFieldContentModificationDate, doc->get_modification_date_t());
  const int pages = doc->pages();
  for (int i = 0; i < pages && !text.full(); ++i) {
    std::unique_ptr<poppler::page> page(doc->create_page(i));
    if (!page) continue;
    const std::string page_text = Utf8(page->text());
    text.Append(page_text);
    text.Break();
  }
}

}  // namespace extract
}  // namespace platform
}  // namespace corvlumex
