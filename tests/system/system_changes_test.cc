// End to end: every kind of change on disk reaches what a search shows, with
// the real corvelasticd, corvnotifyd and fileindexd in a sandbox root.
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstdio>
#include <filesystem>
#include <thread>

#include "common/json_util.h"

#include "tests/system/system_harness.h"

namespace corvlumex {
namespace testing_support {
namespace {
namespace fs = std::filesystem;

class SystemChangesTest : public ::testing::Test {
 protected:
  void SetUp() override {
    fs::create_directories(box_.Path("docs/reports/2026"));
    WriteText(box_.Path("docs/reports/2026/budget.txt"), "lighthouse renovation budget");
    WriteText(box_.Path("docs/readme.md"), "harbour ferry timetable");
    fs::create_directories(box_.Path("outside/nested"));
    WriteText(box_.Path("outside/nested/visitor.txt"), "telescope gallery");
    box_.StartAll({"--settle-ms", "300"});
    box_.AddFolder("docs");
    ASSERT_EQ(box_.Converge(Docs()), "");
    // Once a probe file comes and goes through the queue, the notifier's
    // watches are in place for the test's own changes.
    WriteText(box_.Path("docs/probe"), "probe");
    ASSERT_EQ(box_.Converge(Docs()), "");
    ASSERT_EQ(unlink(box_.Path("docs/probe").c_str()), 0);
    ASSERT_EQ(box_.Converge(Docs()), "");
  }

  std::set<std::string> Docs() const { return box_.DiskPaths("docs"); }
  // Polls until a search of `words` finds exactly `paths` (a file's words
  // may follow its name by a batch).
  ::testing::AssertionResult Finds(const std::string& words, const std::set<std::string>& paths) {
    std::set<std::string> found;
    if (PollUntil([&] { return (found = box_.Search(words)) == paths; }, std::chrono::seconds(30))) {
      return ::testing::AssertionSuccess();
    }
    std::string text;
    for (const auto& path : found) text += " " + path;
    return ::testing::AssertionFailure() << "\"" << words << "\" finds:" << text << "\n" << box_.Logs();
  }

  SystemSandbox box_;
};

// A file with three names: a change through one of them reaches the others,
// which no event names.
TEST_F(SystemChangesTest, AChangeThroughOneHardLinkReachesEveryName) {
  const std::string a = box_.Path("docs/linked.txt"), b = box_.Path("docs/reports/second.txt"),
                    c = box_.Path("docs/reports/2026/third.txt");
  WriteText(a, "pelican");
  ASSERT_EQ(link(a.c_str(), b.c_str()), 0);
  ASSERT_EQ(link(a.c_str(), c.c_str()), 0);
  ASSERT_EQ(box_.Converge(Docs()), "");
  EXPECT_TRUE(Finds("pelican", {a, b, c}));

  WriteText(b, "cormorant");  // truncates and rewrites the one file
  EXPECT_TRUE(Finds("cormorant", {a, b, c}));
  EXPECT_TRUE(Finds("pelican", {}));
  ASSERT_EQ(chmod(c.c_str(), 0600), 0);
  EXPECT_TRUE(PollUntil([&] { return box_.SearchTerm("CORVMDPrivilege", "-rw-------") == std::set<std::string>{a, b, c}; }, std::chrono::seconds(30)))
      << box_.Logs();
}

TEST_F(SystemChangesTest, CreateModifyAttributeAndDeleteOfFiles) {
  WriteText(box_.Path("docs/new.txt"), "quince marmalade");
  ASSERT_EQ(box_.Converge(Docs()), "");
  EXPECT_TRUE(Finds("quince", {box_.Path("docs/new.txt")}));

  // New content replaces the old words.
  WriteText(box_.Path("docs/new.txt"), "rhubarb crumble");
  ASSERT_TRUE(Finds("rhubarb", {box_.Path("docs/new.txt")}));
  EXPECT_TRUE(box_.Search("quince").empty());

  // An attribute change reaches the document's permission field.
  ASSERT_EQ(chmod(box_.Path("docs/new.txt").c_str(), 0640), 0);
  ASSERT_TRUE(PollUntil([&] { return box_.SearchTerm("CORVMDPrivilege", "-rw-r-----").count(box_.Path("docs/new.txt")); },
                        std::chrono::seconds(30)))
      << box_.Logs();
  ASSERT_EQ(box_.Converge(Docs()), "");

  ASSERT_EQ(unlink(box_.Path("docs/new.txt").c_str()), 0);
  ASSERT_EQ(box_.Converge(Docs()), "");
  EXPECT_TRUE(box_.Search("rhubarb").empty());

  // A file made and removed at once leaves nothing behind.
  for (int i = 0; i < 20; ++i) {
    const std::string path = box_.Path("docs/blink" + std::to_string(i) + ".txt");
    WriteText(path, "blink");
    ASSERT_EQ(unlink(path.c_str()), 0);
  }
  WriteText(box_.Path("docs/last.txt"), "last");
  ASSERT_EQ(box_.Converge(Docs()), "");
}

TEST_F(SystemChangesTest, RenamesAndMovesOfFilesAndFoldersWithNestedContent) {
  ASSERT_EQ(rename(box_.Path("docs/readme.md").c_str(), box_.Path("docs/guide.md").c_str()), 0);
  ASSERT_EQ(box_.Converge(Docs()), "");
  EXPECT_TRUE(Finds("ferry", {box_.Path("docs/guide.md")}));

  ASSERT_EQ(rename(box_.Path("docs/reports").c_str(), box_.Path("docs/archive").c_str()), 0);
  ASSERT_EQ(box_.Converge(Docs()), "");
  EXPECT_TRUE(Finds("lighthouse", {box_.Path("docs/archive/2026/budget.txt")}));

  // Deeper, and a new file in the moved folder right after the move.
  fs::create_directories(box_.Path("docs/deep"));
  ASSERT_EQ(rename(box_.Path("docs/archive").c_str(), box_.Path("docs/deep/archive").c_str()), 0);
  WriteText(box_.Path("docs/deep/archive/2026/late.txt"), "late addition");
  ASSERT_EQ(box_.Converge(Docs()), "");

  // Into the watched tree and out of it.
  ASSERT_EQ(rename(box_.Path("outside/nested").c_str(), box_.Path("docs/nested").c_str()), 0);
  ASSERT_EQ(box_.Converge(Docs()), "");
  EXPECT_TRUE(Finds("telescope", {box_.Path("docs/nested/visitor.txt")}));
  ASSERT_EQ(rename(box_.Path("docs/deep").c_str(), box_.Path("outside/deep").c_str()), 0);
  ASSERT_EQ(rename(box_.Path("docs/guide.md").c_str(), box_.Path("outside/guide.md").c_str()), 0);
  ASSERT_EQ(box_.Converge(Docs()), "");
  EXPECT_TRUE(box_.Search("lighthouse").empty());
  EXPECT_TRUE(box_.Search("ferry").empty());

  // Two folders swapped through a third name.
  fs::create_directories(box_.Path("docs/left"));
  fs::create_directories(box_.Path("docs/right"));
  WriteText(box_.Path("docs/left/a.txt"), "apricot");
  WriteText(box_.Path("docs/left/common.txt"), "left side");
  WriteText(box_.Path("docs/right/b.txt"), "blueberry");
  WriteText(box_.Path("docs/right/common.txt"), "right side");
  ASSERT_EQ(box_.Converge(Docs()), "");
  ASSERT_EQ(rename(box_.Path("docs/left").c_str(), box_.Path("docs/swap").c_str()), 0);
  ASSERT_EQ(rename(box_.Path("docs/right").c_str(), box_.Path("docs/left").c_str()), 0);
  ASSERT_EQ(rename(box_.Path("docs/swap").c_str(), box_.Path("docs/right").c_str()), 0);
  ASSERT_EQ(box_.Converge(Docs()), "");
  EXPECT_TRUE(Finds("apricot", {box_.Path("docs/right/a.txt")}));
  EXPECT_TRUE(Finds("blueberry", {box_.Path("docs/left/b.txt")}));
  EXPECT_TRUE(Finds("left side", {box_.Path("docs/right/common.txt")}));
}

TEST_F(SystemChangesTest, SaveByRenamingATemporaryFileOverTheOriginal) {
  for (const char* words : {"first draft", "second draft", "final version"}) {
    WriteText(box_.Path("docs/.readme.md.swp"), words);
    ASSERT_EQ(rename(box_.Path("docs/.readme.md.swp").c_str(), box_.Path("docs/readme.md").c_str()), 0);
  }
  // The file's name never changed: wait for its words.
  ASSERT_TRUE(Finds("final version", {box_.Path("docs/readme.md")}));
  ASSERT_EQ(box_.Converge(Docs()), "");
  EXPECT_TRUE(box_.Search("harbour").empty());
  EXPECT_TRUE(box_.Search("draft").empty());
}

TEST_F(SystemChangesTest, SettingsChangeAddsAndRemovesTheCategories) {
  WriteText(box_.Path("docs/code.c"), "int main(void) { return 0; }");
  ASSERT_EQ(box_.Converge(Docs()), "");
  // Documents off: text and markdown files leave, other files and folders stay.
  const auto not_documents = [](const std::string& path) {
    return path.size() > 4 && (path.compare(path.size() - 4, 4, ".txt") == 0 || path.compare(path.size() - 3, 3, ".md") == 0);
  };
  box_.SetFolder("docs", false, true, true, true);
  ASSERT_EQ(box_.Converge(box_.DiskPaths("docs", not_documents)), "");
  EXPECT_TRUE(box_.Search("lighthouse").empty());
  box_.SetFolder("docs", true, true, true, true);
  ASSERT_EQ(box_.Converge(Docs()), "");
  EXPECT_TRUE(Finds("lighthouse", {box_.Path("docs/reports/2026/budget.txt")}));
}

TEST_F(SystemChangesTest, AFileRewrittenAgainAndAgainIsExtractedOncePerSettleInterval) {
  const auto extracted = [this] {
    Json::Value status;
    JsonFromString(status, box_.IndexerStatus());
    return status["shares"]["share"]["total_extracted"].asUInt64();
  };
  const unsigned long long before = extracted();
  // 40 appends over about two seconds, like a log being written.
  std::string log;
  for (int i = 0; i < 40; ++i) {
    log += "line " + std::to_string(i) + " of the noisy log\n";
    WriteText(box_.Path("docs/noisy.log"), log + "tail" + std::to_string(i));
    std::this_thread::sleep_for(std::chrono::milliseconds(50));
  }
  // The last state is indexed in the end...
  ASSERT_TRUE(Finds("tail39", {box_.Path("docs/noisy.log")}));
  ASSERT_EQ(box_.Converge(Docs()), "");
  // ...after far fewer extractions than changes (300 ms, then 600, 1200...).
  EXPECT_LE(extracted() - before, 8u);
}

}  // namespace
}  // namespace testing_support
}  // namespace corvlumex
