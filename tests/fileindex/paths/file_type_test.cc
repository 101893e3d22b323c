#include <gtest/gtest.h>

#include <algorithm>
#include <cctype>
#include <set>

#include "fileindex/paths/file_type.h"

namespace corvlumex {
namespace fileindex {
namespace {

TEST(FileTypeTest, CommonFilesByPath) {
  struct Case {
    const char* path;
    FileType type;
  };
  for (const Case& c : {Case{"/v/s/report.docx", kFileTypeDocument}, Case{"/v/s/Budget.XLSX", kFileTypeDocument},
                        Case{"/v/s/a.pdf", kFileTypeDocument}, Case{"/v/s/notes.md", kFileTypeDocument},
                        Case{"/v/s/book.epub", kFileTypeDocument}, Case{"/v/s/slides.odp", kFileTypeDocument},
                        Case{"/v/s/song.mp3", kFileTypeAudio}, Case{"/v/s/album.FLAC", kFileTypeAudio},
                        Case{"/v/s/take.wav", kFileTypeAudio}, Case{"/v/s/hires.dsf", kFileTypeAudio},
                        Case{"/v/s/movie.mkv", kFileTypeVideo}, Case{"/v/s/clip.MOV", kFileTypeVideo},
                        Case{"/v/s/rec.m2ts", kFileTypeVideo}, Case{"/v/s/IMG_0001.HEIC", kFileTypeImage},
                        Case{"/v/s/raw.CR3", kFileTypeImage}, Case{"/v/s/raw.nef", kFileTypeImage},
                        Case{"/v/s/scan.tiff", kFileTypeImage}, Case{"/v/s/photo.jpeg", kFileTypeImage}}) {
    EXPECT_EQ(GetFileTypeByFullPath(c.path), c.type) << c.path;
  }
}

TEST(FileTypeTest, UnknownIsFour) {
  EXPECT_EQ(kFileTypeUnknown, 4);
  EXPECT_EQ(GetFileTypeByFullPath("/v/s/archive.tar.gz"), kFileTypeUnknown);
  EXPECT_EQ(GetFileTypeByFullPath("/v/s/Makefile"), kFileTypeUnknown);
  EXPECT_EQ(GetFileTypeByFullPath("/v/s.pdf/README"), kFileTypeUnknown);  // a dot in a folder does not count
  EXPECT_EQ(GetFileTypeByFullPath("/v/s/trailing."), kFileTypeUnknown);
  EXPECT_EQ(GetFileTypeByFullPath(""), kFileTypeUnknown);
  EXPECT_EQ(GetFileTypeByExtension("PDF"), kFileTypeUnknown);  // the table holds lower case only
}

TEST(FileTypeTest, CategoriesAreDisjointSortedAndLowerCase) {
  std::set<std::string> seen;
  for (const char* category : {"document", "audio", "video", "photo"}) {
    FileType type = kFileTypeUnknown;
    ASSERT_TRUE(GetFileTypeByCategory(category, &type)) << category;
    EXPECT_STREQ(FileTypeName(type), category);
    const std::vector<std::string> extensions = GetExtensionsByCategory(category);
    EXPECT_GT(extensions.size(), 10u) << category;
    EXPECT_TRUE(std::is_sorted(extensions.begin(), extensions.end())) << category;
    for (const std::string& extension : extensions) {
      EXPECT_TRUE(seen.insert(extension).second) << extension << " is in two categories";
      EXPECT_EQ(GetFileTypeByExtension(extension), type) << extension;
      for (char c : extension) EXPECT_FALSE(isupper(static_cast<unsigned char>(c))) << extension;
    }
  }
  FileType type = kFileTypeDocument;
  EXPECT_FALSE(GetFileTypeByCategory("unknown", &type));
  EXPECT_FALSE(GetFileTypeByCategory("Document", &type));
  EXPECT_EQ(type, kFileTypeDocument);
  EXPECT_TRUE(GetExtensionsByCategory("music").empty());
  EXPECT_STREQ(FileTypeName(kFileTypeUnknown), "unknown");
}

}  // namespace
}  // namespace fileindex
}  // namespace corvlumex
