#include "programs/fileindexd/folder_walker.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>

#include "common/log.h"
#include "programs/fileindexd/index_rules.h"

namespace corvlumex {
namespace fileindexd {
using SkipDir = std::function<bool(const std::string&)>;

namespace {

void WalkInto(int dir_fd, const std::string& dir_path, dev_t device, const SkipDir& skip_dir,
              std::vector<DiskEntry>& out) {
  DIR* dir = fdopendir(dir_fd);
  if (dir == nullptr) {
    close(dir_fd);
    return;
  }
  std::vector<std::string> subdirs;
  while (struct dirent* entry = readdir(dir)) {
    const std::string name = entry->d_name;
    if (name == "." || name == ".." || IndexRules::IsExcludedName(name)) continue;
    const std::string path = dir_path + "/" + name;
    bool is_dir = entry->d_type == DT_DIR;
    if (entry->d_type == DT_UNKNOWN) {
      struct stat st;
      if (fstatat(dirfd(dir), entry->d_name, &st, AT_SYMLINK_NOFOLLOW) != 0) continue;
      is_dir = S_ISDIR(st.st_mode);
    }
    out.push_back(DiskEntry{path, is_dir});
    if (is_dir && !(skip_dir && skip_dir(path))) subdirs.push_back(name);
  }
  const int parent_fd = dirfd(dir);
  for (const std::string& name : subdirs) {
    const int fd = openat(parent_fd, name.c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC);
    if (fd < 0) continue;  // vanished or unreadable: its documents stay as they are
    struct stat st;
    if (fstat(fd, &st) != 0 || st.st_dev != device) {
      close(fd);
      continue;
    }
    WalkInto(fd, dir_path + "/" + name, device, skip_dir, out);
  }
  closedir(dir);
  errno = 0;
}

}  // namespace

std::vector<DiskEntry> WalkFolder(const std::string& root, const SkipDir& skip_dir) {
  std::vector<DiskEntry> out;
  struct stat st;
  if (lstat(root.c_str(), &st) != 0) {
    errno = 0;
    return out;
  }
  out.push_back(DiskEntry{root, S_ISDIR(st.st_mode)});
  if (!S_ISDIR(st.st_mode) || (skip_dir && skip_dir(root))) return out;
  const int fd = open(root.c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC);
  if (fd < 0) {
    CORV_LOG("cannot read the folder %s", root.c_str());  // the log line carries errno
    return out;
  }
  WalkInto(fd, root, st.st_dev, skip_dir, out);
  return out;
}

}  // namespace fileindexd
}  // namespace corvlumex
