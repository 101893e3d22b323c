// Creates N empty files in a folder as fast as it can and prints the rate:
// the burst side of bench/corvnotifyd/burst_rate.sh.
#include <fcntl.h>
#include <unistd.h>

#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <string>

int main(int argc, char** argv) {
  if (argc != 3) {
    fprintf(stderr, "usage: make_files DIR COUNT\n");
    return 2;
  }
  const std::string dir = argv[1];
  const long count = atol(argv[2]);
  const auto start = std::chrono::steady_clock::now();
  for (long i = 0; i < count; ++i) {
    const std::string path = dir + "/f" + std::to_string(i);
    const int fd = open(path.c_str(), O_WRONLY | O_CREAT | O_CLOEXEC, 0644);
    if (fd < 0 || close(fd) != 0) {
      perror(path.c_str());
      return 1;
    }
  }
  const double seconds = std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();
  printf("made %ld files in %.3f s: %.0f files/s (%.0f events/s)\n", count, seconds, count / seconds,
         2 * count / seconds);
  return 0;
}
