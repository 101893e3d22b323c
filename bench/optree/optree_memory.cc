// Peak memory of a tree built from a queue file, per pending path.
//   optree_memory QUEUE_FILE
// Prints the peak resident size grown by the build (getrusage) and the
// counts it is divided by. (The tree's arena maps its blocks directly, so
// the malloc heap alone would miss most of the tree.)
#include <sys/resource.h>

#include <cstdio>
#include <fstream>
#include <memory>
#include <string>
#include <unordered_set>

#include "common/error.h"
#include "common/log.h"
#include "fileindex/queue/optree.h"

using corvlumex::fileindex::Event;
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
  std::shared_ptr<OPTree> tree;
  try {
    tree = std::make_shared<OPTree>(argv[1]);
  } catch (const corvlumex::Error& error) {
    fprintf(stderr, "%s\n", error.what());
    return 1;
  }
  const long rss_peak = PeakRssKiB();

  size_t nodes = 0;
  OPTree::TraverseNodeDescendant(tree->Root(), [&](std::shared_ptr<OPNode>) { ++nodes; }, true);
  std::unordered_set<const OPNode*> pending_paths;
  size_t live_ops = 0;
  tree->ProcessOP([&](std::shared_ptr<OP> op) {
    ++live_ops;
    pending_paths.insert(op->node_.get());
  });
  // Every distinct path a line names (new and old paths), measured after the build.
  std::unordered_set<std::string> named;
  std::ifstream lines(argv[1]);
  for (std::string line; std::getline(lines, line);) {
    try {
      const Event event(line);
      named.insert(event.path);
      if (!event.path_old.empty()) named.insert(event.path_old);
    } catch (const corvlumex::Error&) {
    }
  }
  const double grown = static_cast<double>(rss_peak - rss_before) * 1024;
  printf("ops (with cancelled) %zu, live ops %zu, pending paths %zu, nodes %zu\n", tree->Ops().size(), live_ops,
         pending_paths.size(), nodes);
  printf("peak RSS grown by the build: %.1f MiB\n", grown / 1048576);
  printf("bytes per path named by the queue (%zu): %.0f\n", named.size(), grown / named.size());
  printf("bytes per path with a live OP: %.0f\n", grown / pending_paths.size());
  printf("bytes per node: %.0f\n", grown / nodes);
  return 0;
}
