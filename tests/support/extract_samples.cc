#include "tests/support/extract_samples.h"

#include <archive.h>
#include <archive_entry.h>
#include <gtest/gtest.h>

#include <cstdio>
#include <cstdlib>
#include <fstream>
#include <sstream>
#include <vector>

namespace corvlumex {
namespace testing_support {

void WriteBytes(const std::string& path, const std::string& content) {
  std::ofstream out(path, std::ios::binary | std::ios::trunc);
  out << content;
  ASSERT_TRUE(out.good()) << path;
}

std::string ReadBytes(const std::string& path) {
  std::ifstream in(path, std::ios::binary);
  std::stringstream buffer;
  buffer << in.rdbuf();
  return buffer.str();
}

void MakePdf(const std::string& path, const std::vector<std::string>& pages, const std::string& title,
             const std::string& author) {
  // Objects: 1 catalog, 2 page tree, 3 font, 4 info, then a page and its
  // content stream per page.
  std::vector<std::string> objects = {"", "", "<< /Type /Font /Subtype /Type1 /BaseFont /Helvetica >>",
                                      "<< /Title (" + title + ") /Author (" + author +
                                          ") /CreationDate (D:20200102030405Z) >>"};
  std::string kids;
  for (const std::string& text : pages) {
    const int page = static_cast<int>(objects.size()) + 1;
    kids += std::to_string(page) + " 0 R ";
    objects.push_back("<< /Type /Page /Parent 2 0 R /MediaBox [0 0 612 792] /Contents " + std::to_string(page + 1) +
                      " 0 R /Resources << /Font << /F1 3 0 R >> >> >>");
    const std::string stream = "BT /F1 18 Tf 72 700 Td (" + text + ") Tj ET";
    objects.push_back("<< /Length " + std::to_string(stream.size()) + " >>\nstream\n" + stream + "\nendstream");
  }
  objects[0] = "<< /Type /Catalog /Pages 2 0 R >>";
  objects[1] = "<< /Type /Pages /Kids [" + kids + "] /Count " + std::to_string(pages.size()) + " >>";
  std::string out = "%PDF-1.4\n";
  std::vector<size_t> offsets;
  for (size_t i = 0; i < objects.size(); ++i) {
    offsets.push_back(out.size());
    out += std::to_string(i + 1) + " 0 obj\n" + objects[i] + "\nendobj\n";
  }
  const size_t xref = out.size();
  out += "xref\n0 " + std::to_string(objects.size() + 1) + "\n0000000000 65535 f \n";
  char line[32];
  for (size_t offset : offsets) {
    snprintf(line, sizeof(line), "%010zu 00000 n \n", offset);
    out += line;
  }
  out += "trailer\n<< /Size " + std::to_string(objects.size() + 1) + " /Root 1 0 R /Info 4 0 R >>\nstartxref\n" +
         std::to_string(xref) + "\n%%EOF\n";
  WriteBytes(path, out);
}

// `data` compressed by libarchive's writer into `path` with the filter of
// `suffix` (gz, bz2, xz, zst), as the compression tools would write it.
void WriteCompressed(const std::string& path, const std::string& suffix, const std::string& data) {
  struct archive* writer = archive_write_new();
  if (suffix == "gz") archive_write_add_filter_gzip(writer);
  if (suffix == "bz2") archive_write_add_filter_bzip2(writer);
  if (suffix == "xz") archive_write_add_filter_xz(writer);
  if (suffix == "zst") archive_write_add_filter_zstd(writer);
  archive_write_set_format_raw(writer);
  ASSERT_EQ(ARCHIVE_OK, archive_write_open_filename(writer, path.c_str())) << archive_error_string(writer);
  struct archive_entry* entry = archive_entry_new();
  archive_entry_set_pathname(entry, "data");
  archive_entry_set_filetype(entry, AE_IFREG);
  archive_entry_set_size(entry, static_cast<la_int64_t>(data.size()));
  ASSERT_EQ(ARCHIVE_OK, archive_write_header(writer, entry)) << archive_error_string(writer);
  ASSERT_EQ(static_cast<la_ssize_t>(data.size()), archive_write_data(writer, data.data(), data.size()));
  archive_entry_free(entry);
  archive_write_close(writer);
  archive_write_free(writer);
}

void MakeZip(const std::string& path, const std::map<std::string, std::string>& parts) {
  struct archive* archive = archive_write_new();
  archive_write_set_format_zip(archive);
  ASSERT_EQ(ARCHIVE_OK, archive_write_open_filename(archive, path.c_str())) << path;
  for (const auto& part : parts) {
    struct archive_entry* entry = archive_entry_new();
    archive_entry_set_pathname(entry, part.first.c_str());
    archive_entry_set_size(entry, static_cast<la_int64_t>(part.second.size()));
    archive_entry_set_filetype(entry, AE_IFREG);
    archive_entry_set_perm(entry, 0644);
    archive_write_header(archive, entry);
    archive_write_data(archive, part.second.data(), part.second.size());
    archive_entry_free(entry);
  }
  archive_write_close(archive);
  archive_write_free(archive);
}

namespace {

std::string CoreProperties(const std::string& title, const std::string& author) {
  return "<?xml version=\"1.0\" encoding=\"UTF-8\"?><cp:coreProperties "
         "xmlns:cp=\"http://schemas.openxmlformats.org/package/2006/metadata/core-properties\" "
         "xmlns:dc=\"http://purl.org/dc/elements/1.1/\" xmlns:dcterms=\"http://purl.org/dc/terms/\">"
         "<dc:title>" + title + "</dc:title><dc:creator>" + author + "</dc:creator>"
         "<dcterms:created>2022-01-01T00:00:00Z</dcterms:created></cp:coreProperties>";
}

std::string OpenDocumentMeta(const std::string& title, const std::string& author) {
  return "<?xml version=\"1.0\" encoding=\"UTF-8\"?><office:document-meta "
         "xmlns:office=\"urn:oasis:names:tc:opendocument:xmlns:office:1.0\" "
         "xmlns:meta=\"urn:oasis:names:tc:opendocument:xmlns:meta:1.0\" "
         "xmlns:dc=\"http://purl.org/dc/elements/1.1/\"><office:meta><dc:title>" + title +
         "</dc:title><meta:initial-creator>" + author +
         "</meta:initial-creator><meta:creation-date>2022-01-01T00:00:00</meta:creation-date></office:meta>"
         "</office:document-meta>";
}

std::string OpenDocumentContent(const std::string& body) {
  return "<?xml version=\"1.0\" encoding=\"UTF-8\"?><office:document-content "
         "xmlns:office=\"urn:oasis:names:tc:opendocument:xmlns:office:1.0\" "
         "xmlns:text=\"urn:oasis:names:tc:opendocument:xmlns:text:1.0\" "
         "xmlns:table=\"urn:oasis:names:tc:opendocument:xmlns:table:1.0\" "
         "xmlns:draw=\"urn:oasis:names:tc:opendocument:xmlns:drawing:1.0\"><office:body>" + body +
         "</office:body></office:document-content>";
}

}  // namespace

void MakeOffice(const std::string& path, const std::string& format, const std::vector<std::string>& paragraphs,
                const std::string& title, const std::string& author) {
  std::map<std::string, std::string> parts;
  std::string body;
  if (format == "docx") {
    for (const std::string& p : paragraphs) body += "<w:p><w:r><w:t>" + p + "</w:t></w:r></w:p>";
    parts["word/document.xml"] =
        "<?xml version=\"1.0\"?><w:document xmlns:w=\"http://schemas.openxmlformats.org/wordprocessingml/2006/main\">"
        "<w:body>" + body + "</w:body></w:document>";
    parts["docProps/core.xml"] = CoreProperties(title, author);
  } else if (format == "xlsx") {
    for (const std::string& p : paragraphs) body += "<si><t>" + p + "</t></si>";
    parts["xl/workbook.xml"] = "<?xml version=\"1.0\"?><workbook/>";
    parts["xl/sharedStrings.xml"] = "<?xml version=\"1.0\"?><sst>" + body + "</sst>";
    parts["xl/worksheets/sheet1.xml"] =
        "<?xml version=\"1.0\"?><worksheet><sheetData><row><c t=\"s\"><v>0</v></c>"
        "<c t=\"inlineStr\"><is><t>inline cell</t></is></c></row></sheetData></worksheet>";
    parts["docProps/core.xml"] = CoreProperties(title, author);
  } else if (format == "pptx") {
    parts["ppt/presentation.xml"] = "<?xml version=\"1.0\"?><presentation/>";
    // Slides 2 and 10: in name order 10 would come first.
    int number = 2;
    for (const std::string& p : paragraphs) {
      parts["ppt/slides/slide" + std::to_string(number) + ".xml"] =
          "<?xml version=\"1.0\"?><p:sld xmlns:p=\"p\" xmlns:a=\"a\"><a:p><a:r><a:t>" + p + "</a:t></a:r></a:p></p:sld>";
      number = number == 2 ? 10 : number + 1;
    }
    parts["docProps/core.xml"] = CoreProperties(title, author);
  } else if (format == "odt" || format == "ods" || format == "odp") {
    for (const std::string& p : paragraphs) {
      if (format == "ods") {
        body += "<table:table-row><table:table-cell><text:p>" + p + "</text:p></table:table-cell></table:table-row>";
      } else if (format == "odp") {
        body += "<draw:page><draw:frame><draw:text-box><text:p>" + p + "</text:p></draw:text-box></draw:frame></draw:page>";
      } else {
        body += "<text:p>" + p + "</text:p>";
      }
    }
    if (format == "ods") body = "<office:spreadsheet><table:table>" + body + "</table:table></office:spreadsheet>";
    if (format == "odp") body = "<office:presentation>" + body + "</office:presentation>";
    if (format == "odt") body = "<office:text>" + body + "</office:text>";
    parts["mimetype"] = "application/vnd.oasis.opendocument";
    parts["content.xml"] = OpenDocumentContent(body);
    parts["meta.xml"] = OpenDocumentMeta(title, author);
  } else if (format == "epub") {
    parts["mimetype"] = "application/epub+zip";
    parts["META-INF/container.xml"] =
        "<?xml version=\"1.0\"?><container xmlns=\"urn:oasis:names:tc:opendocument:xmlns:container\" version=\"1.0\">"
        "<rootfiles><rootfile full-path=\"OEBPS/content.opf\" media-type=\"application/oebps-package+xml\"/>"
        "</rootfiles></container>";
    std::string manifest, spine;
    // Chapters are named against their reading order, which the spine decides.
    for (size_t i = 0; i < paragraphs.size(); ++i) {
      const std::string id = "c" + std::to_string(i);
      const std::string file = "z" + std::to_string(paragraphs.size() - i) + ".xhtml";
      manifest += "<item id=\"" + id + "\" href=\"" + file + "\" media-type=\"application/xhtml+xml\"/>";
      spine += "<itemref idref=\"" + id + "\"/>";
      parts["OEBPS/" + file] = "<?xml version=\"1.0\"?><html xmlns=\"http://www.w3.org/1999/xhtml\"><head><title>x"
                               "</title></head><body><p>" + paragraphs[i] + "&nbsp;</p></body></html>";
    }
    parts["OEBPS/content.opf"] =
        "<?xml version=\"1.0\"?><package xmlns=\"http://www.idpf.org/2007/opf\" version=\"2.0\">"
        "<metadata xmlns:dc=\"http://purl.org/dc/elements/1.1/\"><dc:title>" + title + "</dc:title><dc:creator>" +
        author + "</dc:creator><dc:identifier>urn:isbn:9780000000001</dc:identifier></metadata><manifest>" +
        manifest + "</manifest><spine>" + spine + "</spine></package>";
  } else {
    FAIL() << "unknown office format " << format;
  }
  MakeZip(path, parts);
}

void RunTool(const std::string& command) {
  const int status = std::system((command + " >/dev/null 2>&1").c_str());
  ASSERT_EQ(0, status) << "failed: " << command << " (the test tools come from scripts/packages.d/extract.txt)";
}

void Truncate(const std::string& from, const std::string& to, size_t size) {
  const std::string bytes = ReadBytes(from);
  WriteBytes(to, bytes.substr(0, size < bytes.size() ? size : bytes.size()));
}

}  // namespace testing_support
}  // namespace corvlumex
