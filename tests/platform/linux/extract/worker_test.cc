// Extraction through the platform hook, as the indexer calls it: a confined
// worker process per call site, failures as errors for one file, and the
// next file always served.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <unistd.h>

#include <chrono>
#include <cstdlib>
#include <map>
#include <thread>
#include <vector>

#include "common/error.h"
#include "common/frame_reader.h"
#include "common/json_util.h"
#include "platform/linux/extract/document_fields.h"
#include "platform/linux/extract/worker_client.h"
#include "platform/linux/extract/worker_protocol.h"
#include "platform/linux/linux_platform.h"
#include "tests/platform/linux/extract/expect_fields.h"
#include "tests/support/extract_samples.h"
#include "tests/support/child_process.h"
#include "tests/support/expect_error.h"
#include "tests/support/frame_client.h"
#include "tests/support/sandbox.h"

namespace corvlumex {
namespace platform {
namespace extract {
namespace {

using testing_support::MakeOffice;
using testing_support::MakePdf;
using testing_support::RunTool;
using testing_support::Sandbox;
using testing_support::Truncate;
using testing_support::WriteBytes;
using testing_support::Frame;
using testing_support::WriteCompressed;

class WorkerTest : public ::testing::Test {
 protected:
  void SetUp() override {
    const char* build = std::getenv("FILEINDEX_BUILD_DIR");
    ASSERT_NE(nullptr, build) << "the tests run from ctest, which names the build folder";
    setenv("CORVLUMEX_EXTRACT_WORKER",
           (std::string(build) + "/programs/corvcontentextractd/corvcontentextractd").c_str(), 1);
    unsetenv("CORVLUMEX_EXTRACT_TEST_HOOK");
    unsetenv("CORVLUMEX_EXTRACT_TIMEOUT_MS");
    StopIdleExtractWorkers();
  }
  void TearDown() override {
    unsetenv("CORVLUMEX_EXTRACT_TEST_HOOK");
    unsetenv("CORVLUMEX_EXTRACT_TIMEOUT_MS");
    StopIdleExtractWorkers();
  }

  std::string PathOf(const std::string& name) const { return root_.path() + "/" + name; }

  Json::Value Parse(const std::string& name, bool need_meta = true) {
    Json::Value options(Json::objectValue);
    options["need_meta"] = need_meta;
    Json::Value document;
    platform_.ParseFile(PathOf(name), options, document);
    return document;
  }

  // The document of `name`, or null after checking that it failed as one bad
  // file does: a parse error with a reason, nothing else.
  Json::Value ParsedOrFailed(const std::string& name) {
    try {
      return Parse(name);
    } catch (const Error& error) {
      EXPECT_EQ(kErrorParseDocument, error.code) << name;
      EXPECT_FALSE(error.reason.empty()) << name;
      return Json::Value();
    }
  }

  // The reason a file's content could not be read. The file still gets its
  // document, with the file-system fields and the failure, so it stays
  // findable; fails the test when the content was read.
  std::string FailureOf(const std::string& name) {
    const Json::Value document = Parse(name);
    EXPECT_EQ(PathOf(name), document[kFieldPath].asString());
    EXPECT_TRUE(document[kFieldExtractionFailed].asBool()) << name << " was expected to fail";
    EXPECT_FALSE(document.isMember(kFieldTextContent)) << name;
    return document[kFieldExtractionError].asString();
  }

  Sandbox root_{false};
  LinuxPlatform platform_;
  testing_support::LogCapture log_;
};

TEST_F(WorkerTest, EveryFormatWholeGivesItsFieldsAndTruncatedOrGarbageFailsAlone) {
  MakePdf(PathOf("whole.pdf"), {"Budget for the year"}, "Budget", "Finance Team");
  for (const char* format : {"docx", "odt", "epub"}) {
    MakeOffice(PathOf(std::string("whole.") + format), format, {std::string(format) + " words"}, "T", "A");
  }
  WriteBytes(PathOf("whole.txt"), "text words");
  WriteBytes(PathOf("whole.html"), "<html><body><p>html words</p></body></html>");
  const std::string ffmpeg = "ffmpeg -nostdin -loglevel error -y -f lavfi -i ";
  for (const char* ext : {"mp3", "ogg"}) {
    RunTool(ffmpeg + "sine=duration=1 -metadata title=Tune " + PathOf(std::string("whole.") + ext));
  }
  for (const char* ext : {"mp4", "mkv"}) {
    RunTool(ffmpeg + "testsrc=size=32x32:rate=5:duration=1 -c:v mpeg4 " + PathOf(std::string("whole.") + ext));
  }
  for (const char* ext : {"jpg", "tif"}) {
    RunTool(ffmpeg + "testsrc=size=32x32 -frames:v 1 " + PathOf(std::string("whole.") + ext));
    RunTool("exiftool -q -overwrite_original -Make=Nikon " + PathOf(std::string("whole.") + ext));
  }
  // The file fields come with the content fields.
  const Json::Value pdf = Parse("whole.pdf", false);
  testing_support::ExpectFields(pdf, {{kFieldPath, JsonToString(PathOf("whole.pdf"))},
                                      {kFieldParent, JsonToString(root_.path())}, {kFieldFSName, R"("whole.pdf")"},
                                      {kFieldExtension, R"("pdf")"}, {kFieldTitle, R"("Budget")"},
                                      {kFieldMediaTypes, R"("application/pdf")"}});

  std::string noise;
  unsigned int state = 12345;
  for (int i = 0; i < 40000; ++i) noise += static_cast<char>((state = state * 1103515245 + 12345) >> 16);
  // Each format whole (with one of its fields), cut short, and as garbage.
  const struct {
    const char* ext;
    const char* field;
    const char* value;
  } formats[] = {
      {"pdf", kFieldTextContent, "Budget for the year"}, {"docx", kFieldTextContent, "docx words"},
      {"odt", kFieldTextContent, "odt words"}, {"epub", kFieldTextContent, "epub words"},
      {"txt", kFieldTextContent, "text words"}, {"html", kFieldTextContent, "html words"},
      {"mp3", kFieldTitle, "Tune"}, {"ogg", kFieldTitle, "Tune"}, {"mp4", kFieldCodecs, "mpeg4"},
      {"mkv", kFieldCodecs, "mpeg4"}, {"jpg", kFieldMake, "Nikon"}, {"tif", kFieldMake, "Nikon"},
  };
  for (const auto& [ext, field, value] : formats) {
    SCOPED_TRACE(ext);
    const std::string whole = std::string("whole.") + ext;
    const std::string got = Parse(whole)[field].asString();
    EXPECT_EQ(value, got.substr(0, got.find("\xC2\xA0")));  // the e-book markup's blank
    const size_t size = testing_support::ReadBytes(PathOf(whole)).size();
    for (size_t cut : {size / 2, size / 5, static_cast<size_t>(3)}) {
      const std::string name = "cut" + std::to_string(cut) + "." + ext;
      Truncate(PathOf(whole), PathOf(name), cut);
      const Json::Value document = ParsedOrFailed(name);
      if (!document.isNull()) { EXPECT_EQ(PathOf(name), document[kFieldPath].asString()); }
    }
    const std::string garbage = std::string("garbage.") + ext;
    WriteBytes(PathOf(garbage), noise);
    ParsedOrFailed(garbage);
    // Whatever happened, the next file is served.
    EXPECT_EQ(PathOf(whole), Parse(whole)[kFieldPath].asString());
  }
}

// Text gets the same media type and words whichever process reads it: the
// indexer itself (a plain-text extension) or the worker (any other name, by
// its content); Samba's "public.plain-text" searches find files by that
// type. Run from ctest, the worker is found in the build folder it names;
// run as a program started by hand from the build tree (no ctest
// variables), whose worker is not beside it, the text is still read.
TEST_F(WorkerTest, TextFilesGetTheirTypeAndWordsWhereverTheyAreRead) {
  const std::string build = std::getenv("FILEINDEX_BUILD_DIR");
  WriteBytes(PathOf("a.dat"), "alpha");
  unsetenv("CORVLUMEX_EXTRACT_WORKER");  // FILEINDEX_BUILD_DIR alone, as ctest sets it
  EXPECT_EQ(build + "/programs/corvcontentextractd/corvcontentextractd", FindWorkerProgram());
  EXPECT_EQ("alpha", Parse("a.dat")[kFieldTextContent].asString());
  unsetenv("FILEINDEX_BUILD_DIR");
  StopIdleExtractWorkers();
  mkdir(PathOf("empty folder").c_str(), 0755);
  for (const char* name : {"notes.txt", "notes.md", "empty folder/readme", "README", "notes.dat"}) {
    SCOPED_TRACE(name);
    WriteBytes(PathOf(name), "plain words without an extension\n");
    const Json::Value document = Parse(name);
    EXPECT_EQ("text/plain", document[kFieldMediaTypes].asString()) << JsonToString(document);
    EXPECT_EQ("plain words without an extension", document[kFieldTextContent].asString());
  }
  setenv("FILEINDEX_BUILD_DIR", build.c_str(), 1);
}

TEST_F(WorkerTest, HostileContainersAndMarkupAreRefusedNotExpanded) {
  // A part that unpacks to 70 MiB from a few hundred KiB.
  testing_support::MakeZip(PathOf("bomb.docx"), {{"word/document.xml", std::string(70u << 20, ' ')}});
  EXPECT_NE(std::string::npos, FailureOf("bomb.docx").find("a part unpacks too large: word/document.xml"));
  // Entities that would expand to gigabytes.
  std::string laughs = "<?xml version=\"1.0\"?><!DOCTYPE l [<!ENTITY a \"lol\">";
  char previous = 'a';
  for (char name = 'b'; name <= 'k'; ++name, ++previous) {
    laughs += std::string("<!ENTITY ") + name + " \"" + std::string(10, '&') + "\">";
    std::string refs;
    for (int i = 0; i < 10; ++i) refs += std::string("&") + previous + ";";
    laughs.replace(laughs.rfind(std::string(10, '&')), 10, refs);
  }
  laughs += "]><l>start &k; end</l>";
  WriteBytes(PathOf("laughs.xml"), laughs);
  EXPECT_LT(ParsedOrFailed("laughs.xml")[kFieldTextContent].asString().size(), 1000u);
}

TEST_F(WorkerTest, ThreadsExtractAtTheSameTime) {
  for (int i = 0; i < 8; ++i) WriteBytes(PathOf("f" + std::to_string(i) + ".dat"), "text " + std::to_string(i));
  std::vector<std::thread> threads;
  std::vector<int> wrong(4, 0);
  for (int t = 0; t < 4; ++t) {
    threads.emplace_back([this, t, &wrong] {
      LinuxPlatform platform;
      for (int round = 0; round < 5; ++round) {
        for (int i = 0; i < 8; ++i) {
          Json::Value options(Json::objectValue), document;
          platform.ParseFile(PathOf("f" + std::to_string(i) + ".dat"), options, document);
          if (document[kFieldTextContent].asString() != "text " + std::to_string(i)) ++wrong[t];
        }
      }
    });
  }
  for (std::thread& thread : threads) thread.join();
  EXPECT_EQ(std::vector<int>(4, 0), wrong);
}

#if defined(__SANITIZE_ADDRESS__)
constexpr bool kSanitized = true;  // the worker runs without an address-space limit then
#else
constexpr bool kSanitized = false;
#endif

// A parser that loops, crashes, eats memory or tries what the confinement
// forbids (no network, no new process, no program run, no large file
// written, root's rights dropped), or no worker at all: the file fails alone,
// soon, with the reason, and the next file is served.
TEST_F(WorkerTest, AFileTheWorkerCannotReadFailsAloneWithItsReason) {
  WriteBytes(PathOf("a.dat"), "alpha");
  const std::string hook = "CORVLUMEX_EXTRACT_TEST_HOOK";
  const struct {
    const char* what;
    std::map<std::string, std::string> env;
    std::vector<std::string> reasons;
    bool needs_memory_limit = false;
  } cases[] = {
      {"a looping parser", {{hook, "spin"}, {"CORVLUMEX_EXTRACT_TIMEOUT_MS", "300"}}, {"longer than 300 ms"}},
      {"a crashing parser", {{hook, "crash"}}, {"signal 11"}},
      {"a memory-hungry parser", {{hook, "hog"}, {"CORVLUMEX_EXTRACT_MEMORY_MB", "256"}},
       {"out of memory (the worker may use 256 MiB)"}, true},
      {"a parser trying what it may not", {{hook, "probe"}},
       {"socket: Operation not permitted", "fork: Operation not permitted", "exec: Operation not permitted",
        "write file: File too large", getuid() == 0 ? "uid 65534" : "Operation not permitted"}},
      {"no worker program", {{"CORVLUMEX_EXTRACT_WORKER", PathOf("no-such-worker")}},
       {"corvcontentextractd was not found"}},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.what);
    if (kSanitized && c.needs_memory_limit) continue;
    for (const auto& [name, value] : c.env) setenv(name.c_str(), value.c_str(), 1);
    StopIdleExtractWorkers();  // the settings count for the workers started from now on
    const auto start = std::chrono::steady_clock::now();
    const std::string reason = FailureOf("a.dat");
    EXPECT_LT(std::chrono::steady_clock::now() - start, std::chrono::seconds(5));
    for (const std::string& words : c.reasons) EXPECT_NE(std::string::npos, reason.find(words)) << reason;
    for (const auto& entry : c.env) unsetenv(entry.first.c_str());
    SetUp();
    EXPECT_EQ("alpha", Parse("a.dat")[kFieldTextContent].asString());
  }
  EXPECT_EQ(1u, log_.Matching("a.dat failed: extraction took longer").size());
}

// The worker's own reading of requests, spoken to directly as the library
// does: a bad request is answered and the next one served; a cut one ends
// the conversation at once, never with a worker spinning on a closed socket.
TEST_F(WorkerTest, BadRequestsAreAnsweredAndACutOneEndsTheWorkerCleanly) {
  WriteBytes(PathOf("doc.txt"), "plain words");
  int ends[2];
  ASSERT_EQ(0, socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends));
  testing_support::ChildProcess worker(FindWorkerProgram(), {"--worker"}, PathOf("worker.log"), {}, ends[1]);
  close(ends[1]);
  const int library = ends[0];
  const auto ask = [&](bool with_file, const std::string& frame) {
    const int file = open(PathOf("doc.txt").c_str(), O_RDONLY | O_CLOEXEC);
    if (with_file) {
      EXPECT_TRUE(SendDescriptor(library, file));
    } else {
      EXPECT_EQ(1, write(library, "F", 1));  // the marker byte alone
    }
    close(file);
    EXPECT_EQ(static_cast<ssize_t>(frame.size()), write(library, frame.data(), frame.size()));
    std::string text;
    Json::Value reply;
    if (ReadFrameBounded(library, MaxReplyBytes(kTextContentCap), 20000, 20000, &text) != FrameStatus::kOk ||
        !JsonFromString(reply, text)) {
      ADD_FAILURE() << "no reply to " << frame << "; " << testing_support::ReadFileText(PathOf("worker.log"));
    }
    return reply;
  };
  const std::string good = Frame(R"({"name": ")" + PathOf("doc.txt") + R"(", "need_meta": false})");
  const struct {
    const char* what;
    bool with_file;
    std::string frame;
    const char* error;
  } cases[] = {
      {"not JSON", true, Frame("{not json"), "not JSON"},
      {"nesting past the JSON reader's limit", true, Frame(std::string(1001, '[') + std::string(1001, ']')), "not JSON"},
      {"a name that is an array", true, Frame(R"({"name": ["x"], "need_meta": false})"), "must be"},
      {"no descriptor with the request", false, good, "no file descriptor"},
  };
  for (const auto& c : cases) {
    const Json::Value reply = ask(c.with_file, c.frame);
    EXPECT_FALSE(reply["ok"].asBool()) << c.what;
    EXPECT_NE(reply["error"].asString().find(c.error), std::string::npos) << c.what << ": " << reply["error"].asString();
    const Json::Value served = ask(true, good);
    EXPECT_EQ("plain words", served["fields"][kFieldTextContent].asString()) << "after " << c.what;
  }
  const int file = open(PathOf("doc.txt").c_str(), O_RDONLY | O_CLOEXEC);
  ASSERT_TRUE(SendDescriptor(library, file));
  close(file);
  ASSERT_EQ(7, write(library, good.data(), 7));
  shutdown(library, SHUT_WR);
  EXPECT_TRUE(testing_support::PollUntil([&] { return !worker.Running(); }, std::chrono::seconds(20)));
  EXPECT_EQ(1, worker.exit_status());
  close(library);
}

TEST_F(WorkerTest, ACompressionBombIsCutNotFollowed) {
  if (kSanitized) GTEST_SKIP() << "the sanitizer build runs the worker without an address-space limit";
  // 512 MiB of text in a worker that may use 256 MiB: unpacking it whole
  // would kill the worker; cut at the text limit, the text comes through.
  WriteCompressed(PathOf("bomb.txt.zst"), "zst", std::string(512u << 20, 'x'));
  setenv("CORVLUMEX_EXTRACT_MEMORY_MB", "256", 1);
  setenv("CORVLUMEX_EXTRACT_TEXT_MB", "1", 1);
  StopIdleExtractWorkers();
  const Json::Value document = Parse("bomb.txt.zst");
  unsetenv("CORVLUMEX_EXTRACT_MEMORY_MB");
  unsetenv("CORVLUMEX_EXTRACT_TEXT_MB");
  EXPECT_FALSE(document.isMember(kFieldExtractionFailed)) << document[kFieldExtractionError].asString();
  EXPECT_EQ(1u << 20, document[kFieldTextContent].asString().size());
}

TEST_F(WorkerTest, UnreadableFileIsAnErrorNamingTheCause) {
  WriteBytes(PathOf("secret.txt"), "hidden");
  ASSERT_EQ(0, chmod(PathOf("secret.txt").c_str(), 0));
  ASSERT_EQ(0, chmod(root_.path().c_str(), 0755));
  // Root reads everything: look at the file as an ordinary user would.
  const bool as_root = geteuid() == 0;
  if (as_root) { ASSERT_EQ(0, seteuid(65534)); }
  const std::string reason = FailureOf("secret.txt");
  if (as_root) { ASSERT_EQ(0, seteuid(0)); }
  EXPECT_NE(std::string::npos, reason.find("cannot open " + PathOf("secret.txt") + ": Permission denied")) << reason;
  // A file that is gone has no document at all.
  const Error gone = testing_support::ErrorOf([&] { Parse("missing.txt"); });
  EXPECT_EQ(kErrorParseDocument, gone.code);
  EXPECT_NE(std::string::npos, gone.reason.find("No such file or directory")) << gone.reason;
}

TEST_F(WorkerTest, LinksPipesAndFoldersAreNotOpened) {
  ASSERT_EQ(0, symlink("/etc/passwd", PathOf("passwd.txt").c_str()));
  ASSERT_EQ(0, mkfifo(PathOf("pipe.txt").c_str(), 0644));
  root_.MakeDir("folder");
  const Json::Value link = Parse("passwd.txt");
  EXPECT_FALSE(link.isMember(kFieldTextContent));
  EXPECT_EQ('l', link[kFieldPrivilege].asString()[0]);
  EXPECT_FALSE(Parse("pipe.txt").isMember(kFieldTextContent));
  EXPECT_TRUE(Parse("folder")[kFieldIsDir].asBool());
}

TEST_F(WorkerTest, PrintShowsTheDocumentAsJson) {
  WriteBytes(PathOf("note.txt"), "print me");
  const std::string out = PathOf("out.json");
  const std::string program = std::getenv("CORVLUMEX_EXTRACT_WORKER");
  unsetenv("CORVLUMEX_EXTRACT_WORKER");
  const int status = std::system((program + " --print " + PathOf("note.txt") + " > " + out).c_str());
  EXPECT_EQ(0, status);
  Json::Value printed;
  Json::Reader().parse(testing_support::ReadBytes(out), printed);
  EXPECT_EQ("print me", printed[kFieldTextContent].asString());
  EXPECT_EQ(PathOf("note.txt"), printed[kFieldPath].asString());
  EXPECT_NE(0, std::system((program + " --print " + PathOf("missing") + " 2>/dev/null").c_str()));
  EXPECT_NE(0, std::system((program + " --bogus 2>/dev/null").c_str()));
}

}  // namespace
}  // namespace extract
}  // namespace platform
}  // namespace corvlumex
