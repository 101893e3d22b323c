// The in-memory keys by row: they must say what the committed rows say, or
// say nothing (the search then reads the rows).
#include "programs/corvelasticd/key_directory.h"

#include <gtest/gtest.h>

#include <optional>
#include <string>
#include <vector>

namespace corvlumex {
namespace elasticd {
namespace {

using Keys = std::vector<std::optional<std::string>>;

Keys Look(const KeyDirectory& directory, std::vector<int64_t> rowids, bool* ok = nullptr) {
  Keys keys;
  const bool found = directory.Lookup(directory.generation(), rowids, &keys);
  if (ok != nullptr) *ok = found;
  return keys;
}

void Build(KeyDirectory* directory, const std::vector<std::pair<int64_t, std::string>>& rows) {
  ASSERT_TRUE(directory->TryStartBuild());
  const uint64_t at = directory->generation();
  for (const auto& [rowid, key] : rows) directory->Add(rowid, key);
  directory->FinishBuild(at, true);
}

TEST(KeyDirectoryTest, CommittedInsertsRenamesAndDeletesAreFollowedInOrder) {
  KeyDirectory directory;
  bool ok = true;
  Look(directory, {1}, &ok);
  EXPECT_FALSE(ok) << "not built yet";
  Build(&directory, {{1, "/share/a"}, {2, "/share/b"}, {5, "/share/e"}});
  EXPECT_EQ(Look(directory, {5, 1, 3, 2, 99}), Keys({"/share/e", "/share/a", std::nullopt, "/share/b", std::nullopt}));
  // One transaction: a rename, a delete, the deleted row's number used again, a row far beyond.
  const std::vector<KeyDirectory::Change> changes = {
      {1, std::string("/share/renamed")}, {5, std::nullopt}, {5, std::string("/share/new")}, {70000, std::string("")}, {2, std::nullopt}};
  directory.BeginCommit();
  directory.EndCommit(true, true, changes);
  EXPECT_EQ(Look(directory, {1, 2, 5, 70000}), Keys({"/share/renamed", std::nullopt, "/share/new", ""}));
}

TEST(KeyDirectoryTest, AReaderOfAnotherGenerationIsToldNothing) {
  KeyDirectory directory;
  Build(&directory, {{1, "/share/a"}});
  const uint64_t before = directory.generation();
  directory.BeginCommit();
  Keys keys;
  EXPECT_FALSE(directory.Lookup(directory.generation(), {1}, &keys)) << "a commit is under way";
  directory.EndCommit(true, true, {{1, std::string("/share/b")}});
  EXPECT_FALSE(directory.Lookup(before, {1}, &keys)) << "the reader's snapshot is older than the directory";
  EXPECT_TRUE(directory.Lookup(directory.generation(), {1}, &keys));
  EXPECT_EQ(keys, Keys({"/share/b"}));
}

TEST(KeyDirectoryTest, FailedOrIncompleteCommitsAndBuildsOverACommitLeaveNoDirectory) {
  for (const bool committed : {false, true}) {
    KeyDirectory directory;
    Build(&directory, {{1, "/share/a"}});
    directory.BeginCommit();
    directory.EndCommit(committed, /*complete=*/false, {});
    EXPECT_FALSE(directory.ready());
    bool ok = true;
    Look(directory, {1}, &ok);
    EXPECT_FALSE(ok);
  }
  // A commit while the directory was being built: its scan is of an older snapshot.
  KeyDirectory directory;
  ASSERT_TRUE(directory.TryStartBuild());
  EXPECT_FALSE(directory.TryStartBuild()) << "one builder at a time";
  const uint64_t at = directory.generation();
  directory.Add(1, "/share/a");
  directory.BeginCommit();
  directory.EndCommit(true, true, {{1, std::nullopt}});
  directory.FinishBuild(at, true);
  EXPECT_FALSE(directory.ready());
  Build(&directory, {{1, "/share/b"}});
  EXPECT_EQ(Look(directory, {1}), Keys({"/share/b"}));
}

TEST(KeyDirectoryTest, ManyReplacedKeysAreCompactedWithoutLosingAny) {
  KeyDirectory directory;
  Build(&directory, {});
  std::vector<KeyDirectory::Change> changes;
  const std::string long_name(4000, 'x');
  for (int round = 0; round < 12; ++round) {
    changes.clear();
    for (int64_t row = 0; row < 1000; ++row) changes.emplace_back(row, "/share/" + std::to_string(round) + long_name + std::to_string(row));
    directory.BeginCommit();
    directory.EndCommit(true, true, changes);
  }
  const Keys keys = Look(directory, {0, 999});
  EXPECT_EQ(keys, Keys({"/share/11" + long_name + "0", "/share/11" + long_name + "999"}));
}

}  // namespace
}  // namespace elasticd
}  // namespace corvlumex
