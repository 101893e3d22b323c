// optree_queue_gen LINES OUTPUT [SEED]: writes a synthetic queue file.
#include <cstdio>
#include <cstdlib>
#include <exception>

#include "bench/optree/queue_gen.h"

int main(int argc, char** argv) {
  if (argc < 3) {
    fprintf(stderr, "usage: %s LINES OUTPUT [SEED]\n", argv[0]);
    return 2;
  }
  char* end = nullptr;
  const unsigned long long lines = strtoull(argv[1], &end, 10);
  if (*end != '\0' || lines == 0) {
    fprintf(stderr, "LINES must be a positive number, got \"%s\"\n", argv[1]);
    return 2;
  }
  const uint32_t seed = argc > 3 ? static_cast<uint32_t>(strtoul(argv[3], nullptr, 10)) : 1;
  try {
    corvlumex::fileindex::bench::WriteQueueFile(argv[2], corvlumex::fileindex::bench::GenerateQueue(lines, seed));
  } catch (const std::exception& error) {
    fprintf(stderr, "%s\n", error.what());
    return 1;
  }
  return 0;
}
