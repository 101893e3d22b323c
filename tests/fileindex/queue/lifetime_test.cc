// Releasing a tree frees it; an OP a caller holds keeps its path.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <thread>
#include <vector>

#include "common/log.h"
#include "tests/fileindex/queue/queue_fixture.h"

namespace corvlumex {
namespace fileindex {
namespace queue_testing {
namespace {

using LifetimeTest = QueueTest;

// An OP held past its tree keeps its node chain only; letting it go frees
// the rest, renamed nodes included.
TEST_F(LifetimeTest, HeldOPKeepsItsNodeChainOnlyAndReleasingFreesAll) {
  auto tree = Build({Line(kEventCreate, "/v/s/a/x"), Line(kEventCreate, "/v/s/a/y"), Line(kEventCreate, "/v/t"),
                     Line(kEventRename, "/v/s/b", true, "/v/s/a")});
  std::shared_ptr<OP> held;
  tree->ProcessOP([&](std::shared_ptr<OP> op) {
    if (!held) held = op;
  });
  std::weak_ptr<OPNode> root = tree->Root();
  std::weak_ptr<OPNode> sibling = tree->GetNodeByPath("/v/s/b/y");
  std::weak_ptr<OPNode> other = tree->GetNodeByPath("/v/t");
  std::weak_ptr<OP> other_op = tree->Ops().back();
  tree.reset();
  EXPECT_TRUE(sibling.expired());
  EXPECT_TRUE(other.expired());
  EXPECT_TRUE(other_op.expired());
  EXPECT_EQ(held->node_->GetPath(), "/v/s/b/x");
  EXPECT_EQ(Print(held), "[02] /v/s/b/x");
  held.reset();
  EXPECT_TRUE(root.expired());
}

TEST_F(LifetimeTest, VeryDeepPathsBuildAndReleaseWithoutRecursion) {
  std::string deep = "/v";
  for (int i = 0; i < 100000; ++i) deep += "/d";
  auto tree = Build({Line(kEventCreate, deep), Line(kEventDelete, "/v", true),
                     Line(kEventRename, "/w", true, "/v/d/d")});
  std::shared_ptr<OP> held = tree->Ops().front();
  tree.reset();
  EXPECT_EQ(held->node_->GetPath().size(), deep.size());
  held.reset();  // the last owner of a 100,000-node chain
}

TEST_F(LifetimeTest, OPsHeldPastTheTreeStayWholeAndMayBeLetGoOnAnyThread) {
  // Enough lines for the tree's memory to span several blocks.
  std::vector<std::string> lines;
  for (int i = 0; i < 40000; ++i) lines.push_back(Line(kEventCreate, "/v/s/d" + std::to_string(i % 97) + "/f" + std::to_string(i)));
  auto tree = Build(lines);
  std::vector<std::shared_ptr<OP>> held;
  tree->ProcessOP([&](std::shared_ptr<OP> op) { held.push_back(op); });
  tree.reset();
  ASSERT_EQ(held.size(), lines.size());
  EXPECT_EQ(Print(held.front()), "[02] /v/s/d0/f0");
  EXPECT_EQ(Print(held.back()), "[02] /v/s/d" + std::to_string(39999 % 97) + "/f39999");
  std::vector<std::thread> threads;
  for (int t = 0; t < 4; ++t) {
    threads.emplace_back([&held, t] {
      for (size_t i = t; i < held.size(); i += 4) held[i].reset();
    });
  }
  for (std::thread& thread : threads) thread.join();
}

TEST_F(LifetimeTest, NamesOfAnyLengthAndNodesMadeOutsideATree) {
  const std::string long_name(5000, 'n');
  auto tree = Build({Line(kEventCreate, "/v/" + long_name + "/x")});
  EXPECT_EQ(tree->Ops().front()->node_->GetPath(), "/v/" + long_name + "/x");
  // A child asked of a tree's node directly is the one paths resolve to.
  auto made = tree->GetNodeByPath("/v")->GetChild("fresh");
  EXPECT_EQ(tree->GetNodeByPath("/v/fresh"), made);
  tree.reset();
  EXPECT_EQ(made->GetPath(), "/v/fresh");

  // A node made on its own keeps a name of its own. (Its children would
  // own it back, and no tree would break that cycle, so none are made here.)
  auto root = std::make_shared<OPNode>(nullptr, "");
  auto loose = std::make_shared<OPNode>(root, "a name longer than any short string");
  EXPECT_EQ(loose->name_, "a name longer than any short string");
  EXPECT_EQ(loose->GetPath(), "/a name longer than any short string");
  OPNode unshared(nullptr, "");  // not owned by a shared_ptr: cannot hand out children
  EXPECT_THROW(unshared.GetChild("x"), std::bad_weak_ptr);
  EXPECT_TRUE(unshared.Children().empty());
}

TEST_F(LifetimeTest, FailedConstructionLeavesNothingBehind) {
  // Not an Error: leaves the constructor, which must still free what it built.
  const std::string path = WriteQueue({Line(kEventCreate, "/v/s/a"), Line(kEventCreate, "/v/s/b")});
  struct Throwing {};
  log_level = 7;
  corvlumex::SetLogSink([](int, const std::string& line) {
    if (line.find("/v/s/b") != std::string::npos) throw Throwing();
  });
  EXPECT_THROW(OPTree tree(path), Throwing);
  corvlumex::SetLogSink(nullptr);
}

}  // namespace
}  // namespace queue_testing
}  // namespace fileindex
}  // namespace corvlumex
