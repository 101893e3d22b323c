// Feeds arbitrary bytes as a queue file through OPTree: building, handing
// out, printing, and releasing the tree while an OP is still held.
#include <sys/mman.h>
#include <unistd.h>

#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <sstream>
#include <string>

#include "common/error.h"
#include "common/log.h"
#include "fileindex/queue/optree.h"

namespace {

using corvlumex::fileindex::OP;
using corvlumex::fileindex::OPTree;

// One in-memory file reused for every input, reached by path like a queue.
int QueueFd() {
  static const int fd = [] {
    const int created = memfd_create("queue", 0);
    if (created < 0) abort();
    return created;
  }();
  return fd;
}

void WriteQueue(const uint8_t* data, size_t size) {
  const int fd = QueueFd();
  if (ftruncate(fd, 0) != 0 || pwrite(fd, data, size, 0) != static_cast<ssize_t>(size)) abort();
}

}  // namespace

extern "C" int LLVMFuzzerInitialize(int*, char***) {
  corvlumex::SetLogSink([](int, const std::string&) {});
  return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  WriteQueue(data, size);
  // Exercise the per-line debug log for half of the inputs.
  corvlumex::fileindex::log_level = (size % 2 == 0) ? 7 : 6;
  const std::string path = "/proc/self/fd/" + std::to_string(QueueFd());
  std::shared_ptr<OP> held;
  {
    auto tree = std::make_shared<OPTree>(path);
    std::ostringstream out;
    const unsigned count = tree->ProcessOP([&](std::shared_ptr<OP> op) {
      out << op << "\n";
      if (!held) held = op;
    });
    if (!tree->IsCrashed() && count != tree->Ops().size()) abort();
    // A second hand-out gives the same OPs.
    size_t again = 0;
    tree->ProcessOP([&](std::shared_ptr<OP>) { ++again; });
    OPTree::TraverseNodeDescendant(tree->Root(), [&](std::shared_ptr<corvlumex::fileindex::OPNode> node) {
      out << node;
    }, false);
  }
  // The tree is gone; the held OP still knows its path.
  if (held) {
    std::ostringstream out;
    out << held;
  }
  return 0;
}
