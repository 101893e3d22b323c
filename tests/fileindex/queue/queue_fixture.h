// Builds trees from queue files written into a private temp dir, and
// renders what ProcessOP hands out in the printed form of OPs.
#pragma once

#include <gtest/gtest.h>

#include <memory>
#include <string>
#include <vector>

#include "common/log.h"
#include "fileindex/queue/optree.h"
#include "tests/support/log_capture.h"
#include "tests/support/queue_line.h"
#include "tests/support/sandbox.h"

namespace corvlumex {
namespace fileindex {
namespace queue_testing {

std::string CfgLine(const std::string& path, const std::string& data_json);

// Printed forms of the OPs ProcessOP hands out, and the count it returns.
struct Processed {
  std::vector<std::string> ops;
  unsigned count = 0;
};
Processed Process(OPTree& tree);
std::string Print(const std::shared_ptr<OP>& op);

// Logs at info level (no line-by-line debug output) while a test runs.
class QueueTest : public ::testing::Test {
 protected:
  QueueTest() { log_level = 6; }
  ~QueueTest() override { log_level = 7; }
  // Writes `lines` (each followed by "\n") as a queue file; returns its path.
  std::string WriteQueue(const std::vector<std::string>& lines, const std::string& name = "queue");
  std::string WriteRaw(const std::string& content) { return sandbox_.WriteFile("queue", content); }
  std::shared_ptr<OPTree> Build(const std::vector<std::string>& lines);
  Processed Run(const std::vector<std::string>& lines) { return Process(*Build(lines)); }

  testing_support::Sandbox sandbox_{false};
  testing_support::LogCapture log_;
};

// One case of the merge tables: queue lines in, the printed OPs handed out
// and the count ProcessOP returns (the cancelled OPs stay counted).
struct MergeCase {
  const char* name;
  std::vector<std::string> lines;
  std::vector<std::string> ops;
  unsigned count;
};

}  // namespace queue_testing
}  // namespace fileindex
}  // namespace corvlumex
