// The pieces of extraction that need no worker: file-system fields, the
// privilege string, the text cap, encodings, dates and the field table.
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include "platform/linux/extract/document_fields.h"
#include "platform/linux/extract/file_fields.h"
#include "platform/linux/extract/parsers/dates.h"
#include "platform/linux/extract/parsers/encoding.h"
#include "platform/linux/extract/parsers/text_sink.h"
#include "tests/platform/linux/extract/expect_fields.h"
#include "tests/support/sandbox.h"

namespace corvlumex {
namespace platform {
namespace extract {
namespace {

using testing_support::ExpectFields;
using testing_support::Sandbox;

TEST(PrivilegeString, ShowsTypeBitsAndSpecialBitsLikeLs) {
  EXPECT_EQ("-rw-r--r--", PrivilegeString(S_IFREG | 0644, false));
  EXPECT_EQ("drwxr-x---", PrivilegeString(S_IFDIR | 0750, false));
  EXPECT_EQ("-rwsr-xr-x", PrivilegeString(S_IFREG | S_ISUID | 0755, false));
  EXPECT_EQ("-rwSr--r--", PrivilegeString(S_IFREG | S_ISUID | 0644, false));
  EXPECT_EQ("drwxrws--T", PrivilegeString(S_IFDIR | S_ISGID | S_ISVTX | 0770, false));
  EXPECT_EQ("drwxrwxrwt", PrivilegeString(S_IFDIR | S_ISVTX | 0777, false));
  EXPECT_EQ("lrwxrwxrwx", PrivilegeString(S_IFLNK | 0777, false));
  EXPECT_EQ("-rw-rw----+", PrivilegeString(S_IFREG | 0660, true));
}

TEST(FileFields, FillsEveryFileSystemFieldOfAFile) {
  Sandbox root(false);
  const std::string path = root.WriteFile("dir/Report.Final.PDF", "12345");
  ASSERT_EQ(0, chmod(path.c_str(), 0640));
  FileStatus status;
  ASSERT_TRUE(ReadFileStatus(path, &status));
  Json::Value document;
  FillFileFields(path, status, document);
  struct stat st;
  ASSERT_EQ(0, stat(path.c_str(), &st));
  const auto text = [](const std::string& value) { return "\"" + value + "\""; };
  ExpectFields(document,
               {{kFieldPath, text(path)}, {kFieldParent, text(root.path() + "/dir")},
                {kFieldFSName, R"("Report.Final.PDF")"},
                {kFieldDisplayName, R"("Report.Final.PDF")"}, {kFieldExtension, R"("pdf")"},
                {kFieldKind, R"("pdf")"}, {kFieldIsDir, "false"},
                {kFieldPrivilege, R"("-rw-r-----")"},
                {kFieldOwnerUserID, text(std::to_string(getuid()))},
                {kFieldOwnerGroupID, text(std::to_string(getgid()))}, {kFieldFSSize, "5"},
                {kFieldLogicalSize, "5"}, {kFieldContentChangeDate, std::to_string(st.st_mtime)},
                {kFieldAttributeChangeDate, std::to_string(st.st_ctime)},
                {kFieldLastUsedDate, std::to_string(st.st_atime)},
                {kFieldPhysicalSize, std::to_string(st.st_blocks * 512)}});
  // Creation time only where the file system keeps one, and then no later
  // than the last change.
  if (status.has_birth_time) {
    EXPECT_LE(document[kFieldCreationDate].asInt64(), document[kFieldAttributeChangeDate].asInt64());
  } else {
    EXPECT_FALSE(document.isMember(kFieldCreationDate));
  }
}

TEST(FileFields, FolderAndLinkAreDescribedThemselves) {
  Sandbox root(false);
  const std::string folder = root.MakeDir("a.d");
  const std::string link = root.path() + "/link.txt";
  ASSERT_EQ(0, symlink("/etc/hostname", link.c_str()));
  FileStatus status;
  Json::Value document;
  ASSERT_TRUE(ReadFileStatus(folder, &status));
  FillFileFields(folder, status, document);
  EXPECT_TRUE(document[kFieldIsDir].asBool());
  EXPECT_EQ('d', document[kFieldPrivilege].asString()[0]);
  EXPECT_EQ("d", document[kFieldExtension].asString());  // as a rename would write it
  ASSERT_TRUE(ReadFileStatus(link, &status));
  FillFileFields(link, status, document);
  EXPECT_EQ("lrwxrwxrwx", document[kFieldPrivilege].asString());
  EXPECT_EQ(static_cast<Json::Int64>(strlen("/etc/hostname")), document[kFieldFSSize].asInt64());
  EXPECT_FALSE(ReadFileStatus(root.path() + "/missing", &status));
}

// The sink cuts at the cap on a character boundary, repairs invalid UTF-8
// and control characters, collapses breaks and drops trailing blanks.
TEST(TextSink, CutsRepairsAndTrims) {
  TextSink capped(10);
  capped.Append("abcdefgh");
  capped.Append("\xC3\xA9\xC3\xA9");  // two 2-byte characters: only one fits
  EXPECT_TRUE(capped.full());
  capped.Append("more");
  EXPECT_EQ("abcdefgh\xC3\xA9", capped.text());
  TextSink sink;
  sink.Append(std::string("a\xFF" "b\xC3" "c\x01" "d\x00" "e\xED\xA0\x80" "f\tg\n", 16));
  EXPECT_EQ("a\xEF\xBF\xBD" "b\xEF\xBF\xBD" "c d e\xEF\xBF\xBD\xEF\xBF\xBD\xEF\xBF\xBD" "f\tg\n", sink.text());
  EXPECT_EQ("x y", CleanUtf8("  x y \n"));
  TextSink lines;
  lines.Break();
  lines.Append("one  ");
  lines.Break();
  lines.Break();
  lines.Append("two");
  EXPECT_EQ("one\ntwo", lines.Trimmed());
}

TEST(Encoding, ConvertsCommonEncodingsToUtf8) {
  struct Case {
    std::string bytes;
    std::string expected;
    std::string encoding;
  };
  const Case cases[] = {
      {"plain ascii", "plain ascii", "UTF-8"},
      {"\xEF\xBB\xBFwith mark \xC3\xA9", "with mark \xC3\xA9", "UTF-8"},
      {std::string("\xFF\xFEh\0i\0", 6), "hi", "UTF-16LE"},
      {std::string("\xFE\xFF\0h\0i", 6), "hi", "UTF-16BE"},
      {std::string("h\0e\0l\0l\0o\0 \0w\0o\0r\0l\0d\0", 22), "hello world", "UTF-16LE"},
      {std::string("\xFF\xFE\0\0h\0\0\0", 8), "h", "UTF-32LE"},
      {"Gr\xFC\xDF" "e aus M\xFCnchen, sch\xF6ne Stra\xDF" "e und Caf\xE9 f\xFCr alle Gr\xFC\xDF" "e",
       "Gr\xC3\xBC\xC3\x9F" "e aus M\xC3\xBCnchen, sch\xC3\xB6ne Stra\xC3\x9F" "e und Caf\xC3\xA9 f\xC3\xBCr alle Gr\xC3\xBC\xC3\x9F" "e", ""},
  };
  for (const Case& c : cases) {
    std::string out;
    const std::string used = ConvertToUtf8(c.bytes, &out);
    EXPECT_EQ(c.expected, out) << used;
    if (!c.encoding.empty()) {
      EXPECT_EQ(c.encoding, used);
    }
  }
}

TEST(Encoding, RecognisesJapaneseShiftJis) {
  // "日本語のテキストです。" several times in Shift-JIS.
  std::string sjis;
  for (int i = 0; i < 8; ++i) sjis += "\x93\xfa\x96\x7b\x8c\xea\x82\xcc\x83\x65\x83\x4c\x83\x58\x83\x67\x82\xc5\x82\xb7\x81\x42";
  std::string out;
  const std::string used = ConvertToUtf8(sjis, &out);
  EXPECT_EQ("SHIFT_JIS", used);
  EXPECT_EQ(0u, out.find("\xE6\x97\xA5\xE6\x9C\xAC\xE8\xAA\x9E"));  // 日本語
}

TEST(Dates, ParsesDocumentAndPhotoDates) {
  int64_t seconds = 0;
  EXPECT_TRUE(ParseIsoDate("2021-03-04T05:06:07.000000Z", &seconds));
  EXPECT_EQ(1614834367, seconds);
  EXPECT_TRUE(ParseIsoDate("2021-03-04T07:06:07+02:00", &seconds));
  EXPECT_EQ(1614834367, seconds);
  EXPECT_TRUE(ParseIsoDate("2021-03-04", &seconds));
  EXPECT_EQ(1614816000, seconds);
  EXPECT_FALSE(ParseIsoDate("yesterday", &seconds));
  EXPECT_FALSE(ParseIsoDate("2021-13-04", &seconds));
  EXPECT_TRUE(ParseExifDate("2020:01:02 03:04:05", &seconds));
  EXPECT_EQ(1577934245, seconds);
  EXPECT_FALSE(ParseExifDate("0000:00:00 00:00:00", &seconds));
}

TEST(ContentFields, OnlyKnownFieldsWithTheirSchemaTypes) {
  FieldType type;
  ASSERT_TRUE(ContentFieldType(kFieldDuration, &type));
  EXPECT_TRUE(ValueFitsType(Json::Value(2.5), type));
  EXPECT_FALSE(ValueFitsType(Json::Value("2.5"), type));
  ASSERT_TRUE(ContentFieldType(kFieldISOSpeed, &type));
  EXPECT_TRUE(ValueFitsType(Json::Value(400), type));
  EXPECT_FALSE(ValueFitsType(Json::Value(2.5), type));
  EXPECT_FALSE(ValueFitsType(Json::Value(true), type));
  ASSERT_TRUE(ContentFieldType(kFieldExposureTime, &type));
  EXPECT_TRUE(ValueFitsType(Json::Value("1/125"), type));
  EXPECT_FALSE(ValueFitsType(Json::Value(125), type));
  // The worker may not set the fields the library itself fills.
  EXPECT_FALSE(ContentFieldType(kFieldPath, &type));
  EXPECT_FALSE(ContentFieldType(kFieldPrivilege, &type));
  EXPECT_FALSE(ContentFieldType("CORVMDSomethingElse", &type));
}

}  // namespace
}  // namespace extract
}  // namespace platform
}  // namespace corvlumex
