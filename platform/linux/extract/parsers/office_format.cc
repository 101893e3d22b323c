// Office documents and e-books are zip archives of XML parts: libarchive
// reads the parts (with caps against zip bombs), libxml2 parses each one.
//   docx: word/document.xml, headers, footers, foot- and endnotes; docProps/core.xml
//   xlsx: xl/sharedStrings.xml and inline strings of the sheets; docProps/core.xml
//   pptx: ppt/slides/slideN.xml then notes, in slide order; docProps/core.xml
//   odt/ods/odp: content.xml; meta.xml
//   epub: the package file named by META-INF/container.xml, its spine in order
#include <archive.h>
#include <archive_entry.h>
#include <libxml/HTMLparser.h>
#include <libxml/parser.h>

#include <algorithm>
#include <cctype>
#include <map>
#include <memory>
#include <string>
#include <vector>

#include "platform/linux/extract/document_fields.h"
#include "platform/linux/extract/parsers/dates.h"
#include "platform/linux/extract/parsers/file_bytes.h"
#include "platform/linux/extract/parsers/formats.h"
#include "platform/linux/extract/parsers/text_sink.h"
#include "platform/linux/extract/parsers/xml_text.h"

namespace corvlumex {
namespace platform {
namespace extract {
namespace {

constexpr size_t kMaxPartBytes = 64u << 20;    // one unpacked part
constexpr size_t kMaxTotalBytes = 256u << 20;  // all unpacked parts together
constexpr int kMaxEntries = 65536;

using Parts = std::map<std::string, std::string>;

bool EndsWith(const std::string& text, const std::string& tail) {
  return text.size() >= tail.size() && text.compare(text.size() - tail.size(), tail.size(), tail) == 0;
}

bool StartsWith(const std::string& text, const std::string& head) { return text.compare(0, head.size(), head) == 0; }

// Reads the text parts of the archive (markup only: pictures and fonts are
// never unpacked).
Parts ReadParts(int fd) {
  struct ArchiveFree {
    void operator()(struct archive* a) const { archive_read_free(a); }
  };
  std::unique_ptr<struct archive, ArchiveFree> archive(archive_read_new());
  archive_read_support_format_zip(archive.get());
  if (archive_read_open_fd(archive.get(), fd, 65536) != ARCHIVE_OK) {
    throw ExtractError(std::string("not a zip container: ") + archive_error_string(archive.get()));
  }
  Parts parts;
  size_t total = 0;
  int entries = 0;
  struct archive_entry* entry;
  for (;;) {
    const int status = archive_read_next_header(archive.get(), &entry);
    if (status == ARCHIVE_EOF) break;
    if (status < ARCHIVE_WARN) {
      if (parts.empty()) throw ExtractError(std::string("not a zip container: ") + archive_error_string(archive.get()));
      break;  // a damaged tail: keep what was read
    }
    if (++entries > kMaxEntries) throw ExtractError("the container holds too many parts");
    const char* raw_name = archive_entry_pathname(entry);
    const std::string name = raw_name != nullptr ? raw_name : "";
    const bool markup = EndsWith(name, ".xml") || EndsWith(name, ".xhtml") || EndsWith(name, ".html") ||
                        EndsWith(name, ".htm") || EndsWith(name, ".opf") || name == "mimetype";
    if (!markup) continue;
    std::string data;
    char buffer[65536];
    for (;;) {
      const la_ssize_t got = archive_read_data(archive.get(), buffer, sizeof(buffer));
      if (got < 0) throw ExtractError("a damaged part in the container: " + name);
      if (got == 0) break;
      if (data.size() + static_cast<size_t>(got) > kMaxPartBytes) throw ExtractError("a part unpacks too large: " + name);
      total += static_cast<size_t>(got);
      if (total > kMaxTotalBytes) throw ExtractError("the container unpacks too large");
      data.append(buffer, static_cast<size_t>(got));
    }
    parts[name] = std::move(data);
  }
  return parts;
}

using XmlDoc = std::unique_ptr<xmlDoc, XmlDocFree>;

XmlDoc ParseXml(const std::string& data) {
  return XmlDoc(xmlReadMemory(data.data(), static_cast<int>(data.size()), nullptr, nullptr, SafeXmlOptions()));
}

// "slide10.xml" after "slide9.xml": numbers inside names compare by value.
bool NaturalLess(const std::string& a, const std::string& b) {
  size_t i = 0, j = 0;
  while (i < a.size() && j < b.size()) {
    if (isdigit(static_cast<unsigned char>(a[i])) && isdigit(static_cast<unsigned char>(b[j]))) {
      size_t i_end = i, j_end = j;
      while (i_end < a.size() && isdigit(static_cast<unsigned char>(a[i_end]))) ++i_end;
      while (j_end < b.size() && isdigit(static_cast<unsigned char>(b[j_end]))) ++j_end;
      const std::string x = a.substr(i, i_end - i), y = b.substr(j, j_end - j);
      if (x.size() != y.size()) return x.size() < y.size();
      if (x != y) return x < y;
      i = i_end;
      j = j_end;
      continue;
    }
    if (a[i] != b[j]) return a[i] < b[j];
    ++i;
    ++j;
  }
  return a.size() - i < b.size() - j;
}

// Names of the parts under `folder` whose file name starts with `prefix`, in natural order.
std::vector<std::string> PartsLike(const Parts& parts, const std::string& folder, const std::string& prefix) {
  std::vector<std::string> names;
  for (const auto& part : parts) {
    if (!StartsWith(part.first, folder + prefix) || !EndsWith(part.first, ".xml")) continue;
    if (part.first.find('/', folder.size()) != std::string::npos) continue;
    names.push_back(part.first);
  }
  std::sort(names.begin(), names.end(), NaturalLess);
  return names;
}

void AppendPartText(const Parts& parts, const std::string& name, const char* blocks, TextSink& text) {
  const auto found = parts.find(name);
  if (found == parts.end() || text.full()) return;
  const XmlDoc doc = ParseXml(found->second);
  if (!doc || xmlDocGetRootElement(doc.get()) == nullptr) throw ExtractError("a damaged part: " + name);
  // In the Office Open XML formats only <t> elements hold text; elsewhere
  // (properties, relations) text nodes are numbers and identifiers.
  const xmlNode* root = xmlDocGetRootElement(doc.get());
  std::vector<const xmlNode*> stack = {root};
  while (!stack.empty() && !text.full()) {
    const xmlNode* node = stack.back();
    stack.pop_back();
    if (node->type != XML_ELEMENT_NODE) continue;
    const std::string local = LocalName(node);
    if (local == "t") {
      CollectText(node, nullptr, nullptr, text);
      continue;
    }
    if (local == "tab") text.Space();
    if (local == "br" || local == "cr") text.Break();
    if (blocks != nullptr && local == blocks) text.Break();
    std::vector<const xmlNode*> children;
    for (const xmlNode* child = node->children; child != nullptr; child = child->next) children.push_back(child);
    for (auto it = children.rbegin(); it != children.rend(); ++it) stack.push_back(*it);
  }
  text.Break();
}

void SetText(Json::Value& fields, const char* field, const std::string& value) {
  const std::string clean = CleanUtf8(value);
  if (!clean.empty() && !fields.isMember(field)) fields[field] = clean;
}

void SetDate(Json::Value& fields, const char* field, const std::string& value) {
  int64_t seconds;
  if (!fields.isMember(field) && ParseIsoDate(value, &seconds)) fields[field] = static_cast<Json::Int64>(seconds);
}

// Dublin Core and friends, as the Office Open XML core properties, the
// OpenDocument meta part and the e-book package all write them.
void ReadDublinCore(const xmlNode* root, Json::Value& fields) {
  SetText(fields, kFieldTitle, FirstElementText(root, "title"));
  SetText(fields, kFieldAuthors, FirstElementText(root, "creator"));
  SetText(fields, kFieldAuthors, FirstElementText(root, "initial-creator"));
  SetText(fields, kFieldDescription, FirstElementText(root, "description"));
  SetText(fields, kFieldDescription, FirstElementText(root, "subject"));
  SetText(fields, kFieldKeywords, FirstElementText(root, "keywords"));
  SetText(fields, kFieldKeywords, FirstElementText(root, "keyword"));
  SetText(fields, kFieldCreator, FirstElementText(root, "generator"));
  SetDate(fields, kFieldContentCreationDate, FirstElementText(root, "created"));
  SetDate(fields, kFieldContentCreationDate, FirstElementText(root, "creation-date"));
  SetDate(fields, kFieldContentModificationDate, FirstElementText(root, "modified"));
}

void ReadMetadataPart(const Parts& parts, const std::string& name, Json::Value& fields) {
  const auto found = parts.find(name);
  if (found == parts.end()) return;
  const XmlDoc doc = ParseXml(found->second);
  if (doc && xmlDocGetRootElement(doc.get()) != nullptr) ReadDublinCore(xmlDocGetRootElement(doc.get()), fields);
}

void RequirePart(const Parts& parts, const std::string& name, const char* format) {
  if (parts.find(name) == parts.end()) throw ExtractError(std::string("not a ") + format + " document: " + name + " is missing");
}

void ExtractOpenDocument(const Parts& parts, const char* format, TextSink& text, Json::Value& fields) {
  RequirePart(parts, "content.xml", format);
  ReadMetadataPart(parts, "meta.xml", fields);
  const XmlDoc doc = ParseXml(parts.at("content.xml"));
  if (!doc || xmlDocGetRootElement(doc.get()) == nullptr) throw ExtractError("a damaged part: content.xml");
  // Paragraphs, headings and cells end a line; the office:settings-like
  // parts (styles, scripts) are not text.
  CollectText(xmlDocGetRootElement(doc.get()), "p h table-cell list-item", "font-face-decls automatic-styles scripts",
              text);
}

// The text of an e-book: META-INF/container.xml names the package file; its
// spine lists the chapters in reading order.
void ExtractEpub(const Parts& parts, TextSink& text, Json::Value& fields) {
  RequirePart(parts, "META-INF/container.xml", "epub");
  const XmlDoc container = ParseXml(parts.at("META-INF/container.xml"));
  std::string package_name;
  if (container && xmlDocGetRootElement(container.get()) != nullptr) {
    std::vector<const xmlNode*> stack = {xmlDocGetRootElement(container.get())};
    while (!stack.empty() && package_name.empty()) {
      const xmlNode* node = stack.back();
      stack.pop_back();
      if (node->type == XML_ELEMENT_NODE && LocalName(node) == "rootfile") {
        xmlChar* path = xmlGetProp(node, BAD_CAST "full-path");
        if (path != nullptr) package_name = reinterpret_cast<const char*>(path);
        xmlFree(path);
      }
      for (const xmlNode* child = node->children; child != nullptr; child = child->next) stack.push_back(child);
    }
  }
  const auto package_part = parts.find(package_name);
  if (package_part == parts.end()) throw ExtractError("not an epub document: its package file is missing");
  const XmlDoc package = ParseXml(package_part->second);
  if (!package || xmlDocGetRootElement(package.get()) == nullptr) throw ExtractError("a damaged part: " + package_name);
  const xmlNode* root = xmlDocGetRootElement(package.get());
  ReadDublinCore(root, fields);
  SetText(fields, kFieldIdentifier, FirstElementText(root, "identifier"));
  SetDate(fields, kFieldContentCreationDate, FirstElementText(root, "date"));

  const std::string base = package_name.find('/') == std::string::npos
                               ? std::string()
                               : package_name.substr(0, package_name.rfind('/') + 1);
  std::map<std::string, std::string> manifest;  // id -> part name
  std::vector<std::string> spine;
  std::vector<const xmlNode*> stack = {root};
  while (!stack.empty()) {
    const xmlNode* node = stack.back();
    stack.pop_back();
    if (node->type == XML_ELEMENT_NODE) {
      const std::string local = LocalName(node);
      auto property = [node](const char* name) {
        xmlChar* value = xmlGetProp(node, BAD_CAST name);
        std::string text = value != nullptr ? reinterpret_cast<const char*>(value) : "";
        xmlFree(value);
        return text;
      };
      if (local == "item") manifest[property("id")] = base + property("href");
      if (local == "itemref") spine.push_back(property("idref"));
    }
    std::vector<const xmlNode*> children;
    for (const xmlNode* child = node->children; child != nullptr; child = child->next) children.push_back(child);
    for (auto it = children.rbegin(); it != children.rend(); ++it) stack.push_back(*it);
  }
  for (const std::string& id : spine) {
    if (text.full()) break;
    const auto item = manifest.find(id);
    if (item == manifest.end()) continue;
    const auto chapter = parts.find(item->second);
    if (chapter == parts.end()) continue;
    // Chapters are XHTML; the HTML parser also copes with the named
    // entities and sloppy markup that real books carry.
    const XmlDoc doc(htmlReadMemory(chapter->second.data(), static_cast<int>(chapter->second.size()), nullptr,
                                    "UTF-8", SafeHtmlOptions()));
    if (!doc || xmlDocGetRootElement(doc.get()) == nullptr) continue;
    CollectText(xmlDocGetRootElement(doc.get()), "p div br li h1 h2 h3 h4 h5 h6 tr blockquote pre", "head script style",
                text);
  }
}

}  // namespace

void ExtractOffice(int fd, OfficeFormat format, TextSink& text, Json::Value& fields) {
  const Parts parts = ReadParts(fd);
  switch (format) {
    case OfficeFormat::kDocx: {
      RequirePart(parts, "word/document.xml", "docx");
      ReadMetadataPart(parts, "docProps/core.xml", fields);
      AppendPartText(parts, "word/document.xml", "p", text);
      for (const char* prefix : {"header", "footer"}) {
        for (const std::string& name : PartsLike(parts, "word/", prefix)) AppendPartText(parts, name, "p", text);
      }
      AppendPartText(parts, "word/footnotes.xml", "p", text);
      AppendPartText(parts, "word/endnotes.xml", "p", text);
      break;
    }
    case OfficeFormat::kXlsx: {
      RequirePart(parts, "xl/workbook.xml", "xlsx");
      ReadMetadataPart(parts, "docProps/core.xml", fields);
      AppendPartText(parts, "xl/sharedStrings.xml", "si", text);
      for (const std::string& name : PartsLike(parts, "xl/worksheets/", "sheet")) AppendPartText(parts, name, "c", text);
      break;
    }
    case OfficeFormat::kPptx: {
      RequirePart(parts, "ppt/presentation.xml", "pptx");
      ReadMetadataPart(parts, "docProps/core.xml", fields);
      for (const std::string& name : PartsLike(parts, "ppt/slides/", "slide")) AppendPartText(parts, name, "p", text);
      for (const std::string& name : PartsLike(parts, "ppt/notesSlides/", "notesSlide")) {
        AppendPartText(parts, name, "p", text);
      }
      break;
    }
    case OfficeFormat::kOdt:
      ExtractOpenDocument(parts, "odt", text, fields);
      break;
    case OfficeFormat::kOds:
      ExtractOpenDocument(parts, "ods", text, fields);
      break;
    case OfficeFormat::kOdp:
      ExtractOpenDocument(parts, "odp", text, fields);
      break;
    case OfficeFormat::kEpub:
      ExtractEpub(parts, text, fields);
      break;
  }
}

}  // namespace extract
}  // namespace platform
}  // namespace corvlumex
