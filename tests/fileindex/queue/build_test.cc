// Building a tree from a queue file, resolving paths, handing OPs out.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <iomanip>
#include <sstream>

#include "common/error.h"
#include "tests/fileindex/queue/queue_fixture.h"

namespace corvlumex {
namespace fileindex {
namespace queue_testing {
namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;

using BuildTest = QueueTest;

TEST_F(BuildTest, EmptyQueueHandsOutNothingAndAMissingOneThrows502AndLogs) {
  auto tree = Build({});
  const Processed out = Process(*tree);
  EXPECT_THAT(out.ops, IsEmpty());
  EXPECT_EQ(out.count, 0u);
  EXPECT_FALSE(tree->IsCrashed());
  errno = 0;
  const Error error = testing_support::ErrorOf([&] { OPTree absent(sandbox_.path() + "/absent"); });
  EXPECT_EQ(error.code, kErrorSystem);
  EXPECT_EQ(error.reason, "Failed to open queue, reason=No such file or directory");
  ASSERT_EQ(log_.Lines().size(), 1u);
  EXPECT_THAT(log_.Lines()[0], HasSubstr("(BuildTree) Failed [!input_stream], reason: Failed to open queue, "
                                         "reason=No such file or directory [err: No such file or directory]"));
  EXPECT_EQ(errno, 0);
}

TEST_F(BuildTest, EveryLineIsLoggedAtDebugLevelOnly) {
  const std::string line = Line(kEventCreate, "/v/s/a");
  log_level = 7;
  Build({line});
  EXPECT_EQ(log_.Matching("Got event: " + line).size(), 1u);
  log_.Clear();
  log_level = 6;
  Build({line});
  EXPECT_THAT(log_.Lines(), IsEmpty());
}

// The last line may lack its newline; a carriage return before one is read as space.
TEST_F(BuildTest, MalformedLinesAreLoggedTwiceAndSkipped) {
  OPTree tree(WriteRaw("not json\n\n" + Line(kEventCreate, "/v/s/a") + "\r\n{\"event\":1}\n" +
                       Line(kEventCreate, "/v/s/b")));
  EXPECT_THAT(Process(tree).ops, ElementsAre("[02] /v/s/a", "[02] /v/s/b"));
  EXPECT_EQ(log_.Matching("(Event) Failed [!data.fromString(event_raw)], reason: Malformed event_raw: not json").size(),
            1u);
  EXPECT_EQ(log_.Matching("(BuildTree) InsertEvent failed, event_raw=not json, code=906, "
                          "reason=Malformed event_raw: not json")
                .size(),
            1u);
  // The empty line between is a line too.
  EXPECT_EQ(log_.Matching("InsertEvent failed, event_raw=, code=906, reason=Malformed event_raw: ").size(), 1u);
  // A typed-read failure is logged once, by the tree.
  EXPECT_EQ(log_.Matching("event_raw={\"event\":1}, code=120, reason=Missing property: path").size(), 1u);
  EXPECT_EQ(log_.Lines().size(), 5u);
}

TEST_F(BuildTest, LinesAcrossReadBlocksAndLongerThanABlockAreWhole) {
  // About 2.5 MiB: lines straddle the 1 MiB read blocks, and one line is
  // longer than a block.
  std::vector<std::string> lines;
  std::vector<std::string> expected;
  for (int i = 0; i < 24000; ++i) {
    std::string path = "/v/s/" + std::string(40 + i % 57, 'a' + i % 26) + "/f" + std::to_string(i);
    if (i == 12000) path = "/v/s/long/" + std::string(1200000, 'x');
    lines.push_back(Line(kEventCreate, path));
    expected.push_back("[02] " + path);
  }
  auto tree = Build(lines);
  const Processed out = Process(*tree);
  EXPECT_EQ(out.ops, expected);
  EXPECT_TRUE(log_.Lines().empty());
}

TEST_F(BuildTest, CrashMarkerStopsReadingAndAsksForFullReindex) {
  auto tree = Build({Line(kEventCreate, "/v/s/a"), Line(kEventQueueCrash, "/v/s"), "not json",
                     Line(kEventCreate, "/v/s/b")});
  EXPECT_TRUE(tree->IsCrashed());
  EXPECT_THAT(log_.Lines(), IsEmpty());  // the malformed line was never read
  std::vector<std::shared_ptr<OP>> handed;
  EXPECT_EQ(tree->ProcessOP([&](std::shared_ptr<OP> op) { handed.push_back(op); }), 1u);
  ASSERT_EQ(handed.size(), 1u);
  EXPECT_EQ(handed[0]->op_, kOPFullReindex);
  EXPECT_EQ(handed[0]->node_, tree->Root());
  EXPECT_TRUE(handed[0]->path_.empty());
  EXPECT_TRUE(handed[0]->data_.isNull());
  EXPECT_EQ(Print(handed[0]), "[07] ");
  EXPECT_EQ(log_.Matching("Queue crashed: " + tree->QueuePath()).size(), 1u);
  EXPECT_EQ(tree->Ops().size(), 1u);  // the create before the marker is still in the tree
  tree.reset();  // the full reindex outlives its tree
  EXPECT_EQ(handed[0]->node_->GetPath(), "");
  // A marker with other bits is folded first.
  tree = Build({Line(kEventQueueCrash | kEventCreate, "/v/s/a"), Line(kEventCreate, "/v/s/b")});
  EXPECT_TRUE(tree->IsCrashed());
  EXPECT_EQ(tree->Ops().size(), 1u);
}

TEST_F(BuildTest, OnlyCanonicalFullPathsResolve) {
  auto tree = Build({});
  for (const char* path : {"", "/", "//", "a/b", "/a//b", "/a/", "a", "//a"}) {
    try {
      tree->GetNodeByPath(path);
      ADD_FAILURE() << "resolved " << path;
    } catch (const Error& error) {
      EXPECT_EQ(error.code, kErrorUnexpected);
      EXPECT_EQ(error.reason, std::string("GetNodeByPath failed, path=") + path);
    }
  }
  EXPECT_THAT(log_.Lines(), IsEmpty());
  // Nodes made on the way remain: /a and /a/b, created once.
  ASSERT_EQ(tree->Root()->Children().size(), 1u);
  const auto a = tree->Root()->Children()[0];
  EXPECT_EQ(a->name_, "a");
  ASSERT_EQ(a->Children().size(), 1u);
  EXPECT_EQ(a->Children()[0]->name_, "b");
  EXPECT_EQ(tree->GetNodeByPath("/a/b"), a->Children()[0]);
  EXPECT_EQ(tree->GetNodeByPath("/a/b")->GetPath(), "/a/b");
  EXPECT_EQ(tree->Root()->GetPath(), "");
  EXPECT_TRUE(tree->Ops().empty());
}

TEST_F(BuildTest, EventForRootIsRejectedAndNextLinesGoOn) {
  auto tree = Build({Line(kEventCreate, "/"), Line(kEventCreate, "/v/s/a/b"), Line(kEventCreate, "/v/s/a")});
  EXPECT_THAT(Process(*tree).ops, ElementsAre("[02] /v/s/a/b", "[02] /v/s/a"));
  EXPECT_EQ(log_.Matching("(BuildTree) InsertEvent failed, event_raw=" + Line(kEventCreate, "/") +
                          ", code=9999, reason=GetNodeByPath failed, path=/")
                .size(),
            1u);
  EXPECT_EQ(tree->GetNodeByPath("/v/s")->Children().size(), 1u);
}

TEST_F(BuildTest, ManyChildrenResolveToTheSameNodesInCreationOrder) {
  std::vector<std::string> lines;
  for (int i = 999; i >= 0; --i) lines.push_back(Line(kEventCreate, "/v/s/d/n" + std::to_string(i)));
  for (int i = 0; i < 1000; ++i) lines.push_back(Line(kEventModify, "/v/s/d/n" + std::to_string(i)));
  auto tree = Build(lines);
  const Processed out = Process(*tree);
  EXPECT_EQ(out.count, 1000u);
  EXPECT_EQ(out.ops.front(), "[02] /v/s/d/n999");
  std::vector<std::shared_ptr<OP>> first, second;  // processing twice hands out the same OPs
  EXPECT_EQ(tree->ProcessOP([&](std::shared_ptr<OP> op) { first.push_back(op); }), 1000u);
  EXPECT_EQ(tree->ProcessOP([&](std::shared_ptr<OP> op) { second.push_back(op); }), 1000u);
  EXPECT_EQ(first, second);
  const auto& children = tree->GetNodeByPath("/v/s/d")->Children();
  ASSERT_EQ(children.size(), 1000u);
  for (int i = 0; i < 1000; ++i) EXPECT_EQ(children[i]->name_, "n" + std::to_string(999 - i));
}

TEST_F(BuildTest, PathsResolveToTheSameNodesAcrossManyFolders) {
  std::vector<std::string> paths;
  for (int i = 0; i < 3000; ++i) {
    paths.push_back("/v/s/d" + std::to_string(i % 700) + "/e" + std::to_string(i % 3) + "/f" + std::to_string(i));
  }
  std::vector<std::string> lines;
  for (const std::string& path : paths) lines.push_back(Line(kEventCreate, path));
  for (const std::string& path : paths) lines.push_back(Line(kEventDelete, path));
  auto tree = Build(lines);
  const Processed out = Process(*tree);
  ASSERT_EQ(out.ops.size(), paths.size());
  EXPECT_EQ(out.count, paths.size());
  for (size_t i = 0; i < paths.size(); ++i) {
    EXPECT_EQ(out.ops[i], "[01] " + paths[i]);
    // The same node as a walk by name from the root finds.
    const auto by_name = tree->Root()->GetChild("v")->GetChild("s")->GetChild("d" + std::to_string(i % 700));
    EXPECT_EQ(tree->GetNodeByPath(paths[i]), by_name->GetChild("e" + std::to_string(i % 3))->GetChild(
                                                 "f" + std::to_string(i)));
  }
  EXPECT_EQ(tree->GetNodeByPath("/v/s")->Children().size(), 700u);
}

TEST_F(BuildTest, PrintedForms) {
  auto tree = Build({Line(kEventRename, "/v/s/b", false, "/v/s/a"), Line(kEventModify, "/v/s/b"),
                     CfgLine("/v/s/c", R"({"audio":true})"), Line(kEventCreate, "/v/t/x"), Line(kEventReindex, "/v/t")});
  std::ostringstream out;
  out << tree->GetNodeByPath("/v/s/b");
  EXPECT_EQ(out.str(), "Node[b]: \n  [05] /v/s/a -> /v/s/b\n  [02] /v/s/b\n");
  std::ostringstream cfg;
  cfg << tree->Ops()[2];
  EXPECT_EQ(cfg.str(), R"([04] /v/s/c, data={"audio":true})");
  // Cancelled OPs print too, and the fill character stays '0'.
  std::ostringstream fill;
  fill << tree->GetNodeByPath("/v/t/x") << std::setw(4) << 7;
  EXPECT_EQ(fill.str(), "Node[x]: \n  [00] /v/t/x\n0007");
  EXPECT_EQ(fill.fill(), '0');
}

}  // namespace
}  // namespace queue_testing
}  // namespace fileindex
}  // namespace corvlumex
