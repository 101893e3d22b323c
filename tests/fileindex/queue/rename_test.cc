// Renames carry pending work from the old path to the new one.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "tests/fileindex/queue/queue_fixture.h"

namespace corvlumex {
namespace fileindex {
namespace queue_testing {
namespace {

using ::testing::ElementsAre;

class RenameTest : public ::testing::Test, public QueueTest {
 protected:
  void SetUp() override { log_level = 6; }
  void TearDown() override { log_level = 7; }
  Processed Run(const std::vector<std::string>& lines) { return Process(*Build(lines)); }
  testing_support::LogCapture log_;
};

std::string Rename(const std::string& from, const std::string& to, bool is_dir = false) {
  return Line(kEventRename, to, is_dir, from);
}

TEST_F(RenameTest, PendingWorkBelowFollowsButDeletesStay) {
  const Processed out = Run({Line(kEventCreate, "/v/s/a/x"), Line(kEventDelete, "/v/s/a/y"),
                             Line(kEventAttr, "/v/s/a/d/z"), Rename("/v/s/a", "/v/s/b", true)});
  // Moved OPs keep their place in the processing order with the new path.
  EXPECT_THAT(out.ops, ElementsAre("[02] /v/s/b/x", "[01] /v/s/a/y", "[03] /v/s/b/d/z", "[05] /v/s/a -> /v/s/b"));
  EXPECT_EQ(out.count, 4u);
}

TEST_F(RenameTest, PendingContentWorkIsRedoneAfterTheRename) {
  Processed out = Run({Line(kEventCreate, "/v/s/a"), Rename("/v/s/a", "/v/s/b")});
  EXPECT_THAT(out.ops, ElementsAre("[05] /v/s/a -> /v/s/b", "[02] /v/s/b"));
  EXPECT_EQ(out.count, 3u);  // the cancelled upsert stays counted
  out = Run({Line(kEventAttr, "/v/s/a"), Rename("/v/s/a", "/v/s/b")});
  EXPECT_THAT(out.ops, ElementsAre("[05] /v/s/a -> /v/s/b", "[03] /v/s/b"));
  out = Run({Line(kEventReindex, "/v/s/a"), Rename("/v/s/a", "/v/s/b", true)});
  EXPECT_THAT(out.ops, ElementsAre("[05] /v/s/a -> /v/s/b", "[06] /v/s/b"));
}

TEST_F(RenameTest, DeleteSettingsAndRenamesOfTheOldPathMoveWithTheirKind) {
  EXPECT_THAT(Run({CfgLine("/v/s/a", R"({"audio":true})"), Line(kEventDelete, "/v/s/a"), Rename("/v/s/a", "/v/s/b")}).ops,
              ElementsAre(R"([04] /v/s/b, data={"audio":true})", "[01] /v/s/b", "[05] /v/s/a -> /v/s/b"));
  EXPECT_THAT(Run({Rename("/v/s/c", "/v/s/a"), Rename("/v/s/a", "/v/s/b")}).ops,
              ElementsAre("[05] /v/s/c -> /v/s/b", "[05] /v/s/a -> /v/s/b"));
}

TEST_F(RenameTest, RenameOverwritesPendingFileWorkAtTheDestination) {
  EXPECT_THAT(Run({Line(kEventCreate, "/v/s/b"), Rename("/v/s/a", "/v/s/b")}).ops,
              ElementsAre("[05] /v/s/a -> /v/s/b"));
  EXPECT_THAT(Run({Line(kEventAttr, "/v/s/b"), Rename("/v/s/a", "/v/s/b")}).ops,
              ElementsAre("[05] /v/s/a -> /v/s/b"));
  // A reindex and settings stay; a delete kept behind a reindex goes.
  EXPECT_THAT(Run({Line(kEventReindex, "/v/s/b"), Line(kEventDelete, "/v/s/b"), Rename("/v/s/a", "/v/s/b")}).ops,
              ElementsAre("[06] /v/s/b", "[05] /v/s/a -> /v/s/b"));
  EXPECT_THAT(Run({CfgLine("/v/s/b", R"({"audio":true})"), Rename("/v/s/a", "/v/s/b")}).ops,
              ElementsAre(R"([04] /v/s/b, data={"audio":true})", "[05] /v/s/a -> /v/s/b"));
}

TEST_F(RenameTest, LaterWorkIsAppendedAfterAPendingRename) {
  const Processed out = Run({Rename("/v/s/a", "/v/s/b"), Line(kEventModify, "/v/s/b"), Line(kEventModify, "/v/s/b")});
  EXPECT_THAT(out.ops, ElementsAre("[05] /v/s/a -> /v/s/b", "[02] /v/s/b"));
}

TEST_F(RenameTest, RenameOntoItselfMovesPendingWorkBehindIt) {
  const Processed out = Run({CfgLine("/v/s/a", R"({"photo":true})"), Line(kEventAttr, "/v/s/a/x"),
                             Rename("/v/s/a", "/v/s/a")});
  EXPECT_THAT(out.ops, ElementsAre(R"([04] /v/s/a, data={"photo":true})", "[03] /v/s/a/x", "[05] /v/s/a -> /v/s/a"));
  auto tree = Build({CfgLine("/v/s/a", R"({"photo":true})"), Rename("/v/s/a", "/v/s/a")});
  const auto node = tree->GetNodeByPath("/v/s/a");
  ASSERT_EQ(node->ops_.size(), 2u);
  EXPECT_EQ(node->ops_[0]->op_, kOPUpdateCfg);
  EXPECT_EQ(node->ops_[1]->op_, kOPRename);
}

TEST_F(RenameTest, RenameIntoItsOwnSubtreeIsRefused) {
  const Processed out = Run({Line(kEventCreate, "/v/s/a/x"), Rename("/v/s/a", "/v/s/a/b", true),
                             Line(kEventModify, "/v/s/a/y")});
  EXPECT_THAT(out.ops, ElementsAre("[02] /v/s/a/x", "[02] /v/s/a/y"));
  EXPECT_EQ(log_.Matching("InsertEvent failed, event_raw=" + Rename("/v/s/a", "/v/s/a/b", true) +
                          ", code=120, reason=Rename into its own subtree, path_old=/v/s/a, path=/v/s/a/b")
                .size(),
            1u);
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

TEST_F(RenameTest, RenameToAParentFolder) {
  const Processed out = Run({Line(kEventModify, "/v/s/a/b/x"), Rename("/v/s/a/b", "/v/s/a", true)});
  EXPECT_THAT(out.ops, ElementsAre("[02] /v/s/a/x", "[05] /v/s/a/b -> /v/s/a"));
}

TEST_F(RenameTest, OldPathThatDoesNotResolveFailsTheLine) {
  const Processed out = Run({Line(kEventRename, "/v/s/b", false, ""), Line(kEventRename, "/v/s/b", false, "rel/x"),
                             Line(kEventCreate, "/v/s/c")});
  EXPECT_THAT(out.ops, ElementsAre("[02] /v/s/c"));
  EXPECT_EQ(log_.Matching("code=9999, reason=GetNodeByPath failed, path=").size(), 2u);
  EXPECT_EQ(log_.Matching("code=9999, reason=GetNodeByPath failed, path=rel/x").size(), 1u);
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
