// A long batch (a folder's first index is one) must not need the index's size
// twice over on disk: the write-ahead log stays near the step size, and the
// batch's "commit" still reports every key the batch changed.
#include <gtest/gtest.h>
#include <sys/stat.h>

#include <algorithm>
#include <random>
#include <string>

#include "common/json_util.h"
#include "programs/corvelasticd/index_store.h"
#include "tests/support/sandbox.h"

namespace corvlumex {
namespace elasticd {
namespace {

int64_t FileBytes(const std::string& path) {
  struct stat info;
  return stat(path.c_str(), &info) == 0 ? static_cast<int64_t>(info.st_size) : 0;
}

struct Batch {
  int64_t peak_log_bytes = 0;
  size_t committed_keys = 0;
};

// Upserts `documents` documents of ~2 KB of words in one batch, then commits.
Batch IndexOneBatch(const std::string& directory, int documents) {
  Json::Value mappings;
  EXPECT_TRUE(JsonFromString(mappings, R"({"property_id": "CORVMDPath",
    "properties": {"CORVMDPath": {"analyzer": "keyword", "required": true},
                   "CORVMDTextContent": {"type": "text"}}})"));
  std::unique_ptr<IndexStore> store = IndexStore::Create(directory, mappings, Json::Value(Json::objectValue));
  const std::string log = IndexStore::DatabasePath(directory) + "-wal";
  std::mt19937 random(7);
  Batch batch;
  for (int i = 0; i < documents; ++i) {
    std::string text;
    while (text.size() < 2000) text += "w" + std::to_string(random() % 50000) + " ";
    Json::Value document;
    document["CORVMDPath"] = "/share/f" + std::to_string(i);
    document["CORVMDTextContent"] = text;
    store->Upsert(document["CORVMDPath"].asString(), document);
    batch.peak_log_bytes = std::max(batch.peak_log_bytes, FileBytes(log));
  }
  batch.committed_keys = store->Commit().upserted.size();
  batch.peak_log_bytes = std::max(batch.peak_log_bytes, FileBytes(log));
  return batch;
}

TEST(WriteAheadLogTest, ALongBatchKeepsTheLogNearTheStepSize) {
  constexpr int kDocuments = 2500;  // about 5 MB of text: a log of over 8 MB in one transaction
  const struct {
    const char* what;
    WalLimits limits;
    int64_t log_at_least;
    int64_t log_at_most;
  } cases[] = {
      {"one transaction (no step before 1 GB): the workload grows the log", {1ll << 30, 1ll << 30}, 8 << 20, 1ll << 40},
      // Above the step: what FTS5 writes when it merges its segments, inside one step.
      {"steps of 256 KB", {256 << 10, 256 << 10}, 0, 3584 << 10},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.what);
    testing_support::Sandbox root(false);
    IndexStore::SetWalLimits(c.limits);
    const Batch batch = IndexOneBatch(root.MakeDir("index"), kDocuments);
    IndexStore::SetWalLimits(WalLimits());
    EXPECT_GE(batch.peak_log_bytes, c.log_at_least);
    EXPECT_LE(batch.peak_log_bytes, c.log_at_most);
    EXPECT_EQ(batch.committed_keys, static_cast<size_t>(kDocuments)) << "the commit reports every key of the batch";
  }
}

}  // namespace
}  // namespace elasticd
}  // namespace corvlumex
