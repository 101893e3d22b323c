// The merge rules, driven through queue files as the daemon uses them.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "tests/fileindex/queue/queue_fixture.h"

namespace corvlumex {
namespace fileindex {
namespace queue_testing {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

class MergeTest : public ::testing::Test, public QueueTest {
 protected:
  void SetUp() override { log_level = 6; }
  void TearDown() override { log_level = 7; }
  Processed Run(const std::vector<std::string>& lines) { return Process(*Build(lines)); }
  testing_support::LogCapture log_;
};

const std::string kFile = "/v/s/dir/f.txt";

TEST_F(MergeTest, CreateThenModifyIsOneUpsert) {
  const Processed out = Run({Line(kEventCreate, kFile), Line(kEventModify, kFile)});
  EXPECT_THAT(out.ops, ElementsAre("[02] " + kFile));
  EXPECT_EQ(out.count, 1u);  // the modify appended nothing
}

TEST_F(MergeTest, CreateThenDeleteLeavesOneDelete) {
  const Processed out = Run({Line(kEventCreate, kFile), Line(kEventDelete, kFile)});
  EXPECT_THAT(out.ops, ElementsAre("[01] " + kFile));
  EXPECT_EQ(out.count, 1u);
}

TEST_F(MergeTest, DeleteThenCreateBecomesUpsertButModifyAfterDeleteIsDropped) {
  EXPECT_THAT(Run({Line(kEventDelete, kFile), Line(kEventCreate, kFile)}).ops, ElementsAre("[02] " + kFile));
  EXPECT_THAT(Run({Line(kEventDelete, kFile), Line(kEventModify, kFile)}).ops, ElementsAre("[01] " + kFile));
  EXPECT_THAT(Run({Line(kEventDelete, kFile), Line(kEventAttr, kFile)}).ops, ElementsAre("[01] " + kFile));
}

TEST_F(MergeTest, AttrDeleteCreateIsUpsert) {
  EXPECT_THAT(Run({Line(kEventAttr, kFile), Line(kEventDelete, kFile), Line(kEventCreate, kFile)}).ops,
              ElementsAre("[02] " + kFile));
}

TEST_F(MergeTest, AttrThenModifyBecomesUpsert) {
  EXPECT_THAT(Run({Line(kEventAttr, kFile), Line(kEventAttr, kFile), Line(kEventModify, kFile)}).ops,
              ElementsAre("[02] " + kFile));
}

TEST_F(MergeTest, DirectoryCreateIsReindexAndFileBelowIsKept) {
  const Processed out = Run({Line(kEventCreate, "/v/s/dir", true), Line(kEventCreate, kFile)});
  EXPECT_THAT(out.ops, ElementsAre("[06] /v/s/dir", "[02] " + kFile));
}

TEST_F(MergeTest, ReindexAfterFileEventsCancelsThemButTheyStayCounted) {
  const Processed out = Run({Line(kEventCreate, kFile), Line(kEventReindex, "/v/s/dir")});
  EXPECT_THAT(out.ops, ElementsAre("[06] /v/s/dir"));
  EXPECT_EQ(out.count, 2u);
}

TEST_F(MergeTest, DirectoryDeleteIsReindexToo) {
  const Processed out = Run({Line(kEventModify, kFile), Line(kEventDelete, "/v/s/dir", true)});
  EXPECT_THAT(out.ops, ElementsAre("[06] /v/s/dir"));
}

TEST_F(MergeTest, ReindexKeepsRenamesBelowAndLaterDeletes) {
  const Processed out = Run({Line(kEventRename, "/v/s/dir/b", false, "/v/s/other/b"),
                             Line(kEventUpdateCfg, "/v/s/dir/c"), Line(kEventReindex, "/v/s/dir"),
                             Line(kEventDelete, "/v/s/dir"), Line(kEventCreate, "/v/s/dir")});
  // The reindex cancels the settings below but not the rename; the delete
  // after it is a second OP, and the create, though dropped by the reindex,
  // still turns that delete into an upsert.
  EXPECT_THAT(out.ops, ElementsAre("[05] /v/s/other/b -> /v/s/dir/b", "[06] /v/s/dir", "[02] /v/s/dir"));
  EXPECT_EQ(out.count, 4u);
}

TEST_F(MergeTest, UpdateSettingsMergeWithOr) {
  const Processed out = Run({CfgLine("/v/s/dir", R"({"document":true,"audio":false})"),
                             CfgLine("/v/s/dir", R"({"audio":true})")});
  EXPECT_THAT(out.ops, ElementsAre(R"([04] /v/s/dir, data={"audio":true,"document":true,"photo":false,"video":false})"));
  EXPECT_EQ(out.count, 1u);
}

TEST_F(MergeTest, UpdateSettingsReplacesPendingContentWork) {
  EXPECT_THAT(Run({Line(kEventCreate, "/v/s/dir"), CfgLine("/v/s/dir", R"({"video":true})")}).ops,
              ElementsAre(R"([04] /v/s/dir, data={"video":true})"));
  EXPECT_THAT(Run({CfgLine("/v/s/dir", R"({"video":true})"), Line(kEventDelete, "/v/s/dir")}).ops,
              ElementsAre(R"([04] /v/s/dir, data={"video":true})", "[01] /v/s/dir"));
  EXPECT_THAT(Run({CfgLine("/v/s/dir", R"({"video":true})"), Line(kEventReindex, "/v/s/dir")}).ops,
              ElementsAre("[06] /v/s/dir"));
}

TEST_F(MergeTest, SettingThatIsNotBooleanFailsTheLineAndKeepsThePendingSettings) {
  const Processed out = Run({CfgLine("/v/s/dir", R"({"photo":true})"), CfgLine("/v/s/dir", R"({"document":"yes"})"),
                             CfgLine("/v/s/dir", R"([true])")});
  EXPECT_THAT(out.ops, ElementsAre(R"([04] /v/s/dir, data={"photo":true})"));
  EXPECT_EQ(log_.Matching("InsertEvent failed").size(), 2u);
  EXPECT_EQ(log_.Matching("code=120, reason=Not a string").size(), 1u);
  EXPECT_EQ(log_.Matching("code=120, reason=Not an object").size(), 1u);
}

TEST_F(MergeTest, GarbledPendingSettingsAreReplacedByTheMerge) {
  EXPECT_THAT(Run({CfgLine("/v/s/dir", R"("junk")"), CfgLine("/v/s/dir", R"({"audio":true})")}).ops,
              ElementsAre(R"([04] /v/s/dir, data={"audio":true,"document":false,"photo":false,"video":false})"));
}

TEST_F(MergeTest, TwoMaskBitsShareOneOP) {
  // Create then modify on the same OP: the modify finds the OP itself
  // pending as an upsert and cancels it.
  Processed out = Run({Line(kEventCreate | kEventModify, kFile)});
  EXPECT_THAT(out.ops, IsEmpty());
  EXPECT_EQ(out.count, 1u);
  // Create then rename: the rename changes the kind and appends it again,
  // so it is handed out twice.
  out = Run({Line(kEventCreate | kEventRename, "/v/s/new", false, "/v/s/old")});
  EXPECT_THAT(out.ops, ElementsAre("[05] /v/s/old -> /v/s/new", "[05] /v/s/old -> /v/s/new"));
  EXPECT_EQ(out.count, 2u);
}

TEST_F(MergeTest, UnknownBitsAreIgnored) {
  const Processed out = Run({Line(0x8000000 | kEventCreate, kFile), Line(0x1, kFile)});
  EXPECT_THAT(out.ops, ElementsAre("[02] " + kFile));
  EXPECT_EQ(out.count, 1u);
}

}  // namespace
}  // namespace queue_testing
}  // namespace fileindex
}  // namespace corvlumex
