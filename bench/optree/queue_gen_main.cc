// optree_queue_gen LINES OUTPUT [SEED] [copy]: writes a synthetic queue file.
// "copy" gives the queue of a large copy into the share: new folders and
// files, with the attribute and content changes a copy produces.
#include <cstdio>
#include <cstdlib>
#include <exception>
#include <string>

#include "bench/optree/queue_gen.h"

int main(int argc, char** argv) {
  if (argc < 3) {
    fprintf(stderr, "usage: %s LINES OUTPUT [SEED] [copy]\n", argv[0]);
    return 2;
  }
  char* end = nullptr;
  const unsigned long long lines = strtoull(argv[1], &end, 10);
  if (*end != '\0' || lines == 0) {
    fprintf(stderr, "LINES must be a positive number, got \"%s\"\n", argv[1]);
    return 2;
  }
  const uint32_t seed = argc > 3 ? static_cast<uint32_t>(strtoul(argv[3], nullptr, 10)) : 1;
  corvlumex::fileindex::bench::QueueMix mix;
  if (argc > 4) {
    if (std::string(argv[4]) != "copy") {
      fprintf(stderr, "unknown mix \"%s\" (only \"copy\" is known)\n", argv[4]);
      return 2;
    }
    mix = corvlumex::fileindex::bench::QueueMix{10, 15, 0, 6, 0, 0, 0, 0};
  }
  try {
    corvlumex::fileindex::bench::WriteQueueFile(argv[2], corvlumex::fileindex::bench::GenerateQueue(lines, seed, mix));
  } catch (const std::exception& error) {
    fprintf(stderr, "%s\n", error.what());
    return 1;
  }
  return 0;
}
