// End to end: names that are never indexed, and the command line.
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>

#include "common/json_util.h"
#include "fileindex/state/communication.h"
#include "tests/system/cli_runner.h"
#include "tests/system/system_harness.h"

namespace corvlumex {
namespace testing_support {
namespace {
namespace fs = std::filesystem;

bool IsHiddenName(const std::string& path) {
  const std::string name = fs::path(path).filename().string();
  return name == ".DS_Store" || name == ".TemporaryItems" || name == "@tmp";
}

TEST(SystemRecoveryTest, PreservedNamesAndTheRecycleBinAreNeverIndexed) {
  SystemSandbox box;
  fs::create_directories(box.Path("photos/.TemporaryItems"));
  fs::create_directories(box.Path("#recycle"));
  WriteText(box.Path("photos/.DS_Store"), "finder data");
  WriteText(box.Path("photos/.TemporaryItems/partial.txt"), "partial upload");
  WriteText(box.Path("photos/keep.txt"), "holiday pictures");
  WriteText(box.Path("#recycle/old.txt"), "thrown away");
  box.StartAll();
  box.AddFolder("");  // the whole share
  ASSERT_EQ(box.Converge(box.DiskPaths("", IsHiddenName)), "");

  // Deleted into the bin: gone from search. Restored: back.
  ASSERT_EQ(rename(box.Path("photos/keep.txt").c_str(), box.Path("#recycle/keep.txt").c_str()), 0);
  ASSERT_EQ(box.Converge(box.DiskPaths("", IsHiddenName)), "");
  EXPECT_TRUE(box.Search("holiday").empty());
  ASSERT_EQ(rename(box.Path("#recycle/keep.txt").c_str(), box.Path("photos/keep.txt").c_str()), 0);
  ASSERT_EQ(box.Converge(box.DiskPaths("", IsHiddenName)), "");
  EXPECT_EQ(box.Search("holiday").size(), 1u);
}

TEST(SystemRecoveryTest, CommandLineFoldersSearchAndPausesOfTheIndexerAndOfAShare) {
  SystemSandbox box;
  fs::create_directories(box.Path("docs"));
  WriteText(box.Path("docs/menu.txt"), "saffron paella");
  box.StartAll();
  CliResult added = RunCli({"folder", "add", "/share/docs", "--wait", "--timeout", "60"});
  ASSERT_EQ(added.status, 0) << added.err;
  CliResult found = RunCli({"search", "saffron"});
  EXPECT_EQ(found.status, 0) << found.err;
  EXPECT_NE(found.out.find(box.Path("docs/menu.txt")), std::string::npos) << found.out;
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
  CliResult unparsable = RunCli({"search", "(saffron"});
  EXPECT_NE(unparsable.status, 0);
  EXPECT_NE(unparsable.err.find("never closed"), std::string::npos) << unparsable.err;
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
  CliResult other_share = RunCli({"search", "saffron", "--share", "nosuch"});
  EXPECT_NE(other_share.status, 0);
  EXPECT_NE(other_share.err.find("fileindex: error 2010"), std::string::npos) << other_share.err;
  EXPECT_EQ(RunCli({"folder", "add", "--help"}).status, 0);
  CliResult extracted = RunCli({"extract", box.Path("docs/menu.txt")});
  ASSERT_TRUE(JsonFromString(page, extracted.out)) << extracted.err;
  EXPECT_NE(page["CORVMDTextContent"].asString().find("paella"), std::string::npos);

  CliResult listed;
  EXPECT_TRUE(PollUntil(
      [&] { return (listed = RunCli({"--json", "folder", "list"})).out.find("\"finished\"") != std::string::npos; },
      std::chrono::seconds(30)))
      << listed.out;
  // Errors carry their code and reason, with a non-zero exit.
  CliResult missing = RunCli({"folder", "get", "/share/nothing"});
  EXPECT_NE(missing.status, 0);
  EXPECT_NE(missing.err.find("error 902"), std::string::npos) << missing.err;
  CliResult twice = RunCli({"folder", "add", "/share/docs"});
  EXPECT_NE(twice.err.find("error 901"), std::string::npos) << twice.err;
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

}  // namespace
}  // namespace testing_support
}  // namespace corvlumex
