// End to end: the fileindex command line, against the real daemons started
// once in one sandbox, refuses what it cannot do before changing anything,
// says what was wrong and what to do next, exits non-zero then, and tells the
// truth in its status. Each step is a row: the command, how it ends, what it
// says.
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
constexpr size_t npos = std::string::npos;

// kDone: exit 0, `says` on standard output. kRefused: exit non-zero, `says`
// on standard error with a reason, the folder and status files unchanged.
// kFailed: exit non-zero, `says` on standard output (a status of daemons down).
enum Outcome { kDone, kRefused, kFailed };
struct Row {
  Outcome outcome;
  std::vector<std::string> args;
  std::vector<std::string> says;
};

std::string StateFiles(const SystemSandbox& box) {
  const std::string etc = box.root() + "/var/packages/CorvLumex/etc/fileindex.";
  return ReadFileText(etc + "folders") + ReadFileText(etc + "status");
}

void ExpectRows(const SystemSandbox& box, const std::vector<Row>& rows) {
  for (const Row& row : rows) {
    std::string command;
    for (const std::string& arg : row.args) command += arg + " ";
    SCOPED_TRACE(command);
    const std::string before = StateFiles(box);
    const CliResult r = RunCli(row.args);
    EXPECT_EQ(r.status == 0, row.outcome == kDone) << "exit " << r.status << "\n" << r.out << r.err;
    const std::string& said = row.outcome == kRefused ? r.err : r.out;
    for (const std::string& words : row.says) EXPECT_NE(said.find(words), npos) << "no \"" << words << "\" in " << said;
    // Names and contents may hold escape sequences: none reaches a terminal.
    EXPECT_EQ((r.out + r.err).find('\x1b'), npos) << "a control character reached the terminal";
    if (row.outcome != kRefused) continue;
    EXPECT_EQ(r.err.find(": \n"), npos) << "an error without a reason: " << r.err;
    EXPECT_EQ(StateFiles(box), before);
  }
}

Json::Value JsonOut(const std::vector<std::string>& args) {
  const CliResult r = RunCli(args);
  Json::Value value;
  EXPECT_TRUE(JsonFromString(value, r.out)) << r.out << r.err;
  return value;
}

// Column positions in display cells of the line's UTF-8 text.
size_t DisplayColumn(const std::string& line, const std::string& cell) {
  const size_t at = line.find(cell);
  if (at == npos) return npos;
  size_t columns = 0;
  for (size_t i = 0; i < at; ++i) {
    const unsigned char byte = static_cast<unsigned char>(line[i]);
    if ((byte & 0xC0) == 0x80) continue;  // continuation byte
    columns += byte >= 0xE3 && byte <= 0xE9 ? 2 : 1;  // the CJK ideographs used below take two cells
  }
  return columns;
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

TEST(SystemCliTest, EveryCommandSaysWhatItDidOrWhatWasWrongAndWhatToDo) {
  SystemSandbox box;
  fs::create_directories(box.Path("docs/inner"));
  fs::create_directories(box.Path("more"));
  WriteText(box.Path("docs/menu.txt"), "saffron paella");
  WriteText(box.Path("docs/inner/bad\x1b[2J.txt"), "crimson \x1b[31m tide");
  const std::string outside = box.root() + "/outside";
  fs::create_directories(outside);
  const std::vector<std::string> names = {"plain", "caf\xc3\xa9", "\xe6\x9d\xb1\xe4\xba\xac", "bad\x1b[2Jname"};
  for (size_t i = 0; i < names.size(); ++i) fs::create_directories(box.Path("d" + std::to_string(i)));

  // No daemon yet: the command line alone, and which daemon to start how.
  const std::string down = ": NOT RUNNING (start it with scripts/run start)";
  const std::string no_search = "corvelasticd is not running: start it with systemctl start corvelasticd";
  ExpectRows(box, {{kDone, {}, {"folder", "status", "search", "share"}},
                   {kRefused, {"search", "saffron"}, {no_search}},
                   {kRefused, {"suggest", "saf"}, {no_search}}});
  setenv("FILEINDEX_START_COMMAND", "scripts/run start", 1);
  ExpectRows(box, {{kFailed, {"status"}, {"corvelasticd" + down, "corvnotifyd" + down, "fileindexd" + down}}});
  unsetenv("FILEINDEX_START_COMMAND");
  const CliResult version = RunCli({"--version"});
  EXPECT_EQ(version.status, 0);
  EXPECT_EQ(version.out.rfind("fileindex ", 0), 0u) << version.out;
  if (geteuid() != 0) GTEST_SKIP() << "the management operations write root's files: run as root";

  box.StartAll();
  const std::string volume = fs::path(box.share_dir()).parent_path().string();
  ExpectRows(box, {
      {kDone, {"folder", "add", "/share/docs", "--wait", "--timeout", "60"}, {"added /share/docs"}},
      {kRefused, {"folder", "add", box.Path("docs/menu.txt")}, {"is a file, not a folder"}},
      {kRefused, {"folder", "add", "/share/docs/menu.txt"}, {"is a file, not a folder"}},
      {kRefused, {"folder", "add", "docs"}, {"\"docs\" is a relative path", "/share/dir"}},
      {kRefused, {"folder", "add", "/share/nothing"}, {"/share/nothing does not exist"}},
      {kRefused, {"folder", "add", outside},
       {"is outside every share", "the shares are: share (" + box.share_dir() + ")"}},
      {kRefused, {"folder", "add", "/nosuch/dir"}, {"does not exist", "the shares are: share ("}},
      {kRefused, {"folder", "add", "/share/docs"},
       {"error 901", "already indexed", "fileindex folder reindex /share/docs"}},
      {kRefused, {"folder", "reindex", "/share/nothing"}, {"error 902", "not an indexed folder", "/share/docs"}},
      {kRefused, {"folder", "delete", "docs"}, {"relative path"}},
      {kRefused, {"folder", "get", "/share/other"}, {"error 902", "the indexed folders are: /share/docs"}},
      {kRefused, {"share", "rename", "nosuch", "other"},
       {"error 800", "no share named \"other\"", "the shares are: share"}},
      {kRefused, {"share", "rename", "nosuch", "share"}, {"no folder of share nosuch is indexed"}},
      {kRefused, {"share", "pause", "nosuch"}, {"no share named \"nosuch\""}},
      {kRefused, {"share", "check-recycle", "nosuch"}, {"no share named \"nosuch\""}},
      {kRefused, {"volume", "pause", "relative"}, {"\"relative\" is a relative path"}},
      {kRefused, {"volume", "pause", "/nowhere"}, {"no share lies on /nowhere", "the shares are: share"}},
      {kRefused, {"user", "rename", "alice", "bob"}, {"no indexed folder lies in the home of alice"}},
      {kRefused, {"serch", "saffron"}, {"unknown command \"serch\"; did you mean \"search\"?"}},
      {kRefused, {"folder", "ad", "/share/docs"}, {"did you mean \"folder add\"?"}},
      {kRefused, {"search", "saffron", "--share", "nosuch"}, {"fileindex: error 2010"}},
      {kDone, {"folder", "add", "--help"}, {}},
      // What was done is said; a second pause says it found the share paused.
      {kDone, {"share", "pause", "share"}, {"share share paused"}},
      {kDone, {"share", "pause", "share"}, {"was already paused"}},
      {kDone, {"volume", "pause", volume}, {"paused the shares on"}},
      {kDone, {"volume", "resume", volume}, {}},
      {kDone, {"share", "resume", "share"}, {}},
  });
  // A user who is not root is told so, and nothing is queued.
  const CliResult unprivileged = RunCli({"folder", "reindex", "/share/docs"}, 65534);
  EXPECT_NE(unprivileged.status, 0);
  EXPECT_NE(unprivileged.err.find("only root may do: run it as root"), npos) << unprivileged.err;
  EXPECT_EQ(unprivileged.out.find("reindexing"), npos) << unprivileged.out;

  // Status counts the index and says what the indexer does.
  ASSERT_EQ(box.Converge(box.DiskPaths("docs")), "");
  Json::Value status = JsonOut({"--json", "status"});
  const Json::Value& share = status["shares"]["share"];
  EXPECT_EQ(share["documents"].asInt64(), static_cast<Json::Int64>(box.IndexedPaths().size()));
  EXPECT_GT(share["index_bytes"].asInt64(), 0);
  EXPECT_EQ(share["total_failed"].asInt64(), 0);
  EXPECT_EQ(share["activity"].asString(), "up to date, watching for changes");
  for (const char* daemon : {"corvelasticd", "corvnotifyd", "fileindexd"}) {
    EXPECT_TRUE(status["daemons"][daemon]["running"].asBool()) << daemon;
  }
  ExpectRows(box, {{kDone, {"status"}, {"indexing: on (not paused)"}},
                   {kDone, {"pause"}, {}},
                   {kDone, {"status"}, {"indexing: paused until resumed (fileindex resume)"}},
                   {kDone, {"resume"}, {}},
                   {kDone, {"search", "crimson"}, {"bad\\x1b[2J.txt"}},
                   {kDone, {"search", "saffron"}, {box.Path("docs/menu.txt")}}});

  // Paging and the share filter, as scripts read them.
  WriteText(box.Path("docs/menu2.txt"), "saffron risotto");
  ASSERT_TRUE(PollUntil([&] { return box.Search("saffron").size() == 2; }, std::chrono::seconds(30)));
  Json::Value page = JsonOut({"--json", "search", "saffron", "--share", "share", "--size", "1", "--from", "1"});
  EXPECT_EQ(page["total"].asInt(), 2);
  EXPECT_EQ(page["hits"].size(), 1u);
  page = JsonOut({"--json", "search", "menu2", "--name"});
  ASSERT_EQ(page["hits"].size(), 1u);
  EXPECT_EQ(page["hits"][0]["fields"]["CORVMDPath"].asString(), box.Path("docs/menu2.txt"));
  // Words as separate arguments, options before or after them; a phrase keeps its order.
  for (const std::vector<std::string>& args :
       {std::vector<std::string>{"--json", "search", "--share", "share", "saffron", "paella"},
        std::vector<std::string>{"--json", "search", "saffron", "paella", "--share", "share"},
        std::vector<std::string>{"--json", "search", "\"saffron paella\""}}) {
    page = JsonOut(args);
    ASSERT_EQ(page["hits"].size(), 1u) << args.back();
    EXPECT_EQ(page["hits"][0]["fields"]["CORVMDPath"].asString(), box.Path("docs/menu.txt"));
  }
  EXPECT_EQ(JsonOut({"--json", "search", "\"paella saffron\""})["total"].asInt(), 0);
  EXPECT_NE(JsonOut({"extract", box.Path("docs/menu.txt")})["CORVMDTextContent"].asString().find("paella"), npos);
  // The indexer keeps the name suggestions current by itself.
  ASSERT_TRUE(PollUntil([&] { return RunCli({"suggest", "men"}).out.find("menu") != npos; },
                        std::chrono::seconds(30)));
  // A file whose content cannot be read is still found by name, and listed
  // with the reason (it may be indexed first as created, empty, then as written).
  WriteText(box.Path("docs/broken.pdf"), "%PDF-1.4 not really a PDF");
  ASSERT_TRUE(PollUntil([&] { return box.Search("broken").size() == 1; }, std::chrono::seconds(30)));
  EXPECT_TRUE(PollUntil([&] { return RunCli({"failed"}).out.find(box.Path("docs/broken.pdf")) != npos; },
                        std::chrono::seconds(30)));
  ExpectRows(box, {{kDone, {"failed"}, {"1 file(s)"}}});
  EXPECT_TRUE(PollUntil([&] { return RunCli({"--json", "folder", "list"}).out.find("\"finished\"") != npos; },
                        std::chrono::seconds(30)));

  // Pause stops the indexing of new changes until resume.
  ASSERT_EQ(RunCli({"pause"}).status, 0);
  WriteText(box.Path("docs/later.txt"), "written while paused");
  EXPECT_FALSE(PollUntil([&] { return !box.Search("paused").empty(); }, std::chrono::milliseconds(1500)));
  ASSERT_EQ(RunCli({"resume"}).status, 0);
  ASSERT_EQ(box.Converge(box.DiskPaths("docs")), "");
  // A paused share has no worker until it is resumed.
  ASSERT_EQ(RunCli({"share", "pause", "share"}).status, 0);
  ASSERT_TRUE(JsonFromString(status, box.IndexerStatus()));
  EXPECT_EQ(status["shares"]["share"]["state"].asString(), "no worker");  // "worker_delete" was heard
  WriteText(box.Path("docs/held.txt"), "held back while the share is paused");
  EXPECT_FALSE(PollUntil([&] { return !box.Search("held").empty(); }, std::chrono::milliseconds(800)));
  ASSERT_EQ(RunCli({"share", "resume", "share"}).status, 0);
  ASSERT_EQ(box.Converge(box.DiskPaths("docs")), "");
  // A pause with a resume time, as the status manager sends it for some
  // hours, two seconds long here: it ends by itself.
  Json::Value pause(Json::objectValue);
  const auto resume_time = std::chrono::system_clock::now() + std::chrono::seconds(2);
  pause["resume_time"] = static_cast<Json::Int64>(std::chrono::system_clock::to_time_t(resume_time));
  fileindex::SendCommandToDaemon("pause", pause);
  WriteText(box.Path("docs/queued.txt"), "waits for the pause to end");
  EXPECT_FALSE(PollUntil([&] { return !box.Search("waits").empty(); }, std::chrono::milliseconds(800)));
  EXPECT_NE(box.IndexerStatus().find("\"paused\""), npos);
  ASSERT_EQ(box.Converge(box.DiskPaths("docs"), std::chrono::seconds(30)), "");
  EXPECT_GE(std::chrono::system_clock::now(), resume_time - std::chrono::seconds(1));

  // Tables align by display width and show control characters escaped.
  for (size_t i = 0; i < names.size(); ++i) {
    ASSERT_EQ(RunCli({"folder", "add", "/share/d" + std::to_string(i), "--name", names[i]}).status, 0);
  }
  ExpectRows(box, {{kDone, {"folder", "list"}, {"bad\\x1b[2Jname"}}});
  std::istringstream lines(RunCli({"folder", "list"}).out);
  std::set<size_t> columns;  // where DOCUMENT starts, on each line
  for (std::string line; std::getline(lines, line);) {
    if (line.find("/share/d") == npos && line.find("PATH") == npos) continue;
    columns.insert(DisplayColumn(line, line.find("PATH") == 0 ? "DOCUMENT" : "yes"));
  }
  EXPECT_EQ(columns.size(), 1u) << RunCli({"folder", "list"}).out;

  // The run command adds shares beside those already indexed: the folders of
  // the first share keep their share.
  EXPECT_EQ(AddShareAsTheRunCommandDoes(box.root() + "/volume2/docs"), "docs");
  EXPECT_EQ(AddShareAsTheRunCommandDoes(box.root() + "/volume2/docs"), "docs");  // registered once
  EXPECT_EQ(AddShareAsTheRunCommandDoes(box.root() + "/volume3/docs", 1), "");   // a second "docs" is refused
  EXPECT_EQ(AddShareAsTheRunCommandDoes(box.root() + "/volume3/notes"), "notes");
  ExpectRows(box, {{kDone, {"folder", "list"}, {"/share/docs"}},
                   {kDone, {"folder", "add", "/notes"}, {}},
                   {kDone, {"share", "list"}, {"share ", "docs ", "notes "}}});

  // Commands that need the indexer while it is down change nothing and say
  // how to start it.
  box.StopIndexer(SIGTERM);
  const std::string start = "fileindexd is not running: start it with systemctl start pkg-CorvLumex-fileindexd";
  ExpectRows(box, {
      {kRefused, {"folder", "add", "/share/more"}, {start, "nothing was changed"}},
      {kRefused, {"folder", "delete", "/share/docs"}, {start}},
      {kRefused, {"folder", "reindex", "/share/docs"}, {start}},
      {kRefused, {"pause"}, {start}},
      {kRefused, {"share", "pause", "share"}, {start}},
      {kFailed, {"status"},
       {"fileindexd: NOT RUNNING (start it with systemctl start pkg-CorvLumex-fileindexd)", "corvelasticd: running"}},
  });

  // A registry that lost an indexed share (what rewriting it used to do):
  // the error names the share instead of an empty reason.
  ShareRegistry(box.root()).Add("docs", box.root() + "/volume2/docs");  // the only share now
  ExpectRows(box, {{kRefused, {"folder", "list"}, {"shares the share registry no longer lists: notes, share"}}});
}

}  // namespace
}  // namespace testing_support
}  // namespace corvlumex
