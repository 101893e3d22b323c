#include <sys/stat.h>

#include <gtest/gtest.h>

#include <tuple>

#include "common/error.h"
#include "common/json_util.h"
#include "fileindex/state/folder_mgr.h"
#include "tests/support/sandbox.h"

namespace corvlumex {
namespace fileindex {
namespace {

std::shared_ptr<Folder> MakeFolder(const std::string& path, bool document = true, bool audio = true,
                                   bool video = true, bool photo = true, const std::string& name = "n") {
  return std::make_shared<Folder>(path, name, document, audio, video, photo, false, false);
}

std::vector<std::string> Paths(const std::vector<std::shared_ptr<Folder>>& folders) {
  std::vector<std::string> paths;
  for (const auto& folder : folders) paths.push_back(folder->GetPath());
  return paths;
}

class FolderMgrTest : public ::testing::Test {
 protected:
  FolderMgrTest() {
    s_ = sandbox_.AddShare("s");
    sandbox_.AddShare("t");
  }
  std::string FoldersPath() const { return sandbox_.EtcFile("fileindex.folders"); }
  void WriteFolders(const std::string& text) { sandbox_.Write("var/packages/CorvLumex/etc/fileindex.folders", text); }
  // A manager holding folders of these share paths, in this order.
  FolderMgr With(const std::vector<std::string>& paths) {
    std::string text = "[";
    for (const std::string& path : paths) {
      if (text.size() > 1) text += ",";
      text += MakeFolder(path)->GetStoredText();
    }
    WriteFolders(text + "]");
    return FolderMgr();
  }

  Sandbox sandbox_{true, Sandbox::kFakeIndexer};
  SleepRecorder sleeps_;
  std::string s_;  // full path of share s
};

TEST_F(FolderMgrTest, NoFileIsAnEmptyListAndSavesAnArray) {
  FolderMgr mgr;
  EXPECT_TRUE(mgr.Folders().empty());
  EXPECT_FALSE(mgr.GetMostSuitableCfg(s_ + "/a"));
  EXPECT_FALSE(mgr.IsFullPathIndexed(s_));
  mgr.Save();
  EXPECT_EQ(ReadFileText(FoldersPath()), "[]\n");
  struct stat info;
  ASSERT_EQ(stat(FoldersPath().c_str(), &info), 0);
  EXPECT_EQ(info.st_mode & 07777, 0644u);
}

TEST_F(FolderMgrTest, BadFilesAreRefused) {
  for (const auto& [text, condition] : std::vector<std::pair<std::string, std::string>>{
           {"[{\"path\":", "IsFileExist(kFileIndexFoldersCfgPath) && !folders.fromFile(kFileIndexFoldersCfgPath)"},
           {"{\"path\":\"/s/a\"}", "!folders.isNull() && !folders.isArray()"}}) {
    WriteFolders(text);
    ExpectError([] { FolderMgr(); }, kErrorLoadJson, "Cannot load json: " + FoldersPath(), condition, "FolderMgr");
  }
  WriteFolders("[{\"path\":\"/s/a\",\"name\":\"n\"}]");
  LogCapture log;
  const Error malformed = ErrorOf([] { FolderMgr(); });
  EXPECT_EQ(malformed.code, kErrorBadArgument);
  EXPECT_EQ(malformed.reason.rfind("Missing property: document", 0), 0u) << malformed.reason;
  // Logged like every other load failure, from the folder manager.
  const auto lines = log.Matching("(FolderMgr) Failed [");
  ASSERT_EQ(lines.size(), 1u);
  EXPECT_EQ(lines[0].rfind("folder_mgr.cc:", 0), 0u) << lines[0];
  EXPECT_NE(lines[0].find("], reason: " + malformed.reason), std::string::npos) << lines[0];
}

// The governing folder is the longest ancestor on slash boundaries, whatever
// the list order; of two equal paths the earlier. Indexed: the folder or
// below it; own settings: the folder itself.
TEST_F(FolderMgrTest, GoverningFolderAndPathPredicates) {
  WriteFolders("[" + MakeFolder("/s/a", true, true, true, true, "first")->GetStoredText() + "," +
               MakeFolder("/s/a", true, true, true, true, "second")->GetStoredText() + "," +
               MakeFolder("/s/a/b", true, true, true, true, "b")->GetStoredText() + "]");
  const FolderMgr mgr;
  for (const auto& [path, governing, indexed, own] : std::vector<std::tuple<std::string, std::string, bool, bool>>{
           {"/a/b/c", "b", true, false}, {"/a/b", "b", true, true}, {"/a/bc", "first", true, false},
           {"/a", "first", true, true}, {"/a/x", "first", true, false}, {"/a/", "first", true, false},
           {"/ab", "", false, false}, {"", "", false, false}}) {
    const auto found = mgr.GetMostSuitableCfg(s_ + path);
    EXPECT_EQ(found ? found->GetName() : "", governing) << path;
    EXPECT_EQ(mgr.IsFullPathIndexed(s_ + path), indexed) << path;
    EXPECT_EQ(mgr.IsFullPathHasOwnCfg(s_ + path), own) << path;
  }
  EXPECT_TRUE(mgr.HasFolder("/s/a"));
  EXPECT_FALSE(mgr.HasFolder("/s/a/"));
}

// The governing folder's categories; a nested folder governs its own subtree.
TEST_F(FolderMgrTest, NeedMetaFollowsTheGoverningFoldersCategories) {
  WriteFolders("[" + MakeFolder("/s/a", true, false, true, false)->GetStoredText() + "," +
               MakeFolder("/s/a/music", false, true, false, false)->GetStoredText() + "]");
  const FolderMgr mgr;
  for (const auto& [path, need] : std::vector<std::pair<std::string, bool>>{
           {"/a/report.PDF", true}, {"/a/clip.mkv", true}, {"/a/song.mp3", false}, {"/a/photo.jpg", false},
           {"/a/archive.xyz123", false}, {"/a/music/song.mp3", true}, {"/a/music/report.pdf", false},
           {"/b/report.pdf", false}}) {
    EXPECT_EQ(mgr.IsFullPathNeedMeta(s_ + path), need) << path;
  }
}

// What to reindex: every kind for a new folder, what differs from the
// governing folder for one below it.
TEST_F(FolderMgrTest, UpsertOfANewFolderReindexesAgainstWhatGovernedIt) {
  FolderMgr mgr;
  std::shared_ptr<Folder> old;
  mgr.Upsert(old, MakeFolder("/s/a", true, false, false, false, "A"));
  ASSERT_TRUE(old);
  EXPECT_EQ(old->GetPath(), "/s/a");
  EXPECT_EQ(old->GetName(), "A");
  EXPECT_EQ(old->GetIndexCfg(), MakeFolder("/x")->GetIndexCfg());
  EXPECT_FALSE(old->IsPrivileged());
  mgr.Upsert(old, MakeFolder("/s/a/b", false, true, false, true));
  EXPECT_EQ(old->GetPath(), "/s/a/b");
  EXPECT_EQ(old->GetIndexCfg(), MakeFolder("/x", true, true, false, true)->GetIndexCfg());
}

TEST_F(FolderMgrTest, UpsertOfAChangedFolderReindexesTheSwitchedKindsAndMovesItLast) {
  FolderMgr mgr = With({"/s/a", "/s/b", "/s/c"});
  std::shared_ptr<Folder> old;
  auto changed = std::make_shared<Folder>("/s/a", "renamed", true, false, true, true, true, true);
  mgr.Upsert(old, changed);
  EXPECT_EQ(Paths(mgr.Folders()), (std::vector<std::string>{"/s/b", "/s/c", "/s/a"}));
  EXPECT_EQ(old->GetIndexCfg(), MakeFolder("/x", false, true, false, false)->GetIndexCfg());
  EXPECT_FALSE(old->IsPaused());
  EXPECT_FALSE(old->IsPrivileged());
  mgr.Save();
  const std::string text = ReadFileText(FoldersPath());
  EXPECT_LT(text.find("/s/c"), text.find("\"path\":\"/s/a\""));
  EXPECT_EQ(FolderMgr().Folders().back()->GetName(), "renamed");
}

TEST_F(FolderMgrTest, TheThousandAndFirstFolderIsRefused) {
  std::vector<std::string> paths;
  for (int i = 0; i < 999; ++i) paths.push_back("/s/f" + std::to_string(i));
  FolderMgr mgr = With(paths);
  std::shared_ptr<Folder> old;
  mgr.Upsert(old, MakeFolder("/s/f999"));
  EXPECT_EQ(mgr.Folders().size(), 1000u);
  mgr.Upsert(old, MakeFolder("/s/f0"));  // a replacement does not grow the list
  ExpectError([&] { mgr.Upsert(old, MakeFolder("/s/f1000")); }, kErrorTooManyFolders, "",
              "folders_.size() > kFileIndexFoldersMax", "Upsert");
}

TEST_F(FolderMgrTest, GetAndDeleteFindExactPaths) {
  FolderMgr mgr = With({"/s/a", "/s/b"});
  std::shared_ptr<Folder> found;
  mgr.Get(found, "/s/b");
  EXPECT_EQ(found->GetPath(), "/s/b");
  ExpectError([&] { mgr.Get(found, "/s/c"); }, kErrorFolderNotFound, "Folder not found: /s/c", "it == folders_.end()",
              "Get");
  std::shared_ptr<Folder> removed;
  mgr.Delete(removed, "/s/a");
  EXPECT_EQ(removed->GetPath(), "/s/a");
  EXPECT_EQ(Paths(mgr.Folders()), std::vector<std::string>{"/s/b"});
  ExpectError([&] { mgr.Delete(removed, "/s/a"); }, kErrorFolderNotFound, "Folder not found: /s/a");
}

TEST_F(FolderMgrTest, SharesOfTheList) {
  FolderMgr mgr = With({"/t/x", "/s/a", "/gone/y", "/s/b", "/s"});
  EXPECT_EQ(mgr.GetIndexedShares(), (std::set<std::string>{"gone", "s", "t"}));
  EXPECT_TRUE(mgr.IsShareIndexed("gone"));
  EXPECT_FALSE(mgr.IsShareIndexed("sx"));
  // Works for a share the platform no longer knows.
  EXPECT_EQ(Paths(mgr.DeleteByShare("gone")), std::vector<std::string>{"/gone/y"});
  EXPECT_EQ(Paths(mgr.DeleteByShare("s")), (std::vector<std::string>{"/s/a", "/s/b", "/s"}));
  EXPECT_TRUE(mgr.DeleteByShare("s").empty());
  EXPECT_EQ(Paths(mgr.Folders()), std::vector<std::string>{"/t/x"});
}

TEST_F(FolderMgrTest, ListSortsPagesAndCounts) {
  WriteFolders("[" + MakeFolder("/s/c", true, true, true, true, "beta")->GetStoredText() + "," +
               MakeFolder("/s/a", false, true, true, true, "Alpha")->GetStoredText() + "," +
               MakeFolder("/s/b", true, true, true, true, "gamma")->GetStoredText() + "]");
  const FolderMgr mgr;
  std::vector<std::shared_ptr<Folder>> page;
  // Names sort without case; ties keep the list order in both directions.
  for (const auto& [offset, limit, by, order, paths] :
       std::vector<std::tuple<int, int, std::string, std::string, std::vector<std::string>>>{
           {0, 0, "", "", {"/s/c", "/s/a", "/s/b"}}, {0, 0, "name", "ASC", {"/s/a", "/s/c", "/s/b"}},
           {1, 1, "path", "DESC", {"/s/b"}}, {0, 0, "document", "DESC", {"/s/c", "/s/b", "/s/a"}},
           {0, 2, "document", "ASC", {"/s/a", "/s/c"}}, {7, 5, "name", "ASC", {}}}) {
    unsigned int total = 0;
    mgr.List(page, total, offset, limit, by, order);
    EXPECT_EQ(Paths(page), paths) << by << " " << order;
    EXPECT_EQ(total, 3u);
  }
  unsigned int total = 0;
  EXPECT_EQ(ErrorOf([&] { mgr.List(page, total, 0, 0, "size", "ASC"); }).code, kErrorBadArgument);
  EXPECT_EQ(ErrorOf([&] { mgr.List(page, total, 0, 0, "name", "asc"); }).code, kErrorBadArgument);
}

TEST_F(FolderMgrTest, SaveFailureIs505) {
  const FolderMgr mgr = With({"/s/a"});
  ASSERT_EQ(unlink(FoldersPath().c_str()), 0);
  ASSERT_EQ(rmdir((sandbox_.root() + "/var/packages/CorvLumex/etc").c_str()), 0);
  ExpectError([&] { mgr.Save(); }, kErrorSaveJson, FoldersPath(), "!folders.toFile(kFileIndexFoldersCfgPath)");
}

}  // namespace
}  // namespace fileindex
}  // namespace corvlumex
