// Builds trees from queue files written into a private temp dir, and
// renders what ProcessOP hands out in the printed form of OPs.
#pragma once

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

class QueueTest {
 public:
  QueueTest();
  // Writes `lines` (each followed by "\n") as a queue file; returns its path.
  std::string WriteQueue(const std::vector<std::string>& lines, const std::string& name = "queue");
  std::string WriteRaw(const std::string& content, const std::string& name = "queue");
  std::shared_ptr<OPTree> Build(const std::vector<std::string>& lines);

  testing_support::Sandbox sandbox_{false};
};

// Printed forms of the OPs ProcessOP hands out, and the count it returns.
struct Processed {
  std::vector<std::string> ops;
  unsigned count = 0;
};
Processed Process(OPTree& tree);
std::string Print(const std::shared_ptr<OP>& op);

}  // namespace queue_testing
}  // namespace fileindex
}  // namespace corvlumex
