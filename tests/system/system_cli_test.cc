// End to end: the fileindex command line refuses what it cannot do before
// changing anything, says what was wrong and what to do next, exits
// non-zero then, and tells the truth in its status.
#include <gtest/gtest.h>
#include <stdlib.h>
#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <filesystem>
#include <set>
#include <sstream>

#include "common/json_util.h"
#include "fileindex/state/communication.h"
#include "tests/system/system_harness.h"

namespace corvlumex {
namespace testing_support {
namespace {
namespace fs = std::filesystem;

struct Refusal {
  std::vector<std::string> args;
  std::vector<std::string> said;  // each must be in the error output
};

std::string FolderFile(const SystemSandbox& box) {
  return ReadFileText(box.root() + "/var/packages/CorvLumex/etc/fileindex.folders");
}

std::string StatusFile(const SystemSandbox& box) {
  return ReadFileText(box.root() + "/var/packages/CorvLumex/etc/fileindex.status");
}

// Runs `args`: it succeeds (or fails, as `ok` says) and prints each of
// `texts` on its standard output.
::testing::AssertionResult Prints(const std::vector<std::string>& args, bool ok,
                                  const std::vector<std::string>& texts) {
  const CliResult r = RunCli(args);
  if ((r.status == 0) != ok) return ::testing::AssertionFailure() << "exit " << r.status << r.err;
  for (const std::string& text : texts) {
    if (r.out.find(text) == std::string::npos) return ::testing::AssertionFailure() << r.out;
  }
  return ::testing::AssertionSuccess();
}

// Runs `args`: it fails, and says `text` on its standard error.
::testing::AssertionResult Complains(const std::vector<std::string>& args,
                                     const std::string& text) {
  const CliResult r = RunCli(args);
  if (r.status == 0) return ::testing::AssertionFailure() << "exit 0: " << r.out;
  if (r.err.find(text) == std::string::npos) return ::testing::AssertionFailure() << r.err;
  return ::testing::AssertionSuccess();
}

// Each refusal exits non-zero, names the problem, and leaves the folder and
// status files as they were.
void ExpectRefusals(const SystemSandbox& box, const std::vector<Refusal>& refusals) {
  for (const Refusal& refusal : refusals) {
    const std::string folders = FolderFile(box), status = StatusFile(box);
    const CliResult result = RunCli(refusal.args);
    std::string command;
    for (const std::string& arg : refusal.args) command += arg + " ";
    EXPECT_NE(result.status, 0) << command << "\n" << result.out << result.err;
    for (const std::string& words : refusal.said) {
      EXPECT_NE(result.err.find(words), std::string::npos) << command << ": no \"" << words << "\" in " << result.err;
    }
    EXPECT_EQ(result.err.find(": \n"), std::string::npos) << command << ": an error without a reason: " << result.err;
    EXPECT_EQ(FolderFile(box), folders) << command;
    EXPECT_EQ(StatusFile(box), status) << command;
  }
}

TEST(SystemCliTest, BadArgumentsAreRefusedWithWhatToDoAndChangeNothing) {
  if (geteuid() != 0) GTEST_SKIP() << "the management operations write root's files: run as root";
  SystemSandbox box;
  fs::create_directories(box.Path("docs"));
  WriteText(box.Path("docs/menu.txt"), "saffron paella");
  const std::string outside = box.root() + "/outside";
  fs::create_directories(outside);
  box.StartAll();
  const CliResult added = RunCli({"folder", "add", "/share/docs", "--wait", "--timeout", "60"});
  ASSERT_EQ(added.status, 0) << added.err;
  EXPECT_NE(added.out.find("added /share/docs"), std::string::npos) << added.out;

  ExpectRefusals(box, {
      {{"folder", "add", box.Path("docs/menu.txt")}, {"is a file, not a folder"}},
      {{"folder", "add", "/share/docs/menu.txt"}, {"is a file, not a folder"}},
      {{"folder", "add", "docs"}, {"\"docs\" is a relative path", "/share/dir"}},
      {{"folder", "add", "/share/nothing"}, {"/share/nothing does not exist"}},
      {{"folder", "add", outside}, {"is outside every share", "the shares are: share (" + box.share_dir() + ")"}},
      {{"folder", "add", "/nosuch/dir"}, {"does not exist", "the shares are: share ("}},
      {{"folder", "add", "/share/docs"}, {"error 901", "already indexed", "fileindex folder reindex /share/docs"}},
      {{"folder", "reindex", "/share/nothing"}, {"error 902", "not an indexed folder", "/share/docs"}},
      {{"folder", "delete", "docs"}, {"relative path"}},
      {{"folder", "get", "/share/other"}, {"error 902", "the indexed folders are: /share/docs"}},
      {{"share", "rename", "nosuch", "other"}, {"error 800", "no share named \"other\"", "the shares are: share"}},
      {{"share", "rename", "nosuch", "share"}, {"no folder of share nosuch is indexed"}},
      {{"share", "pause", "nosuch"}, {"no share named \"nosuch\""}},
      {{"share", "check-recycle", "nosuch"}, {"no share named \"nosuch\""}},
      {{"volume", "pause", "relative"}, {"\"relative\" is a relative path"}},
      {{"volume", "pause", "/nowhere"}, {"no share lies on /nowhere", "the shares are: share"}},
      {{"user", "rename", "alice", "bob"}, {"no indexed folder lies in the home of alice"}},
      {{"serch", "saffron"}, {"unknown command \"serch\"; did you mean \"search\"?"}},
      {{"folder", "ad", "/share/docs"}, {"did you mean \"folder add\"?"}},
  });

  // What was done is said; a second pause says it found the share paused.
  EXPECT_TRUE(Prints({"share", "pause", "share"}, true, {"share share paused"}));
  EXPECT_TRUE(Prints({"share", "pause", "share"}, true, {"was already paused"}));
  const std::string volume = fs::path(box.share_dir()).parent_path().string();
  EXPECT_TRUE(Prints({"volume", "pause", volume}, true, {"paused the shares on"}));
  EXPECT_EQ(RunCli({"volume", "resume", volume}).status, 0);
  EXPECT_EQ(RunCli({"share", "resume", "share"}).status, 0);

  // A user who is not root is told so, and nothing is queued.
  const CliResult unprivileged = RunCli({"folder", "reindex", "/share/docs"}, 65534);
  EXPECT_NE(unprivileged.status, 0);
  EXPECT_NE(unprivileged.err.find("only root may do: run it as root"), std::string::npos) << unprivileged.err;
  EXPECT_EQ(unprivileged.out.find("reindexing"), std::string::npos) << unprivileged.out;
}

TEST(SystemCliTest, CommandsThatNeedADaemonThatIsDownChangeNothingAndSayHowToStartIt) {
  if (geteuid() != 0) GTEST_SKIP() << "the management operations write root's files: run as root";
  SystemSandbox box;
  fs::create_directories(box.Path("docs"));
  fs::create_directories(box.Path("more"));
  box.StartAll();
  ASSERT_EQ(RunCli({"folder", "add", "/share/docs"}).status, 0);
  box.StopIndexer(SIGTERM);
  const std::string start = "fileindexd is not running: start it with systemctl start pkg-CorvLumex-fileindexd";
  ExpectRefusals(box, {
      {{"folder", "add", "/share/more"}, {start, "nothing was changed"}},
      {{"folder", "delete", "/share/docs"}, {start}},
      {{"folder", "reindex", "/share/docs"}, {start}},
      {{"pause"}, {start}},
      {{"share", "pause", "share"}, {start}},
  });
  EXPECT_TRUE(Prints({"status"}, false, {"fileindexd: NOT RUNNING (start it with systemctl start "
                                         "pkg-CorvLumex-fileindexd)", "corvelasticd: running"}));
}

TEST(SystemCliTest, SearchWithTheSearchDaemonDownSaysWhichDaemonAndHowToStartIt) {
  SystemSandbox box;  // no daemon started
  for (const std::vector<std::string>& args : {std::vector<std::string>{"search", "saffron"},
                                                std::vector<std::string>{"suggest", "saf"}}) {
    EXPECT_TRUE(
        Complains(args, "corvelasticd is not running: start it with systemctl start corvelasticd"));
  }
  setenv("FILEINDEX_START_COMMAND", "scripts/run start", 1);
  const std::string start = ": NOT RUNNING (start it with scripts/run start)";
  EXPECT_TRUE(Prints({"status"}, false,
                     {"corvelasticd" + start, "corvnotifyd" + start, "fileindexd" + start}));
  unsetenv("FILEINDEX_START_COMMAND");
}

TEST(SystemCliTest, StatusCountsTheIndexAndSaysWhatTheIndexerDoes) {
  if (geteuid() != 0) GTEST_SKIP() << "the management operations write root's files: run as root";
  SystemSandbox box;
  fs::create_directories(box.Path("docs/inner"));
  WriteText(box.Path("docs/a.txt"), "one");
  WriteText(box.Path("docs/inner/b.txt"), "two");
  WriteText(box.Path("docs/inner/bad\x1b[2J.txt"), "crimson \x1b[31m tide");
  box.StartAll();
  ASSERT_EQ(RunCli({"folder", "add", "/share/docs", "--wait", "--timeout", "60"}).status, 0);
  ASSERT_EQ(box.Converge(box.DiskPaths("docs")), "");
  Json::Value status;
  const CliResult json = RunCli({"--json", "status"});
  EXPECT_EQ(json.status, 0) << json.err;
  ASSERT_TRUE(JsonFromString(status, json.out)) << json.out;
  const Json::Value& share = status["shares"]["share"];
  EXPECT_EQ(share["documents"].asInt64(), static_cast<Json::Int64>(box.IndexedPaths().size()));
  EXPECT_GT(share["index_bytes"].asInt64(), 0);
  EXPECT_EQ(share["total_failed"].asInt64(), 0);
  EXPECT_EQ(share["activity"].asString(), "up to date, watching for changes");
  for (const char* daemon : {"corvelasticd", "corvnotifyd", "fileindexd"}) {
    EXPECT_TRUE(status["daemons"][daemon]["running"].asBool()) << daemon;
  }
  EXPECT_TRUE(Prints({"status"}, true, {"indexing: on (not paused)"}));
  ASSERT_EQ(RunCli({"pause"}).status, 0);
  EXPECT_TRUE(Prints({"status"}, true, {"indexing: paused until resumed (fileindex resume)"}));
  ASSERT_EQ(RunCli({"resume"}).status, 0);

  // A name's or a content's escape sequence reaches no terminal through a search.
  const CliResult found = RunCli({"search", "crimson"});
  EXPECT_EQ(found.status, 0) << found.err;
  EXPECT_EQ(found.out.find('\x1b'), std::string::npos) << found.out;
  EXPECT_NE(found.out.find("bad\\x1b[2J.txt"), std::string::npos) << found.out;
}

// Column positions in display cells of the line's UTF-8 text.
size_t DisplayColumn(const std::string& line, const std::string& cell) {
  const size_t at = line.find(cell);
  if (at == std::string::npos) return std::string::npos;
  size_t columns = 0;
  for (size_t i = 0; i < at; ++i) {
    const unsigned char byte = static_cast<unsigned char>(line[i]);
    if ((byte & 0xC0) == 0x80) continue;  // continuation byte
    columns += byte >= 0xE3 && byte <= 0xE9 ? 2 : 1;  // the CJK ideographs used below take two cells
  }
  return columns;
}

TEST(SystemCliTest, TablesAlignByDisplayWidthAndShowControlCharactersEscaped) {
  if (geteuid() != 0) GTEST_SKIP() << "the management operations write root's files: run as root";
  SystemSandbox box;
  const std::vector<std::string> names = {"plain", "caf\xc3\xa9", "\xe6\x9d\xb1\xe4\xba\xac", "bad\x1b[2Jname"};
  for (size_t i = 0; i < names.size(); ++i) fs::create_directories(box.Path("d" + std::to_string(i)));
  box.StartAll();
  for (size_t i = 0; i < names.size(); ++i) {
    const CliResult added = RunCli({"folder", "add", "/share/d" + std::to_string(i), "--name", names[i]});
    ASSERT_EQ(added.status, 0) << added.err;
  }
  const CliResult listed = RunCli({"folder", "list"});
  ASSERT_EQ(listed.status, 0) << listed.err;
  EXPECT_EQ(listed.out.find('\x1b'), std::string::npos) << "a control character reached the terminal";
  EXPECT_NE(listed.out.find("bad\\x1b[2Jname"), std::string::npos) << listed.out;
  // The DOCUMENT column starts at the same display column on every line.
  std::istringstream lines(listed.out);
  std::string line;
  std::set<size_t> columns;
  while (std::getline(lines, line)) {
    if (line.find("/share/d") == std::string::npos && line.find("PATH") == std::string::npos) continue;
    const std::string cell = line.find("PATH") == 0 ? "DOCUMENT" : "yes";
    columns.insert(DisplayColumn(line, cell));
  }
  EXPECT_EQ(columns.size(), 1u) << listed.out;
}

// system_add_share of the run command's shell library; returns the name it
// printed.
std::string AddShareAsTheRunCommandDoes(const std::string& dir, int expected_status = 0) {
  fs::create_directories(dir);
  const std::string out = testing::TempDir() + "/add-share-" + std::to_string(getpid());
  const std::string command = "bash -c 'set -euo pipefail; source \"" FILEINDEX_SOURCE_DIR
                              "/scripts/lib/system.sh\"; system_add_share \"$0\"' '" + dir + "' > '" + out + "'";
  const int status = system(command.c_str());
  EXPECT_EQ(WIFEXITED(status) ? WEXITSTATUS(status) : -1, expected_status) << command;
  std::string name = ReadFileText(out);
  unlink(out.c_str());
  while (!name.empty() && name.back() == '\n') name.pop_back();
  return name;
}

TEST(SystemCliTest, TheRunCommandAddsSharesBesideThoseAlreadyIndexed) {
  if (geteuid() != 0) GTEST_SKIP() << "the management operations write root's files: run as root";
  SystemSandbox box;
  fs::create_directories(box.Path("docs"));
  box.StartAll();
  ASSERT_EQ(RunCli({"folder", "add", "/share/docs"}).status, 0);
  EXPECT_EQ(AddShareAsTheRunCommandDoes(box.root() + "/volume2/docs"), "docs");
  EXPECT_EQ(AddShareAsTheRunCommandDoes(box.root() + "/volume2/docs"), "docs");  // registered once
  EXPECT_EQ(AddShareAsTheRunCommandDoes(box.root() + "/volume3/docs", 1), "");   // a second "docs" is refused
  EXPECT_EQ(AddShareAsTheRunCommandDoes(box.root() + "/volume3/notes"), "notes");
  // The folder of the first share still has its share: folder commands work.
  EXPECT_TRUE(Prints({"folder", "list"}, true, {"/share/docs"}));
  EXPECT_TRUE(Prints({"folder", "add", "/notes"}, true, {}));
  EXPECT_TRUE(Prints({"share", "list"}, true, {"share ", "docs ", "notes "}));

  // A registry that lost an indexed share (what rewriting it used to do):
  // the error names the share instead of an empty reason.
  ShareRegistry(box.root()).Add("docs", box.root() + "/volume2/docs");  // the only share now
  EXPECT_TRUE(
      Complains({"folder", "list"}, "shares the share registry no longer lists: notes, share"));
}

TEST(SystemCliTest, FoldersSearchAndPausesOfTheIndexerAndOfAShare) {
  SystemSandbox box;
  fs::create_directories(box.Path("docs"));
  WriteText(box.Path("docs/menu.txt"), "saffron paella");
  box.StartAll();
  CliResult added = RunCli({"folder", "add", "/share/docs", "--wait", "--timeout", "60"});
  ASSERT_EQ(added.status, 0) << added.err;
  EXPECT_TRUE(Prints({"search", "saffron"}, true, {box.Path("docs/menu.txt")}));
  // Paging and the share filter, as scripts read them.
  WriteText(box.Path("docs/menu2.txt"), "saffron risotto");
  ASSERT_TRUE(PollUntil([&] { return box.Search("saffron").size() == 2; }, std::chrono::seconds(30)));
  Json::Value page;
  CliResult second = RunCli({"--json", "search", "saffron", "--share", "share", "--size", "1", "--from", "1"});
  ASSERT_TRUE(JsonFromString(page, second.out)) << second.out << second.err;
  EXPECT_EQ(page["total"].asInt(), 2);
  EXPECT_EQ(page["hits"].size(), 1u);
  CliResult by_name = RunCli({"--json", "search", "menu2", "--name"});
  ASSERT_TRUE(JsonFromString(page, by_name.out)) << by_name.out;
  ASSERT_EQ(page["hits"].size(), 1u);
  EXPECT_EQ(page["hits"][0]["fields"]["CORVMDPath"].asString(), box.Path("docs/menu2.txt"));
  // Words as separate arguments, options before or after them; a phrase keeps its order.
  for (const std::vector<std::string>& args :
       {std::vector<std::string>{"--json", "search", "--share", "share", "saffron", "paella"},
        std::vector<std::string>{"--json", "search", "saffron", "paella", "--share", "share"},
        std::vector<std::string>{"--json", "search", "\"saffron paella\""}}) {
    CliResult words = RunCli(args);
    ASSERT_TRUE(JsonFromString(page, words.out)) << words.out << words.err;
    ASSERT_EQ(page["hits"].size(), 1u) << words.out;
    EXPECT_EQ(page["hits"][0]["fields"]["CORVMDPath"].asString(), box.Path("docs/menu.txt"));
  }
  ASSERT_TRUE(JsonFromString(page, RunCli({"--json", "search", "\"paella saffron\""}).out));
  EXPECT_EQ(page["total"].asInt(), 0);
  EXPECT_TRUE(Complains({"search", "(saffron"}, "never closed"));
  // The indexer keeps the name suggestions current by itself.
  ASSERT_TRUE(PollUntil([&] { return RunCli({"suggest", "men"}).out.find("menu") != std::string::npos; },
                        std::chrono::seconds(30)));
  // A file whose content cannot be read is still found by name, and listed with the reason.
  WriteText(box.Path("docs/broken.pdf"), "%PDF-1.4 not really a PDF");
  ASSERT_TRUE(PollUntil([&] { return box.Search("broken").size() == 1; }, std::chrono::seconds(30)));
  // The file may be indexed first as created (empty), then as written.
  CliResult failed;
  EXPECT_TRUE(PollUntil(
      [&] { return (failed = RunCli({"failed"})).out.find(box.Path("docs/broken.pdf")) != std::string::npos; },
      std::chrono::seconds(30)))
      << failed.out;
  EXPECT_EQ(failed.status, 0) << failed.err;
  EXPECT_NE(failed.out.find("1 file(s)"), std::string::npos) << failed.out;
  EXPECT_TRUE(Complains({"search", "saffron", "--share", "nosuch"}, "fileindex: error 2010"));
  EXPECT_EQ(RunCli({"folder", "add", "--help"}).status, 0);
  CliResult extracted = RunCli({"extract", box.Path("docs/menu.txt")});
  ASSERT_TRUE(JsonFromString(page, extracted.out)) << extracted.err;
  EXPECT_NE(page["CORVMDTextContent"].asString().find("paella"), std::string::npos);

  CliResult listed;
  EXPECT_TRUE(PollUntil(
      [&] { return (listed = RunCli({"--json", "folder", "list"})).out.find("\"finished\"") != std::string::npos; },
      std::chrono::seconds(30)))
      << listed.out;
  // Pause stops the indexing of new changes until resume.
  ASSERT_EQ(RunCli({"pause"}).status, 0);
  WriteText(box.Path("docs/later.txt"), "written while paused");
  EXPECT_FALSE(PollUntil([&] { return !box.Search("paused").empty(); }, std::chrono::milliseconds(1500)));
  ASSERT_EQ(RunCli({"resume"}).status, 0);
  ASSERT_EQ(box.Converge(box.DiskPaths("docs")), "");

  // A paused share has no worker until it is resumed.
  CliResult paused = RunCli({"share", "pause", "share"});
  ASSERT_EQ(paused.status, 0) << paused.err;
  Json::Value status;
  ASSERT_TRUE(JsonFromString(status, box.IndexerStatus()));
  EXPECT_EQ(status["shares"]["share"]["state"].asString(), "no worker");  // "worker_delete" was heard
  WriteText(box.Path("docs/held.txt"), "held back while the share is paused");
  EXPECT_FALSE(PollUntil([&] { return !box.Search("held").empty(); }, std::chrono::milliseconds(800)));
  CliResult resumed = RunCli({"share", "resume", "share"});
  ASSERT_EQ(resumed.status, 0) << resumed.err;
  ASSERT_EQ(box.Converge(box.DiskPaths("docs")), "");

  // A pause with a resume time, as the status manager sends it for some
  // hours, two seconds long here: it ends by itself.
  Json::Value pause(Json::objectValue);
  const auto resume_time = std::chrono::system_clock::now() + std::chrono::seconds(2);
  pause["resume_time"] = static_cast<Json::Int64>(std::chrono::system_clock::to_time_t(resume_time));
  fileindex::SendCommandToDaemon("pause", pause);
  WriteText(box.Path("docs/queued.txt"), "waits for the pause to end");
  EXPECT_FALSE(PollUntil([&] { return !box.Search("waits").empty(); }, std::chrono::milliseconds(800)));
  EXPECT_NE(box.IndexerStatus().find("\"paused\""), std::string::npos);
  ASSERT_EQ(box.Converge(box.DiskPaths("docs"), std::chrono::seconds(30)), "");
  EXPECT_GE(std::chrono::system_clock::now(), resume_time - std::chrono::seconds(1));
}

TEST(SystemCliTest, VersionAndTheCommandsAlone) {
  const CliResult version = RunCli({"--version"});
  EXPECT_EQ(version.status, 0);
  EXPECT_EQ(version.out.rfind("fileindex ", 0), 0u) << version.out;
  EXPECT_TRUE(Prints({}, true, {"folder", "status", "search", "share"}));
}

}  // namespace
}  // namespace testing_support
}  // namespace corvlumex
