// The merge rules, driven through queue files as the daemon uses them.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "tests/fileindex/queue/queue_fixture.h"

namespace corvlumex {
namespace fileindex {
namespace queue_testing {
namespace {

using MergeTest = QueueTest;

const std::string kFile = "/v/s/dir/f.txt";
const std::string kUpsert = "[02] " + kFile;

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
  };
  for (const MergeCase& c : cases) {
    SCOPED_TRACE(c.name);
    const Processed out = Run(c.lines);
    EXPECT_EQ(out.ops, c.ops);
    EXPECT_EQ(out.count, c.count);
  }
}

TEST_F(MergeTest, SettingThatIsNotBooleanFailsTheLineAndKeepsThePendingSettings) {
  const Processed out = Run({CfgLine("/v/s/dir", R"({"photo":true})"), CfgLine("/v/s/dir", R"({"document":"yes"})"),
                             CfgLine("/v/s/dir", R"([true])")});
  EXPECT_THAT(out.ops, ::testing::ElementsAre(R"([04] /v/s/dir, data={"photo":true})"));
  EXPECT_EQ(log_.Matching("InsertEvent failed").size(), 2u);
  EXPECT_EQ(log_.Matching("code=120, reason=Not a string").size(), 1u);
  EXPECT_EQ(log_.Matching("code=120, reason=Not an object").size(), 1u);
}

}  // namespace
}  // namespace queue_testing
}  // namespace fileindex
}  // namespace corvlumex
