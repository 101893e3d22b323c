// The merge rules, renames carrying pending work from the old path to the
// new one among them, driven through queue files as the daemon uses them.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "tests/fileindex/queue/queue_fixture.h"

namespace corvlumex {
namespace fileindex {
namespace queue_testing {
namespace {

using MergeTest = QueueTest;
using RenameTest = QueueTest;

const std::string kFile = "/v/s/dir/f.txt";
const std::string kUpsert = "[02] " + kFile;
const std::string kAudio = R"({"audio":true})";
const std::string kMoved = "[05] /v/s/a -> /v/s/b";

std::string Rename(const std::string& from, const std::string& to, bool is_dir = false) {
  return Line(kEventRename, to, is_dir, from);
}

TEST_F(MergeTest, Table) {
  const std::vector<MergeCase> cases = {
      {"create then modify: the modify appends nothing",
       {Line(kEventCreate, kFile), Line(kEventModify, kFile)}, {kUpsert}, 1},
      {"create then delete", {Line(kEventCreate, kFile), Line(kEventDelete, kFile)}, {"[01] " + kFile}, 1},
      {"delete then create", {Line(kEventDelete, kFile), Line(kEventCreate, kFile)}, {kUpsert}, 1},
      {"modify after delete is dropped",
       {Line(kEventDelete, kFile), Line(kEventModify, kFile)}, {"[01] " + kFile}, 1},
      {"attr after delete is dropped", {Line(kEventDelete, kFile), Line(kEventAttr, kFile)}, {"[01] " + kFile}, 1},
      {"attr, delete, create",
       {Line(kEventAttr, kFile), Line(kEventDelete, kFile), Line(kEventCreate, kFile)}, {kUpsert}, 1},
      {"attr then modify",
       {Line(kEventAttr, kFile), Line(kEventAttr, kFile), Line(kEventModify, kFile)}, {kUpsert}, 1},
      {"directory create is a reindex; the file below is kept",
       {Line(kEventCreate, "/v/s/dir", true), Line(kEventCreate, kFile)}, {"[06] /v/s/dir", kUpsert}, 2},
      {"reindex cancels file events below, which stay counted",
       {Line(kEventCreate, kFile), Line(kEventReindex, "/v/s/dir")}, {"[06] /v/s/dir"}, 2},
      {"directory delete is a reindex",
       {Line(kEventModify, kFile), Line(kEventDelete, "/v/s/dir", true)}, {"[06] /v/s/dir"}, 2},
      // The reindex cancels the settings below but not the rename; the delete
      // after it is a second OP, and the create, though dropped by the
      // reindex, still turns that delete into an upsert.
      {"reindex keeps renames below and later deletes",
       {Line(kEventRename, "/v/s/dir/b", false, "/v/s/other/b"), Line(kEventUpdateCfg, "/v/s/dir/c"),
        Line(kEventReindex, "/v/s/dir"), Line(kEventDelete, "/v/s/dir"), Line(kEventCreate, "/v/s/dir")},
       {"[05] /v/s/other/b -> /v/s/dir/b", "[06] /v/s/dir", "[02] /v/s/dir"}, 4},
      {"settings merge with or",
       {CfgLine("/v/s/dir", R"({"document":true,"audio":false})"), CfgLine("/v/s/dir", R"({"audio":true})")},
       {R"([04] /v/s/dir, data={"audio":true,"document":true,"photo":false,"video":false})"}, 1},
      {"settings replace pending content work",
       {Line(kEventCreate, "/v/s/dir"), CfgLine("/v/s/dir", R"({"video":true})")},
       {R"([04] /v/s/dir, data={"video":true})"}, 1},
      {"a delete after settings is a second OP",
       {CfgLine("/v/s/dir", R"({"video":true})"), Line(kEventDelete, "/v/s/dir")},
       {R"([04] /v/s/dir, data={"video":true})", "[01] /v/s/dir"}, 2},
      {"a reindex cancels settings",
       {CfgLine("/v/s/dir", R"({"video":true})"), Line(kEventReindex, "/v/s/dir")}, {"[06] /v/s/dir"}, 1},
      {"garbled pending settings are replaced by the merge",
       {CfgLine("/v/s/dir", R"("junk")"), CfgLine("/v/s/dir", R"({"audio":true})")},
       {R"([04] /v/s/dir, data={"audio":true,"document":false,"photo":false,"video":false})"}, 1},
      // Create then modify on the same OP: the modify finds the OP itself
      // pending as an upsert and cancels it.
      {"create and modify bits in one line", {Line(kEventCreate | kEventModify, kFile)}, {}, 1},
      // Create then rename: the rename changes the kind and appends it again.
      {"create and rename bits in one line", {Line(kEventCreate | kEventRename, "/v/s/new", false, "/v/s/old")},
       {"[05] /v/s/old -> /v/s/new", "[05] /v/s/old -> /v/s/new"}, 2},
      {"unknown bits are ignored", {Line(0x8000000 | kEventCreate, kFile), Line(0x1, kFile)}, {kUpsert}, 1},
      {"a setting that is not boolean fails the line, the pending settings stay",
       {CfgLine("/v/s/dir", R"({"photo":true})"), CfgLine("/v/s/dir", R"({"document":"yes"})"),
        CfgLine("/v/s/dir", R"([true])")},
       {R"([04] /v/s/dir, data={"photo":true})"}, 1},
      // Renames: moved OPs keep their place in the processing order with the new path.
      {"pending work below follows, deletes stay",
       {Line(kEventCreate, "/v/s/a/x"), Line(kEventDelete, "/v/s/a/y"), Line(kEventAttr, "/v/s/a/d/z"),
        Rename("/v/s/a", "/v/s/b", true)},
       {"[02] /v/s/b/x", "[01] /v/s/a/y", "[03] /v/s/b/d/z", kMoved}, 4},
      {"pending upsert is redone after the rename",
       {Line(kEventCreate, "/v/s/a"), Rename("/v/s/a", "/v/s/b")}, {kMoved, "[02] /v/s/b"}, 3},
      {"pending attr is redone after the rename",
       {Line(kEventAttr, "/v/s/a"), Rename("/v/s/a", "/v/s/b")}, {kMoved, "[03] /v/s/b"}, 3},
      {"pending reindex is redone after the rename",
       {Line(kEventReindex, "/v/s/a"), Rename("/v/s/a", "/v/s/b", true)}, {kMoved, "[06] /v/s/b"}, 3},
      {"settings and deletes of the old path move with their kind",
       {CfgLine("/v/s/a", kAudio), Line(kEventDelete, "/v/s/a"), Rename("/v/s/a", "/v/s/b")},
       {R"([04] /v/s/b, data={"audio":true})", "[01] /v/s/b", kMoved}, 3},
      {"renames of the old path chain",
       {Rename("/v/s/c", "/v/s/a"), Rename("/v/s/a", "/v/s/b")}, {"[05] /v/s/c -> /v/s/b", kMoved}, 2},
      {"overwrites a pending upsert at the destination",
       {Line(kEventCreate, "/v/s/b"), Rename("/v/s/a", "/v/s/b")}, {kMoved}, 2},
      {"overwrites a pending attr at the destination",
       {Line(kEventAttr, "/v/s/b"), Rename("/v/s/a", "/v/s/b")}, {kMoved}, 2},
      {"a reindex at the destination stays, a delete behind it goes",
       {Line(kEventReindex, "/v/s/b"), Line(kEventDelete, "/v/s/b"), Rename("/v/s/a", "/v/s/b")},
       {"[06] /v/s/b", kMoved}, 3},
      {"settings at the destination stay",
       {CfgLine("/v/s/b", kAudio), Rename("/v/s/a", "/v/s/b")}, {R"([04] /v/s/b, data={"audio":true})", kMoved}, 2},
      {"later work is appended after a pending rename",
       {Rename("/v/s/a", "/v/s/b"), Line(kEventModify, "/v/s/b"), Line(kEventModify, "/v/s/b")},
       {kMoved, "[02] /v/s/b"}, 2},
      {"a rename onto itself moves pending work behind it",
       {CfgLine("/v/s/a", R"({"photo":true})"), Line(kEventAttr, "/v/s/a/x"), Rename("/v/s/a", "/v/s/a")},
       {R"([04] /v/s/a, data={"photo":true})", "[03] /v/s/a/x", "[05] /v/s/a -> /v/s/a"}, 3},
      {"rename into its own subtree is refused",
       {Line(kEventCreate, "/v/s/a/x"), Rename("/v/s/a", "/v/s/a/b", true), Line(kEventModify, "/v/s/a/y")},
       {"[02] /v/s/a/x", "[02] /v/s/a/y"}, 2},
      {"rename to a parent folder",
       {Line(kEventModify, "/v/s/a/b/x"), Rename("/v/s/a/b", "/v/s/a", true)},
       {"[02] /v/s/a/x", "[05] /v/s/a/b -> /v/s/a"}, 2},
      {"an old path that does not resolve fails the line",
       {Line(kEventRename, "/v/s/b", false, ""), Line(kEventRename, "/v/s/b", false, "rel/x"),
        Line(kEventCreate, "/v/s/c")},
       {"[02] /v/s/c"}, 1},
  };
  for (const MergeCase& c : cases) {
    SCOPED_TRACE(c.name);
    const Processed out = Run(c.lines);
    EXPECT_EQ(out.ops, c.ops);
    EXPECT_EQ(out.count, c.count);
  }
  EXPECT_EQ(log_.Matching("InsertEvent failed, event_raw=" + Rename("/v/s/a", "/v/s/a/b", true) +
                          ", code=120, reason=Rename into its own subtree, path_old=/v/s/a, path=/v/s/a/b")
                .size(),
            1u);
  EXPECT_EQ(log_.Matching("code=120, reason=Not a string").size(), 1u);
  EXPECT_EQ(log_.Matching("code=120, reason=Not an object").size(), 1u);
  EXPECT_EQ(log_.Matching("code=9999, reason=GetNodeByPath failed, path=").size(), 2u);
  EXPECT_EQ(log_.Matching("code=9999, reason=GetNodeByPath failed, path=rel/x").size(), 1u);
  // The settings stay ahead of the rename onto itself in the node's own list.
  auto tree = Build({CfgLine("/v/s/a", R"({"photo":true})"), Rename("/v/s/a", "/v/s/a")});
  const auto node = tree->GetNodeByPath("/v/s/a");
  ASSERT_EQ(node->ops_.size(), 2u);
  EXPECT_EQ(node->ops_[0]->op_, kOPUpdateCfg);
  EXPECT_EQ(node->ops_[1]->op_, kOPRename);
}

// A queue found by fuzzing: renames of a folder into ever deeper places
// inside itself used to copy the pending subtree into itself until memory
// ran out.
TEST_F(RenameTest, RepeatedRenamesIntoItselfStaySmall) {
  OPTree tree(std::string(OPTREE_TEST_DATA) + "/rename_into_itself.queue");
  size_t nodes = 0;
  OPTree::TraverseNodeDescendant(tree.Root(), [&](std::shared_ptr<OPNode>) { ++nodes; }, true);
  EXPECT_LT(nodes, 200u);
  EXPECT_EQ(log_.Matching("reason=Rename into its own subtree").size(), 3u);
}

TEST_F(RenameTest, ManyDescendantsKeepTheirOrderAndFollow) {
  std::vector<std::string> lines;
  for (int i = 0; i < 300; ++i) lines.push_back(Line(kEventCreate, "/v/s/big/f" + std::to_string(i)));
  lines.push_back(Rename("/v/s/big", "/v/s/moved", true));
  for (int i = 0; i < 300; ++i) lines.push_back(Line(kEventModify, "/v/s/moved/f" + std::to_string(i)));
  auto tree = Build(lines);
  const Processed out = Process(*tree);
  ASSERT_EQ(out.ops.size(), 301u);
  EXPECT_EQ(out.ops[0], "[02] /v/s/moved/f0");
  EXPECT_EQ(out.ops[299], "[02] /v/s/moved/f299");
  EXPECT_EQ(out.ops[300], "[05] /v/s/big -> /v/s/moved");
  EXPECT_EQ(out.count, 301u);  // the modifies merged into the moved upserts
  const auto moved = tree->GetNodeByPath("/v/s/moved");
  ASSERT_EQ(moved->Children().size(), 300u);
  for (int i = 0; i < 300; ++i) EXPECT_EQ(moved->Children()[i]->name_, "f" + std::to_string(i));
  EXPECT_TRUE(tree->GetNodeByPath("/v/s/big/f7")->ops_.empty());
}

}  // namespace
}  // namespace queue_testing
}  // namespace fileindex
}  // namespace corvlumex
