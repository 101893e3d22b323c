// Translation of inotify records into queue lines, fed record by record
// against a real watch tree, so each rule is checked without timing.
#include <fcntl.h>
#include <sys/inotify.h>
#include <unistd.h>

#include <gtest/gtest.h>

#include <cstring>
#include <filesystem>
#include <map>
#include <string>
#include <vector>

#include "programs/corvnotifyd/event_line.h"
#include "programs/corvnotifyd/event_translator.h"
#include "tests/programs/corvnotifyd/notifyd_harness.h"
#include "tests/support/sandbox.h"

namespace corvlumex {
namespace notifyd {
namespace {

using testing_support::LogCapture;
using testing_support::ParseQueueText;
using testing_support::Line;
using testing_support::QueueLine;
using testing_support::Sandbox;
namespace fs = std::filesystem;

struct Loss {
  std::string queue;
  LossKind kind;
  std::string detail;
};

class TranslatorTest : public ::testing::Test {
 protected:
  TranslatorTest() : fd_(inotify_init1(IN_NONBLOCK | IN_CLOEXEC)), tree_(fd_), translator_(&tree_, Callbacks()) {
    docs_ = root_.MakeDir("share/docs");
    music_ = root_.MakeDir("share/music");
    outside_ = root_.MakeDir("share/outside");
  }
  ~TranslatorTest() override { close(fd_); }

  EventTranslator::Callbacks Callbacks() {
    return {[this](const std::string& queue) -> std::string& { return buffers_[queue]; },
            [this](const std::string& queue, LossKind kind, const std::string& detail) {
              lost_.push_back({queue, kind, detail});
            },
            [this](bool) { ++config_changes_; }};
  }

  WatchRoot Root(const std::string& path, const std::string& queue, uint32_t mask = 65478) {
    return WatchRoot{path, queue, mask, {"@eaDir"}};
  }
  void Watch(std::vector<WatchRoot> roots) { translator_.ApplyRoots(std::move(roots)); }
  int Wd(const std::string& dir) {
    const WatchedDir* watched = tree_.FindPath(dir);
    EXPECT_NE(watched, nullptr) << dir << " is not watched";
    return watched ? watched->wd : -100;
  }
  void Feed(const std::string& dir, uint32_t mask, const std::string& name = "", uint32_t cookie = 0) {
    struct inotify_event event;
    memset(&event, 0, sizeof(event));
    event.wd = Wd(dir);
    event.mask = mask;
    event.cookie = cookie;
    event.len = static_cast<uint32_t>(name.size());
    translator_.Process(event, name);
  }
  std::vector<QueueLine> Lines(const std::string& queue = "Q") { return ParseQueueText(buffers_[queue]); }

  Sandbox root_{false};
  std::string docs_, music_, outside_;
  int fd_;
  WatchTree tree_;
  EventTranslator translator_;
  std::map<std::string, std::string> buffers_;
  std::vector<Loss> lost_;
  int config_changes_ = 0;
};

TEST_F(TranslatorTest, EachKernelEventBecomesItsLine) {
  // The folder of the queue itself: never entered, so the queue's own
  // appends make no lines.
  root_.MakeDir("share/docs/@eaDir");
  Watch({Root(docs_, "Q")});
  EXPECT_EQ(tree_.FindPath(docs_ + "/@eaDir"), nullptr);
  Feed(docs_, IN_CREATE, "f");
  Feed(docs_, IN_CLOSE_WRITE, "f");
  Feed(docs_, IN_ATTRIB, "f");
  Feed(docs_, IN_DELETE, "f");
  Feed(docs_, IN_ATTRIB | IN_ISDIR, "d");
  Feed(docs_, IN_CLOSE_WRITE | IN_ISDIR, "d");  // never a modify for a folder
  Feed(docs_, IN_DELETE | IN_ISDIR, "d");
  Feed(docs_, IN_CREATE, "@eaDir");  // ignored name
  const std::string f = docs_ + "/f";
  EXPECT_EQ(Lines(), (std::vector<QueueLine>{Line(kEventCreate, f), Line(kEventModify, f), Line(kEventAttr, f),
                                             Line(kEventDelete, f),
                                             Line(kEventAttr, docs_ + "/d", true),
                                             Line(kEventDelete, docs_ + "/d", true)}));
}

TEST_F(TranslatorTest, RenameHalvesArePairedByCookie) {
  Watch({Root(docs_, "Q")});
  Feed(docs_, IN_MOVED_FROM, "a", 7);
  Feed(docs_, IN_MOVED_TO, "b", 7);
  // A first half whose second never comes: moved out of the tree.
  Feed(docs_, IN_MOVED_FROM, "c", 8);
  Feed(docs_, IN_MOVED_TO, "d", 9);  // and a second half without first: moved in
  // A folder moved in with its contents: all of it is new here, and watched.
  fs::create_directories(outside_ + "/in/sub");
  close(open((outside_ + "/in/sub/old").c_str(), O_WRONLY | O_CREAT, 0644));
  fs::rename(outside_ + "/in", docs_ + "/in");
  Feed(docs_, IN_MOVED_TO | IN_ISDIR, "in", 10);
  EXPECT_EQ(Lines(), (std::vector<QueueLine>{Line(kEventRename, docs_ + "/b", false, docs_ + "/a"),
                                             Line(kEventDelete, docs_ + "/c"),
                                             Line(kEventCreate, docs_ + "/d"),
                                             Line(kEventCreate, docs_ + "/in", true),
                                             Line(kEventCreate, docs_ + "/in/sub", true),
                                             Line(kEventCreate, docs_ + "/in/sub/old")}));
  EXPECT_NE(tree_.FindPath(docs_ + "/in/sub"), nullptr);
}

TEST_F(TranslatorTest, AFolderMovedOutLosesItsWatches) {
  fs::create_directories(docs_ + "/out/deep");
  Watch({Root(docs_, "Q")});
  ASSERT_NE(tree_.FindPath(docs_ + "/out/deep"), nullptr);
  Feed(docs_, IN_MOVED_FROM | IN_ISDIR, "out", 3);
  EXPECT_TRUE(translator_.HasPendingMove());
  translator_.ResolvePendingMove();
  EXPECT_EQ(Lines(), (std::vector<QueueLine>{Line(kEventDelete, docs_ + "/out", true)}));
  EXPECT_EQ(tree_.FindPath(docs_ + "/out"), nullptr);
  EXPECT_EQ(tree_.FindPath(docs_ + "/out/deep"), nullptr);
}

TEST_F(TranslatorTest, ARenamedFolderKeepsItsWatchesUnderTheNewName) {
  fs::create_directories(docs_ + "/old/sub");
  Watch({Root(docs_, "Q")});
  const int sub_wd = Wd(docs_ + "/old/sub");
  fs::rename(docs_ + "/old", docs_ + "/new");
  Feed(docs_, IN_MOVED_FROM | IN_ISDIR, "old", 4);
  Feed(docs_, IN_MOVED_TO | IN_ISDIR, "new", 4);
  EXPECT_EQ(Lines(), (std::vector<QueueLine>{Line(kEventRename, docs_ + "/new", true, docs_ + "/old")}));
  ASSERT_NE(tree_.FindPath(docs_ + "/new/sub"), nullptr);
  EXPECT_EQ(tree_.FindPath(docs_ + "/new/sub")->wd, sub_wd);
  EXPECT_EQ(tree_.FindPath(docs_ + "/old/sub"), nullptr);
  Feed(docs_ + "/new/sub", IN_CREATE, "x");
  EXPECT_EQ(Lines().back(), Line(kEventCreate, docs_ + "/new/sub/x"));
}

TEST_F(TranslatorTest, ANewFolderIsReadAfterItsWatchIsSet) {
  Watch({Root(docs_, "Q")});
  // Made, with contents, before the event is handled.
  fs::create_directories(docs_ + "/n/a/b");
  close(open((docs_ + "/n/a/b/f").c_str(), O_WRONLY | O_CREAT, 0644));
  fs::create_directories(docs_ + "/n/@eaDir/hidden");
  Feed(docs_, IN_CREATE | IN_ISDIR, "n");
  const auto lines = Lines();
  const std::vector<QueueLine> expected = {Line(kEventCreate, docs_ + "/n", true), Line(kEventCreate, docs_ + "/n/a", true),
                                           Line(kEventCreate, docs_ + "/n/a/b", true),
                                           Line(kEventCreate, docs_ + "/n/a/b/f")};
  EXPECT_EQ(lines, expected);
  EXPECT_NE(tree_.FindPath(docs_ + "/n/a/b"), nullptr);
  EXPECT_EQ(tree_.FindPath(docs_ + "/n/@eaDir"), nullptr) << "ignored folders are never entered";
}

TEST_F(TranslatorTest, RenamesIntoAndOutOfAnIgnoredName) {
  fs::create_directories(docs_ + "/d/inner");
  Watch({Root(docs_, "Q")});
  fs::rename(docs_ + "/d", docs_ + "/@eaDir");
  Feed(docs_, IN_MOVED_FROM | IN_ISDIR, "d", 5);
  Feed(docs_, IN_MOVED_TO | IN_ISDIR, "@eaDir", 5);
  EXPECT_EQ(tree_.FindPath(docs_ + "/@eaDir"), nullptr);
  EXPECT_EQ(tree_.FindPath(docs_ + "/@eaDir/inner"), nullptr);
  fs::rename(docs_ + "/@eaDir", docs_ + "/back");
  Feed(docs_, IN_MOVED_FROM | IN_ISDIR, "@eaDir", 6);
  Feed(docs_, IN_MOVED_TO | IN_ISDIR, "back", 6);
  EXPECT_EQ(Lines(), (std::vector<QueueLine>{Line(kEventDelete, docs_ + "/d", true), Line(kEventCreate, docs_ + "/back", true),
                                             Line(kEventCreate, docs_ + "/back/inner", true)}));
  EXPECT_NE(tree_.FindPath(docs_ + "/back/inner"), nullptr);
}

TEST_F(TranslatorTest, ARenameBetweenQueuesIsADeleteForOneAndACreateForTheOther) {
  fs::create_directories(docs_ + "/d");
  close(open((docs_ + "/d/f").c_str(), O_WRONLY | O_CREAT, 0644));
  Watch({Root(docs_, "A"), Root(music_, "B")});
  fs::rename(docs_ + "/d", music_ + "/d");
  Feed(docs_, IN_MOVED_FROM | IN_ISDIR, "d", 9);
  Feed(music_, IN_MOVED_TO | IN_ISDIR, "d", 9);
  EXPECT_EQ(Lines("A"), (std::vector<QueueLine>{Line(kEventDelete, docs_ + "/d", true)}));
  EXPECT_EQ(Lines("B"), (std::vector<QueueLine>{Line(kEventCreate, music_ + "/d", true), Line(kEventCreate, music_ + "/d/f")}));
  ASSERT_NE(tree_.FindPath(music_ + "/d"), nullptr);
  EXPECT_EQ(tree_.FindPath(music_ + "/d")->roots, std::vector<int>{1});
}

TEST_F(TranslatorTest, TheMaskChoosesWhatIsWritten) {
  Watch({Root(docs_, "Q", kEventCreate | kEventDelete)});
  Feed(docs_, IN_ATTRIB, "f");
  Feed(docs_, IN_CLOSE_WRITE, "f");
  Feed(docs_, IN_MOVED_FROM, "a", 1);
  Feed(docs_, IN_MOVED_TO, "b", 1);  // no rename asked: both names are still told
  EXPECT_EQ(Lines(), (std::vector<QueueLine>{Line(kEventDelete, docs_ + "/a"), Line(kEventCreate, docs_ + "/b")}));
}

TEST_F(TranslatorTest, NestedFoldersOfOneQueueWriteEachLineOnce) {
  fs::create_directories(docs_ + "/inner");
  Watch({Root(docs_, "Q"), Root(docs_ + "/inner", "Q")});
  Feed(docs_ + "/inner", IN_CREATE, "f");
  EXPECT_EQ(Lines(), (std::vector<QueueLine>{Line(kEventCreate, docs_ + "/inner/f")}));
}

TEST_F(TranslatorTest, AConfiguredFolderReportsItsOwnChangesAndItsDisappearance) {
  fs::create_directories(docs_ + "/sub");
  Watch({Root(docs_, "Q")});
  Feed(docs_, IN_ATTRIB | IN_ISDIR);
  Feed(docs_ + "/sub", IN_ATTRIB | IN_ISDIR);  // told by its parent instead
  EXPECT_EQ(Lines(), (std::vector<QueueLine>{Line(kEventAttr, docs_, true)}));
  EXPECT_FALSE(translator_.AnyRootMissing());

  LogCapture log;
  fs::rename(docs_, root_.path() + "/elsewhere");
  Feed(docs_, IN_MOVE_SELF);
  translator_.CheckRoots(false);
  EXPECT_TRUE(translator_.AnyRootMissing());
  EXPECT_EQ(Lines().back(), Line(kEventDelete, docs_, true));
  EXPECT_EQ(tree_.size(), 0u);

  fs::create_directories(docs_ + "/again");
  translator_.CheckRoots(true);
  EXPECT_FALSE(translator_.AnyRootMissing());
  EXPECT_EQ(Lines().back(), Line(kEventCreate, docs_, true));
  EXPECT_NE(tree_.FindPath(docs_ + "/again"), nullptr);
  EXPECT_EQ(log.Matching("watched folder " + docs_ + " appeared").size(), 1u);
}

TEST_F(TranslatorTest, OverflowLosesEveryQueueAndRereadsTheConfiguration) {
  Watch({Root(docs_, "A"), Root(music_, "B"), Root(outside_, "A")});
  struct inotify_event overflow;
  memset(&overflow, 0, sizeof(overflow));
  overflow.wd = -1;
  overflow.mask = IN_Q_OVERFLOW;
  translator_.Process(overflow, "");
  ASSERT_EQ(lost_.size(), 2u);
  EXPECT_EQ(lost_[0].queue, "A");
  EXPECT_EQ(lost_[1].queue, "B");
  EXPECT_EQ(lost_[0].kind, LossKind::kKernelOverflow);
  EXPECT_EQ(config_changes_, 1);
}

TEST_F(TranslatorTest, RunningOutOfWatchesIsALossNamingTheFolder) {
  fs::create_directories(docs_ + "/a/b");
  tree_.set_watch_limit(2);
  Watch({Root(docs_, "Q")});
  ASSERT_EQ(lost_.size(), 1u);
  EXPECT_EQ(lost_[0].kind, LossKind::kNoWatches);
  EXPECT_EQ(lost_[0].detail, docs_ + "/a/b");
  EXPECT_FALSE(translator_.Rewatch("Q"));
  tree_.set_watch_limit(0);
  EXPECT_TRUE(translator_.Rewatch("Q"));
  EXPECT_NE(tree_.FindPath(docs_ + "/a/b"), nullptr);
}

TEST_F(TranslatorTest, ChunksAreSplitIntoTheirRecords) {
  Watch({Root(docs_, "Q")});
  std::string chunk;
  for (const char* name : {"first", "second-longer-name"}) {
    struct inotify_event event;
    memset(&event, 0, sizeof(event));
    event.wd = Wd(docs_);
    event.mask = IN_CREATE;
    event.len = 32;  // the kernel pads names with NULs
    chunk.append(reinterpret_cast<const char*>(&event), sizeof(event));
    std::string padded(name);
    padded.resize(32, '\0');
    chunk += padded;
  }
  translator_.ProcessChunk(chunk);
  EXPECT_EQ(Lines(), (std::vector<QueueLine>{Line(kEventCreate, docs_ + "/first"),
                                             Line(kEventCreate, docs_ + "/second-longer-name")}));
}

TEST_F(TranslatorTest, RemovedFoldersLoseTheirWatchesOnANewConfiguration) {
  fs::create_directories(music_ + "/x");
  Watch({Root(docs_, "Q"), Root(music_, "Q")});
  EXPECT_NE(tree_.FindPath(music_ + "/x"), nullptr);
  Watch({Root(docs_, "Q")});
  EXPECT_EQ(tree_.FindPath(music_), nullptr);
  EXPECT_EQ(tree_.FindPath(music_ + "/x"), nullptr);
  EXPECT_NE(tree_.FindPath(docs_), nullptr);
}

}  // namespace
}  // namespace notifyd
}  // namespace corvlumex
