// Synthetic queue files shaped like a busy share: deep folders, file
// creates, modifies, attribute changes and deletes, renames of files and
// folders, folder creates and deletes, and now and then a settings update.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

namespace corvlumex {
namespace fileindex {
namespace bench {

struct QueueMix {
  // Shares out of 100 for each kind of line; the rest are file creates.
  unsigned modify = 22;
  unsigned attr = 10;
  unsigned delete_file = 8;
  unsigned folder_create = 5;
  unsigned rename_file = 5;
  unsigned rename_folder = 1;
  unsigned delete_folder = 1;
  unsigned update_cfg = 1;
};

// `count` queue lines (without "\n") under /volume1/share, reproducible for a seed.
std::vector<std::string> GenerateQueue(size_t count, uint32_t seed = 1, const QueueMix& mix = QueueMix());

// Writes the lines, each followed by "\n".
void WriteQueueFile(const std::string& path, const std::vector<std::string>& lines);

// One queue line in the notifier's form.
std::string QueueLine(unsigned mask, const std::string& path, bool is_dir = false, const std::string& path_old = "");

}  // namespace bench
}  // namespace fileindex
}  // namespace corvlumex
