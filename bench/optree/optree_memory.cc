// Peak memory of a tree built from a queue file, per pending path.
//   optree_memory QUEUE_FILE
// Prints the peak resident size grown by the build (getrusage), the heap in
// use after it (mallinfo2), and the counts they are divided by.
#include <malloc.h>
#include <sys/resource.h>

#include <cstdio>
#include <memory>
#include <unordered_set>

#include "common/error.h"
#include "common/log.h"
#include "fileindex/optree.h"

using corvlumex::fileindex::OP;
using corvlumex::fileindex::OPNode;
using corvlumex::fileindex::OPTree;

namespace {

long PeakRssKiB() {
  rusage usage{};
  getrusage(RUSAGE_SELF, &usage);
  return usage.ru_maxrss;
}

}  // namespace

int main(int argc, char** argv) {
  if (argc != 2) {
    fprintf(stderr, "usage: %s QUEUE_FILE\n", argv[0]);
    return 2;
  }
  corvlumex::fileindex::log_level = 6;
  const long rss_before = PeakRssKiB();
  const size_t heap_before = mallinfo2().uordblks;
  std::shared_ptr<OPTree> tree;
  try {
    tree = std::make_shared<OPTree>(argv[1]);
  } catch (const corvlumex::Error& error) {
    fprintf(stderr, "%s\n", error.what());
    return 1;
  }
  const long rss_peak = PeakRssKiB();
  const size_t heap_after = mallinfo2().uordblks;

  size_t nodes = 0;
  OPTree::TraverseNodeDescendant(tree->Root(), [&](std::shared_ptr<OPNode>) { ++nodes; }, true);
  std::unordered_set<const OPNode*> pending_paths;
  size_t live_ops = 0;
  tree->ProcessOP([&](std::shared_ptr<OP> op) {
    ++live_ops;
    pending_paths.insert(op->node_.get());
  });
  const double grown = static_cast<double>(rss_peak - rss_before) * 1024;
  const double heap = static_cast<double>(heap_after - heap_before);
  printf("ops (with cancelled) %zu, live ops %zu, pending paths %zu, nodes %zu\n", tree->Ops().size(), live_ops,
         pending_paths.size(), nodes);
  printf("peak RSS grown by the build: %.1f MiB; heap in use after it: %.1f MiB\n", grown / 1048576, heap / 1048576);
  printf("bytes per pending path: %.0f (peak RSS), %.0f (heap)\n", grown / pending_paths.size(),
         heap / pending_paths.size());
  printf("bytes per node: %.0f (peak RSS), %.0f (heap)\n", grown / nodes, heap / nodes);
  return 0;
}
