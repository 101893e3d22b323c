#include "bench/optree/queue_gen.h"

#include <fstream>
#include <random>
#include <stdexcept>

#include "fileindex/queue/event.h"
#include "tests/support/queue_line.h"

namespace corvlumex {
namespace fileindex {
namespace bench {
namespace {

const char* const kFolderWords[] = {"projects", "Photos",  "2023",    "clients", "archive", "reports", "Q3",
                                    "drafts",   "scans",   "invoices", "raw",    "export",  "meeting notes", "src"};
const char* const kExtensions[] = {".jpg", ".pdf", ".docx", ".xlsx", ".txt", ".mp4", ".png", ".cc", ".md"};

// Folders form a tree by parent index, so renaming one renames everything below.
struct Folder {
  int parent;  // -1 for the share root
  std::string name;
};

class Model {
 public:
  explicit Model(uint32_t seed) : random_(seed) { folders_.push_back({-1, "/volume1/share"}); }

  std::string FolderPath(int index) const {
    std::string path;
    for (int at = index; at >= 0; at = folders_[at].parent) path.insert(0, (at == 0 ? "" : "/") + folders_[at].name);
    return path;
  }
  size_t Depth(int index) const {
    size_t depth = 0;
    for (int at = index; at > 0; at = folders_[at].parent) ++depth;
    return depth;
  }
  unsigned Roll(unsigned below) { return std::uniform_int_distribution<unsigned>(0, below - 1)(random_); }
  // Recent folders are busier, as during a copy or a working session.
  int PickFolder() {
    const size_t n = folders_.size();
    if (n > 64 && Roll(4) != 0) return static_cast<int>(n - 1 - Roll(64));
    return static_cast<int>(Roll(static_cast<unsigned>(n)));
  }
  size_t PickFile() {
    const size_t n = files_.size();
    if (n > 256 && Roll(4) != 0) return n - 1 - Roll(256);
    return Roll(static_cast<unsigned>(n));
  }
  std::string NewName(bool folder) {
    std::string name = kFolderWords[Roll(sizeof(kFolderWords) / sizeof(*kFolderWords))];
    name += "_" + std::to_string(serial_++);
    if (!folder) {
      name = (Roll(2) ? "IMG_2023" : "document ") + name;
      name += kExtensions[Roll(sizeof(kExtensions) / sizeof(*kExtensions))];
    }
    return name;
  }

  std::vector<Folder> folders_;
  std::vector<std::pair<int, std::string>> files_;  // folder index, name
  std::mt19937 random_;
  uint64_t serial_ = 0;
};

}  // namespace

std::string QueueLine(unsigned mask, const std::string& path, bool is_dir, const std::string& path_old) {
  return queue_testing::Line(mask, path, is_dir, path_old);
}

std::vector<std::string> GenerateQueue(size_t count, uint32_t seed, const QueueMix& mix) {
  Model model(seed);
  std::vector<std::string> lines;
  lines.reserve(count);
  while (lines.size() < count) {
    unsigned roll = model.Roll(100);
    const bool have_files = !model.files_.empty();
    auto take = [&roll](unsigned share) {
      if (roll < share) return true;
      roll -= share;
      return false;
    };
    if (have_files && take(mix.modify)) {
      const auto& file = model.files_[model.PickFile()];
      lines.push_back(QueueLine(kEventModify, model.FolderPath(file.first) + "/" + file.second));
    } else if (have_files && take(mix.attr)) {
      const auto& file = model.files_[model.PickFile()];
      lines.push_back(QueueLine(kEventAttr, model.FolderPath(file.first) + "/" + file.second));
    } else if (have_files && take(mix.delete_file)) {
      const size_t at = model.PickFile();
      lines.push_back(QueueLine(kEventDelete, model.FolderPath(model.files_[at].first) + "/" + model.files_[at].second));
      model.files_[at] = model.files_.back();
      model.files_.pop_back();
    } else if (take(mix.folder_create)) {
      int parent = model.PickFolder();
      while (model.Depth(parent) >= 9) parent = model.folders_[parent].parent;
      model.folders_.push_back({parent, model.NewName(true)});
      lines.push_back(QueueLine(kEventCreate, model.FolderPath(static_cast<int>(model.folders_.size() - 1)), true));
    } else if (have_files && take(mix.rename_file)) {
      auto& file = model.files_[model.PickFile()];
      const std::string old_path = model.FolderPath(file.first) + "/" + file.second;
      if (model.Roll(2)) file.first = model.PickFolder();
      file.second = model.NewName(false);
      lines.push_back(QueueLine(kEventRename, model.FolderPath(file.first) + "/" + file.second, false, old_path));
    } else if (model.folders_.size() > 1 && take(mix.rename_folder)) {
      // Like every other change, mostly in the folders in use lately (the
      // "New folder" that gets its name), sometimes anywhere.
      int at = model.PickFolder();
      if (at == 0) at = 1;
      const std::string old_path = model.FolderPath(at);
      model.folders_[at].name = model.NewName(true);
      lines.push_back(QueueLine(kEventRename, model.FolderPath(at), true, old_path));
    } else if (model.folders_.size() > 1 && take(mix.delete_folder)) {
      // The folder stays in the model (a later create may reuse the path);
      // the event itself is what matters to the tree.
      int at = model.PickFolder();
      if (at == 0) at = 1;
      lines.push_back(QueueLine(kEventDelete, model.FolderPath(at), true));
    } else if (take(mix.update_cfg)) {
      lines.push_back("{\"data\":{\"audio\":false,\"document\":true,\"photo\":true,\"video\":false},\"event\":131072,"
                      "\"path\":\"" + model.FolderPath(model.PickFolder()) + "\"}");
    } else {
      const int folder = model.PickFolder();
      model.files_.emplace_back(folder, model.NewName(false));
      lines.push_back(QueueLine(kEventCreate, model.FolderPath(folder) + "/" + model.files_.back().second));
    }
  }
  return lines;
}

void WriteQueueFile(const std::string& path, const std::vector<std::string>& lines) {
  std::ofstream out(path, std::ios::binary | std::ios::trunc);
  for (const std::string& line : lines) out << line << '\n';
  if (!out) throw std::runtime_error("cannot write " + path);
}

}  // namespace bench
}  // namespace fileindex
}  // namespace corvlumex
