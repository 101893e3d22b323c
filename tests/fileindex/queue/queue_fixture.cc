#include "tests/fileindex/queue/queue_fixture.h"

#include <sstream>

namespace corvlumex {
namespace fileindex {
namespace queue_testing {

std::string CfgLine(const std::string& path, const std::string& data_json) {
  return "{\"event\":131072,\"path\":\"" + path + "\",\"data\":" + data_json + "}";
}

std::string QueueTest::WriteQueue(const std::vector<std::string>& lines, const std::string& name) {
  std::string content;
  for (const std::string& line : lines) content += line + "\n";
  return sandbox_.WriteFile(name, content);
}

std::shared_ptr<OPTree> QueueTest::Build(const std::vector<std::string>& lines) {
  return std::make_shared<OPTree>(WriteQueue(lines));
}

std::string Print(const std::shared_ptr<OP>& op) {
  std::ostringstream out;
  out << op;
  return out.str();
}

Processed Process(OPTree& tree) {
  Processed processed;
  processed.count = tree.ProcessOP([&](std::shared_ptr<OP> op) { processed.ops.push_back(Print(op)); });
  return processed;
}

}  // namespace queue_testing
}  // namespace fileindex
}  // namespace corvlumex
