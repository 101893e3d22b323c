// Translation of inotify records into queue lines, fed record by record
// against a real watch tree, so each rule is checked without timing: one row
// per rule, each on a fresh tree.
#include <fcntl.h>
#include <sys/inotify.h>
#include <unistd.h>

#include <gtest/gtest.h>

#include <cstring>
#include <filesystem>
#include <functional>
#include <map>
#include <set>
#include <sstream>
#include <string>
#include <vector>

#include "programs/corvnotifyd/event_line.h"
#include "programs/corvnotifyd/event_translator.h"
#include "tests/support/queue_line.h"
#include "tests/support/sandbox.h"

namespace corvlumex {
namespace notifyd {
namespace {

using testing_support::LogCapture;
using testing_support::Sandbox;
namespace fs = std::filesystem;

struct Loss {
  std::string queue;
  LossKind kind;
  std::string detail;
};

// A watch tree and its translator over a sandbox "share" with the folders
// docs, music and outside. Paths are relative to the share.
class Translation {
 public:
  Translation() : tree(fd_), translator(&tree, Callbacks()) {
    for (const char* dir : {"docs", "music", "outside"}) fs::create_directories(P(dir));
  }
  ~Translation() { close(fd_); }

  std::string P(const std::string& relative) const { return share + "/" + relative; }
  WatchRoot Root(const std::string& dir, const std::string& queue, uint32_t mask = 65478) const {
    return WatchRoot{P(dir), queue, mask, {"@eaDir"}};
  }
  const WatchedDir* Find(const std::string& dir) const { return tree.FindPath(P(dir)); }
  int Wd(const std::string& dir) const {
    EXPECT_NE(Find(dir), nullptr) << dir << " is not watched";
    return Find(dir) ? Find(dir)->wd : -100;
  }
  void Feed(const std::string& dir, uint32_t mask, const std::string& name = "", uint32_t cookie = 0) {
    struct inotify_event event;
    memset(&event, 0, sizeof(event));
    event.wd = Wd(dir);
    event.mask = mask;
    event.cookie = cookie;
    event.len = static_cast<uint32_t>(name.size());
    translator.Process(event, name);
  }
  void Make(const std::string& dir) const { fs::create_directories(P(dir)); }
  void Touch(const std::string& file) const { close(open(P(file).c_str(), O_WRONLY | O_CREAT, 0644)); }
  void Move(const std::string& from, const std::string& to) const { fs::rename(P(from), P(to)); }

  Sandbox root{false};
  const std::string share = root.path() + "/share";
  std::map<std::string, std::string> buffers;  // queue -> its lines
  std::vector<Loss> lost;
  int config_changes = 0;

 private:
  EventTranslator::Callbacks Callbacks() {
    return {[this](const std::string& queue) -> std::string& { return buffers[queue]; },
            [this](const std::string& queue, LossKind kind, const std::string& detail) {
              lost.push_back({queue, kind, detail});
            },
            [this](bool) { ++config_changes; }};
  }
  int fd_ = inotify_init1(IN_NONBLOCK | IN_CLOEXEC);

 public:
  WatchTree tree;
  EventTranslator translator;
};

// One expected queue line, paths relative to the share.
struct Expect {
  uint32_t event;
  const char* path;
  bool is_dir = false;
  const char* old = nullptr;
};

struct Case {
  const char* rule;
  std::vector<const char*> made;  // folders made before the watch starts
  std::vector<std::pair<const char*, const char*>> roots;  // folder, queue
  std::function<void(Translation&)> act;
  std::map<std::string, std::vector<Expect>> lines = {};  // queue -> its lines
  std::vector<const char*> watched = {}, unwatched = {};   // after the act
  uint32_t mask = 65478;
};

const std::pair<const char*, const char*> kDocs{"docs", "Q"};

std::vector<std::string> Split(const std::string& text) {
  std::vector<std::string> lines;
  std::istringstream in(text);
  for (std::string line; std::getline(in, line);) lines.push_back(line);
  return lines;
}

TEST(TranslatorTest, EachRuleOnAFreshTree) {
  const Case cases[] = {
      {"each kernel event becomes its line; the queue's own folder is never entered, so its appends make none",
       {"docs/@eaDir"}, {kDocs},
       [](Translation& t) {
         for (uint32_t mask : {IN_CREATE, IN_CLOSE_WRITE, IN_ATTRIB, IN_DELETE}) t.Feed("docs", mask, "f");
         t.Feed("docs", IN_ATTRIB | IN_ISDIR, "d");
         t.Feed("docs", IN_CLOSE_WRITE | IN_ISDIR, "d");  // never a modify for a folder
         t.Feed("docs", IN_DELETE | IN_ISDIR, "d");
         t.Feed("docs", IN_CREATE | IN_ISDIR, "@eaDir");  // an ignored name: no line, never entered
       },
       {{"Q", {{kEventCreate, "docs/f"}, {kEventModify, "docs/f"}, {kEventAttr, "docs/f"}, {kEventDelete, "docs/f"},
               {kEventAttr, "docs/d", true}, {kEventDelete, "docs/d", true}}}},
       {}, {"docs/@eaDir"}},
      {"rename halves are paired by cookie; a folder moved in is new here, contents and all, and watched",
       {"outside/in/sub"}, {kDocs},
       [](Translation& t) {
         t.Feed("docs", IN_MOVED_FROM, "a", 7);
         t.Feed("docs", IN_MOVED_TO, "b", 7);
         t.Feed("docs", IN_MOVED_FROM, "c", 8);  // a first half whose second never comes: moved out
         t.Feed("docs", IN_MOVED_TO, "d", 9);    // and a second half without first: moved in
         t.Touch("outside/in/sub/old");
         t.Move("outside/in", "docs/in");
         t.Feed("docs", IN_MOVED_TO | IN_ISDIR, "in", 10);
       },
       {{"Q", {{kEventRename, "docs/b", false, "docs/a"}, {kEventDelete, "docs/c"}, {kEventCreate, "docs/d"},
               {kEventCreate, "docs/in", true}, {kEventCreate, "docs/in/sub", true},
               {kEventCreate, "docs/in/sub/old"}}}},
       {"docs/in/sub"}},
      {"a folder moved out loses its watches", {"docs/out/deep"}, {kDocs},
       [](Translation& t) {
         ASSERT_NE(t.Find("docs/out/deep"), nullptr);
         t.Feed("docs", IN_MOVED_FROM | IN_ISDIR, "out", 3);
         EXPECT_TRUE(t.translator.HasPendingMove());
         t.translator.ResolvePendingMove();
       },
       {{"Q", {{kEventDelete, "docs/out", true}}}}, {}, {"docs/out", "docs/out/deep"}},
      {"a renamed folder keeps its watches under the new name", {"docs/old/sub"}, {kDocs},
       [](Translation& t) {
         const int sub_wd = t.Wd("docs/old/sub");
         t.Move("docs/old", "docs/new");
         t.Feed("docs", IN_MOVED_FROM | IN_ISDIR, "old", 4);
         t.Feed("docs", IN_MOVED_TO | IN_ISDIR, "new", 4);
         EXPECT_EQ(t.Wd("docs/new/sub"), sub_wd);
         t.Feed("docs/new/sub", IN_CREATE, "x");
       },
       {{"Q", {{kEventRename, "docs/new", true, "docs/old"}, {kEventCreate, "docs/new/sub/x"}}}},
       {"docs/new/sub"}, {"docs/old/sub"}},
      {"a new folder is read, contents made before its event included, after its watch is set", {}, {kDocs},
       [](Translation& t) {
         t.Make("docs/n/a/b");
         t.Touch("docs/n/a/b/f");
         t.Make("docs/n/@eaDir/hidden");
         t.Feed("docs", IN_CREATE | IN_ISDIR, "n");
       },
       {{"Q", {{kEventCreate, "docs/n", true}, {kEventCreate, "docs/n/a", true}, {kEventCreate, "docs/n/a/b", true},
               {kEventCreate, "docs/n/a/b/f"}}}},
       {"docs/n/a/b"}, {"docs/n/@eaDir"}},
      {"a rename into an ignored name is a delete, out of it a create", {"docs/d/inner"}, {kDocs},
       [](Translation& t) {
         t.Move("docs/d", "docs/@eaDir");
         t.Feed("docs", IN_MOVED_FROM | IN_ISDIR, "d", 5);
         t.Feed("docs", IN_MOVED_TO | IN_ISDIR, "@eaDir", 5);
         EXPECT_EQ(t.Find("docs/@eaDir"), nullptr);
         EXPECT_EQ(t.Find("docs/@eaDir/inner"), nullptr);
         t.Move("docs/@eaDir", "docs/back");
         t.Feed("docs", IN_MOVED_FROM | IN_ISDIR, "@eaDir", 6);
         t.Feed("docs", IN_MOVED_TO | IN_ISDIR, "back", 6);
       },
       {{"Q", {{kEventDelete, "docs/d", true}, {kEventCreate, "docs/back", true},
               {kEventCreate, "docs/back/inner", true}}}},
       {"docs/back/inner"}},
      {"a rename between queues is a delete for one and a create for the other", {"docs/d"},
       {{"docs", "A"}, {"music", "B"}},
       [](Translation& t) {
         t.Touch("docs/d/f");
         t.Move("docs/d", "music/d");
         t.Feed("docs", IN_MOVED_FROM | IN_ISDIR, "d", 9);
         t.Feed("music", IN_MOVED_TO | IN_ISDIR, "d", 9);
         ASSERT_NE(t.Find("music/d"), nullptr);
         EXPECT_EQ(t.Find("music/d")->roots, std::vector<int>{1});
       },
       {{"A", {{kEventDelete, "docs/d", true}}},
        {"B", {{kEventCreate, "music/d", true}, {kEventCreate, "music/d/f"}}}}},
      {"the mask chooses what is written; without renames both names are still told", {}, {kDocs},
       [](Translation& t) {
         t.Feed("docs", IN_ATTRIB, "f");
         t.Feed("docs", IN_CLOSE_WRITE, "f");
         t.Feed("docs", IN_MOVED_FROM, "a", 1);
         t.Feed("docs", IN_MOVED_TO, "b", 1);
       },
       {{"Q", {{kEventDelete, "docs/a"}, {kEventCreate, "docs/b"}}}}, {}, {}, kEventCreate | kEventDelete},
      {"nested folders of one queue write each line once", {"docs/inner"}, {kDocs, {"docs/inner", "Q"}},
       [](Translation& t) { t.Feed("docs/inner", IN_CREATE, "f"); },
       {{"Q", {{kEventCreate, "docs/inner/f"}}}}},
      {"folders removed from the configuration lose their watches", {"music/x"}, {kDocs, {"music", "Q"}},
       [](Translation& t) {
         ASSERT_NE(t.Find("music/x"), nullptr);
         t.translator.ApplyRoots({t.Root("docs", "Q")});
       },
       {}, {"docs"}, {"music", "music/x"}},
      {"an overflow loses every queue once and has the configuration read again", {},
       {{"docs", "A"}, {"music", "B"}, {"outside", "A"}},
       [](Translation& t) {
         struct inotify_event overflow;
         memset(&overflow, 0, sizeof(overflow));
         overflow.wd = -1;
         overflow.mask = IN_Q_OVERFLOW;
         t.translator.Process(overflow, "");
         ASSERT_EQ(t.lost.size(), 2u);
         EXPECT_EQ(t.lost[0].queue, "A");
         EXPECT_EQ(t.lost[1].queue, "B");
         EXPECT_EQ(t.lost[0].kind, LossKind::kKernelOverflow);
         EXPECT_EQ(t.config_changes, 1);
       }},
      {"a configured folder reports its own changes (its subfolders' by their parent), its loss and return",
       {"docs/sub"}, {kDocs},
       [](Translation& t) {
         t.Feed("docs", IN_ATTRIB | IN_ISDIR);
         t.Feed("docs/sub", IN_ATTRIB | IN_ISDIR);  // told by its parent instead
         EXPECT_FALSE(t.translator.AnyRootMissing());
         LogCapture log;
         fs::rename(t.P("docs"), t.root.path() + "/elsewhere");
         t.Feed("docs", IN_MOVE_SELF);
         t.translator.CheckRoots(false);
         EXPECT_TRUE(t.translator.AnyRootMissing());
         EXPECT_EQ(t.tree.size(), 0u);
         t.Make("docs/again");
         t.translator.CheckRoots(true);
         EXPECT_FALSE(t.translator.AnyRootMissing());
         EXPECT_EQ(log.Matching("watched folder " + t.P("docs") + " appeared").size(), 1u);
       },
       {{"Q", {{kEventAttr, "docs", true}, {kEventDelete, "docs", true}, {kEventCreate, "docs", true}}}},
       {"docs/again"}},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.rule);
    Translation t;
    for (const char* dir : c.made) t.Make(dir);
    std::vector<WatchRoot> roots;
    for (const auto& [dir, queue] : c.roots) roots.push_back(t.Root(dir, queue, c.mask));
    t.translator.ApplyRoots(std::move(roots));
    c.act(t);
    std::set<std::string> queues;
    for (const auto& entry : t.buffers) queues.insert(entry.first);
    for (const auto& entry : c.lines) queues.insert(entry.first);
    for (const std::string& queue : queues) {
      std::vector<std::string> expected;
      for (const Expect& e : c.lines.count(queue) ? c.lines.at(queue) : std::vector<Expect>{}) {
        expected.push_back(fileindex::queue_testing::Line(e.event, t.P(e.path), e.is_dir, e.old ? t.P(e.old) : ""));
      }
      EXPECT_EQ(Split(t.buffers[queue]), expected) << queue;
    }
    for (const char* dir : c.watched) EXPECT_NE(t.Find(dir), nullptr) << dir;
    for (const char* dir : c.unwatched) EXPECT_EQ(t.Find(dir), nullptr) << dir;
  }
}

TEST(TranslatorTest, RunningOutOfWatchesIsALossNamingTheFolder) {
  Translation t;
  t.Make("docs/a/b");
  t.tree.set_watch_limit(2);
  t.translator.ApplyRoots({t.Root("docs", "Q")});
  ASSERT_EQ(t.lost.size(), 1u);
  EXPECT_EQ(t.lost[0].kind, LossKind::kNoWatches);
  EXPECT_EQ(t.lost[0].detail, t.P("docs/a/b"));
  EXPECT_FALSE(t.translator.Rewatch("Q"));
  t.tree.set_watch_limit(0);
  EXPECT_TRUE(t.translator.Rewatch("Q"));
  EXPECT_NE(t.Find("docs/a/b"), nullptr);
}

}  // namespace
}  // namespace notifyd
}  // namespace corvlumex
