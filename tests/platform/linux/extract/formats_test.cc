// Each format's fields, read in this process straight from the parsers (so
// the sanitizer build checks them too). The worker around them is tested in
// worker_test.cc.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include "common/file_util.h"
#include "platform/linux/extract/document_fields.h"
#include "platform/linux/extract/parsers/extract_content.h"
#include "platform/linux/extract/parsers/formats.h"
#include "platform/linux/extract/parsers/text_sink.h"
#include "platform/linux/extract/plain_text.h"
#include "tests/platform/linux/extract/expect_fields.h"
#include "tests/support/extract_samples.h"
#include "tests/support/sandbox.h"

namespace corvlumex {
namespace platform {
namespace extract {
namespace {

using testing_support::ExpectFields;
using testing_support::MakeOffice;
using testing_support::MakePdf;
using testing_support::RunTool;
using testing_support::Sandbox;
using testing_support::WriteBytes;
using testing_support::WriteCompressed;

class FormatsTest : public ::testing::Test {
 protected:
  static void SetUpTestSuite() { SilenceParserLibraries(); }

  std::string PathOf(const std::string& name) const { return root_.path() + "/" + name; }

  Json::Value Extract(const std::string& name, bool need_meta = true) {
    const int fd = open(PathOf(name).c_str(), O_RDONLY | O_CLOEXEC);
    EXPECT_GE(fd, 0) << name;
    Json::Value fields;
    try {
      fields = ExtractContent(fd, name, need_meta, text_cap_);
    } catch (...) {
      close(fd);
      throw;
    }
    close(fd);
    return fields;
  }

  Sandbox root_{false};
  size_t text_cap_ = kTextContentCap;
};

// Text in other encodings becomes UTF-8; text is typed by its name or a
// clear signature, never by a guess of markup (an HTML parser would drop the
// words in <head>); XML keeps its values apart and never fetches entities.
TEST_F(FormatsTest, TextIsReadByItsNameOrSignatureInUtf8) {
  const struct {
    const char* name;
    std::string content;
    const char* text;
    bool whole;  // the text is exactly this, else it holds it
  } cases[] = {
      {"latin.txt", "Caf\xE9 cr\xE8me br\xFBl\xE9" "e na\xEFve gar\xE7on r\xE9sum\xE9 fa\xE7" "ade d\xE9j\xE0 vu",
       "Caf\xC3\xA9 cr\xC3\xA8me br\xC3\xBBl\xC3\xA9" "e na\xC3\xAFve gar\xC3\xA7on r\xC3\xA9sum\xC3\xA9 fa\xC3\xA7"
       "ade d\xC3\xA9j\xC3\xA0 vu", true},
      {"wide.txt", std::string("\xFF\xFEw\0i\0d\0e\0", 10), "wide", true},
      {"README", "Read me first: how to build.\nSecond line of the notes.\n",
       "Read me first: how to build.\nSecond line of the notes.", true},
      // Sources whose names the extractor knows, and a Perl module libmagic calls JavaScript.
      {"Parser.pm", "package Parser;\nuse strict;\n# returns <b>bold</b> text\nsub new { return bless {}, shift; }\n1;",
       "returns <b>bold</b> text", false},
      {"unit.pas", "unit Demo;\n{ <html> in a comment }\ninterface\nprocedure Hello;\nimplementation\nend.",
       "<html> in a comment", false},
      // No known extension: HTML only with its signature, else plain text.
      {"NOTES", "Write <b>bold</b> in <i>pages</i>; a <p> starts a paragraph.\nSecond line.",
       "a <p> starts a paragraph.", false},
      // libmagic calls this HTML for its tags.
      {"DemoUnit", "unit Demo;\n{ <head> remark </head> }\ninterface\nprocedure Hello;\n", "{ <head> remark </head> }",
       false},
      {"page", "<!DOCTYPE html><html><body><p>real page</p></body></html>", "real page", true},
      {"data.xml", "<?xml version=\"1.0\"?><!DOCTYPE r [<!ENTITY x SYSTEM \"file:///etc/passwd\">]>"
       "<r><a>alpha</a><b>beta</b><c>&x;</c></r>", "alpha\nbeta", true},
  };
  for (const auto& c : cases) {
    WriteBytes(PathOf(c.name), c.content);
    const std::string text = Extract(c.name)[kFieldTextContent].asString();
    EXPECT_TRUE(c.whole ? text == c.text : text.find(c.text) != std::string::npos) << c.name << ": " << text;
  }
  EXPECT_EQ("text/plain", Extract("latin.txt")[kFieldMediaTypes].asString());
  WriteBytes(PathOf("blob.bin"), std::string("\x7F" "ELF\x02\x01\x01\0\0\0\0\0\0\0\0\0\x03\0\x3E\0", 20));
  const Json::Value binary = Extract("blob.bin");
  EXPECT_FALSE(binary.isMember(kFieldTextContent));
  EXPECT_NE("", binary[kFieldMediaTypes].asString());
}

// Plain text the indexer reads itself must give the very text the worker
// would; whatever needs an encoding guess or a parser is left to the worker.
TEST_F(FormatsTest, PlainTextReadInProcessGivesTheWorkersTextOrIsLeftToIt) {
  const struct {
    const char* name;
    std::string bytes;
    bool in_process;
  } cases[] = {
      {"notes.txt", "  Caf\xC3\xA9 cr\xC3\xA8me\r\n\tsecond\x01line\x7F end \n", true},
      {"marked.md", "\xEF\xBB\xBF# Title\nbody \xFF broken", true},
      {"cut.h", "int x; // \xE2\x82", true},
      {"Upper.PM", "package Upper; 1;", true},
      {"blank.c", " \n\t\n", true},
      {"latin.txt", "Caf\xE9 cr\xE8me", false},
      {"wide.txt", std::string("\xFF\xFEw\0i\0", 6), false},
      {"zero.txt", std::string("text\0more", 9), false},
      {"page.html", "<html><body>words</body></html>", false},
      {"README", "no extension: the worker's media type decides", false},
      {"big.txt", std::string(kInProcessTextBytes + 1, 'x'), false},
  };
  for (const auto& c : cases) {
    WriteBytes(PathOf(c.name), c.bytes);
    const int fd = open(PathOf(c.name).c_str(), O_RDONLY | O_CLOEXEC);
    ASSERT_GE(fd, 0) << c.name;
    Json::Value fields(Json::objectValue);
    const bool read = ReadPlainTextInProcess(fd, PathOf(c.name), c.bytes.size(), text_cap_, fields);
    close(fd);
    EXPECT_EQ(c.in_process, read) << c.name;
    if (!read) {
      EXPECT_EQ(0u, fields.size()) << c.name;
      continue;
    }
    const Json::Value worker = Extract(c.name);
    EXPECT_EQ(worker.isMember(kFieldTextContent), fields.isMember(kFieldTextContent)) << c.name;
    EXPECT_EQ(worker[kFieldTextContent].asString(), fields[kFieldTextContent].asString()) << c.name;
    EXPECT_EQ(PlainTextMediaType(GetFileExtension(c.name, true)), fields[kFieldMediaTypes].asString()) << c.name;
  }
}

TEST_F(FormatsTest, TextIsCappedAtTheSettingWhoseDefaultKeepsLongFilesWhole) {
  WriteBytes(PathOf("long.txt"), std::string(3u << 20, 'x'));
  EXPECT_EQ(3u << 20, Extract("long.txt")[kFieldTextContent].asString().size());
  text_cap_ = 1000;
  EXPECT_EQ(1000u, Extract("long.txt")[kFieldTextContent].asString().size());
}

TEST_F(FormatsTest, HtmlKeepsTextAndHeadFieldsNotScripts) {
  WriteBytes(PathOf("page.html"),
             "<html><head><meta charset=\"iso-8859-1\"><title>Caf\xE9 page</title><meta name=\"author\" "
             "content=\"Ann Lee\"><meta name=\"description\" content=\"About coffee\"><style>p{}</style></head>"
             "<body><h1>Menu</h1><p>Espresso &amp; cr\xE8me</p><script>var hidden = 1;</script></body></html>");
  ExpectFields(Extract("page.html"),
               {{kFieldTextContent, "\"Menu\\nEspresso & cr\xC3\xA8me\""},
                {kFieldTitle, "\"Caf\xC3\xA9 page\""}, {kFieldAuthors, R"("Ann Lee")"},
                {kFieldDescription, R"("About coffee")"}});
}

TEST_F(FormatsTest, SingleCompressedFilesAndManPagesGiveTheirText) {
  const std::string page =
      ".\\\" a comment\n.TH LS 1 \"2024\"\n.SH NAME\nls \\- list directory contents\n.SH DESCRIPTION\n"
      "List information about the \\fBFILEs\\fR (the current \\fIdirectory\\fP by default).\n.TP\n.B \\-a\n"
      "do not ignore entries starting with .\n.sp 2\n";
  const char* page_words = "list directory contents";
  WriteBytes(PathOf("ls.1"), page);
  for (const char* suffix : {"gz", "bz2", "xz", "zst"}) {
    SCOPED_TRACE(suffix);
    WriteCompressed(PathOf(std::string("notes.txt.") + suffix), suffix, "saffron rice, caf\xC3\xA9 cr\xC3\xA8me");
    EXPECT_EQ("saffron rice, caf\xC3\xA9 cr\xC3\xA8me", Extract(std::string("notes.txt.") + suffix)[kFieldTextContent].asString());
    WriteCompressed(PathOf(std::string("ls.1.") + suffix), suffix, page);
    const std::string text = Extract(std::string("ls.1.") + suffix)[kFieldTextContent].asString();
    EXPECT_NE(text.find(page_words), std::string::npos) << text;
    EXPECT_NE(text.find("FILEs (the current directory by default)"), std::string::npos) << text;
    EXPECT_EQ(text.find(".TH"), std::string::npos) << text;
    EXPECT_EQ(text.find("fB"), std::string::npos) << text;
    EXPECT_EQ(text.find("a comment"), std::string::npos) << text;
  }
  EXPECT_EQ(Extract("ls.1")[kFieldTextContent].asString(), Extract("ls.1.gz")[kFieldTextContent].asString());
  // An archive inside (.tar.gz) is no text: only the name and status are kept.
  WriteCompressed(PathOf("bundle.tar.gz"), "gz", std::string("ustar\0\0\0binary", 14));
  EXPECT_FALSE(Extract("bundle.tar.gz").isMember(kFieldTextContent));
  // Garbage under a compressed name fails as any broken file does.
  WriteBytes(PathOf("broken.gz"), "not gzip at all");
  EXPECT_THROW(Extract("broken.gz"), std::exception);
}

TEST_F(FormatsTest, PdfTextPagesAndInformation) {
  MakePdf(PathOf("doc.pdf"), {"First page words", "Second page words"}, "Quarterly Report", "Jane Doe");
  ExpectFields(Extract("doc.pdf", false),
               {{kFieldTextContent, R"("First page words\nSecond page words")"},
                {kFieldTitle, R"("Quarterly Report")"}, {kFieldAuthors, R"("Jane Doe")"},
                {kFieldContentCreationDate, "1577934245"},
                {kFieldMediaTypes, R"("application/pdf")"}});
}

TEST_F(FormatsTest, OfficeDocumentsTextAndProperties) {
  const std::pair<const char*, const char*> cases[] = {
      {"docx", "Alpha paragraph\nBeta paragraph"},
      {"xlsx", "Alpha paragraph\nBeta paragraph\ninline cell"},
      {"pptx", "Alpha paragraph\nBeta paragraph"},
      {"odt", "Alpha paragraph\nBeta paragraph"},
      {"ods", "Alpha paragraph\nBeta paragraph"},
      {"odp", "Alpha paragraph\nBeta paragraph"},
      {"epub", "Alpha paragraph\nBeta paragraph"},
  };
  for (const auto& [format, expected_text] : cases) {
    SCOPED_TRACE(format);
    const std::string name = std::string("sample.") + format;
    MakeOffice(PathOf(name), format, {"Alpha paragraph", "Beta paragraph"}, "The Title", "Sam Author");
    const Json::Value fields = Extract(name, false);
    // Non-breaking spaces of the e-book's markup count as blanks at the end.
    std::string text = fields[kFieldTextContent].asString();
    for (size_t at; (at = text.find("\xC2\xA0")) != std::string::npos;) text.erase(at, 2);
    EXPECT_EQ(expected_text, text);
    ExpectFields(fields, {{kFieldTitle, R"("The Title")"}, {kFieldAuthors, R"("Sam Author")"}});
    if (std::string(format) == "epub") {
      EXPECT_EQ("urn:isbn:9780000000001", fields[kFieldIdentifier].asString());
    } else {
      EXPECT_EQ(1640995200, fields[kFieldContentCreationDate].asInt64());
    }
  }
}

TEST_F(FormatsTest, AudioTagsAndPropertiesOnlyWithMetaInMp3AndFlac) {
  RunTool("ffmpeg -nostdin -loglevel error -y -f lavfi -i sine=frequency=440:duration=2 -ac 2 -ar 44100 -b:a 128k "
          "-metadata title='Blue Song' -metadata artist='The Players' -metadata album='First Album' "
          "-metadata composer='Ann Writer' -metadata genre=Jazz -metadata track=7 -metadata date=2019 "
          "-metadata comment='Live take' " + PathOf("song.mp3"));
  const Json::Value fields = Extract("song.mp3");
  ExpectFields(fields,
               {{kFieldTitle, R"("Blue Song")"}, {kFieldAuthors, R"("The Players")"},
                {kFieldAlbum, R"("First Album")"}, {kFieldComposer, R"("Ann Writer")"},
                {kFieldGenre, R"("Jazz")"}, {kFieldComment, R"("Live take")"},
                {kFieldTrackNumber, "7"}, {kFieldRecordingYear, "2019"},
                {kFieldSampleRate, "44100"}, {kFieldChannelCount, "2"},
                {kFieldMediaTypes, R"("audio/mpeg")"}});
  EXPECT_NEAR(2.0, fields[kFieldDuration].asDouble(), 0.1);
  EXPECT_NEAR(128, fields[kFieldAudioBitRate].asInt(), 8);
  const Json::Value without = Extract("song.mp3", false);
  EXPECT_FALSE(without.isMember(kFieldTitle));
  EXPECT_FALSE(without.isMember(kFieldDuration));
  // FLAC keeps its tags in another form.
  RunTool("ffmpeg -nostdin -loglevel error -y -f lavfi -i sine=duration=1 -ar 48000 -metadata title=Calm "
          "-metadata artist=Quartet -metadata track=3 " + PathOf("calm.flac"));
  ExpectFields(Extract("calm.flac"),
               {{kFieldTitle, R"("Calm")"}, {kFieldAuthors, R"("Quartet")"},
                {kFieldTrackNumber, "3"}, {kFieldSampleRate, "48000"}, {kFieldChannelCount, "1"}});
}

TEST_F(FormatsTest, PhotoExifFieldsAndResolutionInCentimetres) {
  RunTool("ffmpeg -nostdin -loglevel error -y -f lavfi -i testsrc=size=64x48 -frames:v 1 " + PathOf("photo.jpg"));
  RunTool("exiftool -q -overwrite_original -Make=Canon '-Model=EOS 5D' -ISO=400 -ExposureTime=1/125 -FNumber=2.8 "
          "-XResolution=300 -YResolution=240 -ResolutionUnit=inches '-DateTimeOriginal=2020:01:02 03:04:05' " +
          PathOf("photo.jpg"));
  ExpectFields(Extract("photo.jpg"),
               {{kFieldMake, R"("Canon")"}, {kFieldModel, R"("EOS 5D")"}, {kFieldISOSpeed, "400"},
                {kFieldExposureTime, R"("1/125")"}, {kFieldAperture, R"("f/2.8")"},
                {kFieldResolutionWidthDPI, "300"}, {kFieldResolutionHeightDPI, "240"},
                {kFieldPixelWidth, "64"}, {kFieldPixelHeight, "48"},
                {kFieldContentCreationDate, "1577934245"}, {kFieldMediaTypes, R"("image/jpeg")"}});
  EXPECT_FALSE(Extract("photo.jpg", false).isMember(kFieldMake));
  // A resolution in centimetres is converted to dots per inch.
  RunTool("ffmpeg -nostdin -loglevel error -y -f lavfi -i testsrc=size=32x32 -frames:v 1 " + PathOf("scan.jpg"));
  RunTool("exiftool -q -overwrite_original -XResolution=100 -YResolution=100 -ResolutionUnit=cm -ExposureTime=2.5 " +
          PathOf("scan.jpg"));
  ExpectFields(Extract("scan.jpg"),
               {{kFieldResolutionWidthDPI, "254"}, {kFieldExposureTime, R"("2.5")"}});
}

TEST_F(FormatsTest, VideoDurationBitRatesAndCodecs) {
  RunTool("ffmpeg -nostdin -loglevel error -y -f lavfi -i testsrc=size=160x120:rate=10:duration=2 -f lavfi "
          "-i sine=duration=2 -c:v mpeg4 -b:v 300k -c:a aac -b:a 64k -ar 48000 -metadata title=Holiday "
          "-metadata creation_time=2021-03-04T05:06:07Z " + PathOf("clip.mp4"));
  const Json::Value fields = Extract("clip.mp4");
  ExpectFields(fields,
               {{kFieldCodecs, R"("mpeg4 aac")"}, {kFieldPixelWidth, "160"},
                {kFieldPixelHeight, "120"}, {kFieldSampleRate, "48000"}, {kFieldChannelCount, "1"},
                {kFieldTitle, R"("Holiday")"}, {kFieldContentCreationDate, "1614834367"}});
  EXPECT_NEAR(2.0, fields[kFieldDuration].asDouble(), 0.1);
  EXPECT_GT(fields[kFieldVideoBitRate].asInt(), 0);
  EXPECT_NEAR(64, fields[kFieldAudioBitRate].asInt(), 16);
  EXPECT_GT(fields[kFieldTotalBitRate].asInt(), fields[kFieldVideoBitRate].asInt());
  EXPECT_FALSE(Extract("clip.mp4", false).isMember(kFieldCodecs));
}

TEST_F(FormatsTest, GarbageUnderADocumentNameIsAClearFailure) {
  WriteBytes(PathOf("fake.pdf"), "this is not a pdf at all");
  WriteBytes(PathOf("fake.docx"), "PK\x03\x04 not really a zip");
  WriteBytes(PathOf("empty-zip.odt"), "PK\x05\x06" + std::string(18, '\0'));
  EXPECT_THROW(Extract("fake.pdf"), std::exception);
  EXPECT_THROW(Extract("fake.docx"), std::exception);
  try {
    Extract("empty-zip.odt");
    FAIL() << "an empty container is no document";
  } catch (const std::exception& error) {
    EXPECT_NE(std::string::npos, std::string(error.what()).find("content.xml")) << error.what();
  }
}

}  // namespace
}  // namespace extract
}  // namespace platform
}  // namespace corvlumex
