#include "fileindex/paths/file_type.h"

#include <algorithm>
#include <unordered_map>

#include "common/file_util.h"

namespace corvlumex {
namespace fileindex {
namespace {

struct Category {
  FileType type;
  const char* name;
  std::vector<const char*> extensions;  // lower case, without the dot
};

const std::vector<Category>& Categories() {
  static const std::vector<Category> categories = {
      {kFileTypeDocument, "document",
       {// Word processing
        "doc", "docx", "docm", "dot", "dotx", "dotm", "odt", "ott", "fodt", "rtf", "wpd", "wps", "wri", "abw",
        "pages", "hwp",
        // Spreadsheets
        "xls", "xlsx", "xlsm", "xlsb", "xlt", "xltx", "xltm", "ods", "ots", "fods", "numbers", "et", "csv", "tsv",
        // Presentations and drawings
        "ppt", "pptx", "pptm", "pps", "ppsx", "pot", "potx", "odp", "otp", "fodp", "key", "dps", "odg", "vsd",
        "vsdx", "one",
        // Fixed layout
        "pdf", "xps", "oxps",
        // Text and markup
        "txt", "text", "md", "markdown", "rst", "adoc", "asciidoc", "org", "tex", "latex", "bib", "htm", "html",
        "xhtml", "mht", "mhtml", "xml", "eml", "msg",
        // E-books
        "epub", "mobi", "azw", "azw3", "kfx", "fb2", "djvu", "lit", "ibooks", "cbz", "cbr"}},
      {kFileTypeAudio, "audio",
       {"mp3", "aac", "m4a", "m4b", "m4r", "ogg", "oga", "opus", "wma", "wav", "wave", "aif", "aiff", "aifc",
        "mka", "mid", "midi", "amr", "ac3", "dts", "mpc", "ra", "au", "snd", "caf", "spx",
        // Lossless
        "flac", "alac", "ape", "wv", "tta", "dsf", "dff", "tak", "shn"}},
      {kFileTypeVideo, "video",
       {"mp4", "m4v", "mkv", "avi", "mov", "qt", "wmv", "asf", "flv", "f4v", "webm", "mpg", "mpeg", "mpe", "m2v",
        "m2ts", "mts", "ts", "tp", "trp", "vob", "3gp", "3g2", "ogv", "rm", "rmvb", "divx", "dv", "mxf", "wtv"}},
      {kFileTypeImage, "photo",
       {"jpg", "jpeg", "jpe", "jfif", "png", "gif", "bmp", "dib", "tif", "tiff", "webp", "heic", "heif", "hif",
        "avif", "jxl", "jp2", "j2k", "ico", "svg", "psd", "xcf", "tga", "pcx", "ppm", "pgm", "pbm", "pnm", "eps",
        // Camera RAW
        "dng", "cr2", "cr3", "crw", "nef", "nrw", "arw", "srf", "sr2", "orf", "rw2", "raf", "pef", "ptx", "raw",
        "rwl", "srw", "3fr", "erf", "kdc", "dcr", "mrw", "mos", "mef", "iiq", "x3f", "fff"}},
  };
  return categories;
}

const std::unordered_map<std::string, FileType>& ExtensionTable() {
  static const std::unordered_map<std::string, FileType> table = [] {
    std::unordered_map<std::string, FileType> built;
    for (const Category& category : Categories()) {
      for (const char* extension : category.extensions) built.emplace(extension, category.type);
    }
    return built;
  }();
  return table;
}

}  // namespace

FileType GetFileTypeByExtension(const std::string& extension) {
  const auto found = ExtensionTable().find(extension);
  return found == ExtensionTable().end() ? kFileTypeUnknown : found->second;
}

FileType GetFileTypeByFullPath(const std::string& full_path) {
  return GetFileTypeByExtension(GetFileExtension(full_path, true));
}

const char* FileTypeName(FileType type) {
  for (const Category& category : Categories()) {
    if (category.type == type) return category.name;
  }
  return "unknown";
}

bool GetFileTypeByCategory(const std::string& name, FileType* type) {
  for (const Category& category : Categories()) {
    if (name == category.name) {
      *type = category.type;
      return true;
    }
  }
  return false;
}

std::vector<std::string> GetExtensionsByCategory(const std::string& name) {
  std::vector<std::string> extensions;
  for (const Category& category : Categories()) {
    if (name == category.name) extensions.assign(category.extensions.begin(), category.extensions.end());
  }
  std::sort(extensions.begin(), extensions.end());
  return extensions;
}

}  // namespace fileindex
}  // namespace corvlumex
