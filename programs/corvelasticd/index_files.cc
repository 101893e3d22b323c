#include "programs/corvelasticd/index_files.h"

#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>

#include "common/file_util.h"
#include "platform/file_ops.h"
#include "programs/corvelasticd/daemon_error.h"
#include "programs/corvelasticd/index_store.h"

namespace corvlumex {
namespace elasticd {
namespace {

const char* const kSuffixes[] = {"", "-wal", "-shm"};

bool Exists(const std::string& path) {
  struct stat info;
  const bool exists = lstat(path.c_str(), &info) == 0;
  errno = 0;
  return exists;
}

}  // namespace

bool MakeDirectories(const std::string& path) {
  size_t pos = 0;
  while (pos != std::string::npos) {
    pos = path.find('/', pos + 1);
    const std::string partial = path.substr(0, pos);
    if (partial.empty()) continue;
    if (mkdir(partial.c_str(), 0755) != 0 && errno != EEXIST) return false;
  }
  errno = 0;
  struct stat info;
  return stat(path.c_str(), &info) == 0 && S_ISDIR(info.st_mode);
}

void MoveIndexFiles(const std::string& from_directory, const std::string& to_directory) {
  if (!MakeDirectories(to_directory)) {
    throw DaemonError(kCodeIndexPath, "Cannot create the index directory " + to_directory + ": " + strerror(errno));
  }
  const std::string from = IndexStore::DatabasePath(from_directory);
  const std::string to = IndexStore::DatabasePath(to_directory);
  if (Exists(to)) {
    // A share renamed or moved to another volume carries its database (it
    // lives in the share's own metadata folder) to the new place before the
    // index is told: the database already there is this index's, adopt it.
    if (!Exists(from)) {
      rmdir(from_directory.c_str());
      errno = 0;
      return;
    }
    throw DaemonError(kCodeIndexExists, "An index database already exists at " + to);
  }
  for (const char* suffix : kSuffixes) {
    const std::string source = from + suffix;
    const std::string target = to + suffix;
    if (!Exists(source)) continue;
    if (rename(source.c_str(), target.c_str()) == 0) continue;
    if (errno != EXDEV || !CPFile(source, target) || !Unlink(source)) {
      throw DaemonError(kCodeIndexPath, "Cannot move " + source + " to " + target + ": " + strerror(errno));
    }
  }
  rmdir(from_directory.c_str());  // only when empty; the directory may hold other things
  errno = 0;
}

void RemoveIndexFiles(const std::string& directory) {
  const std::string database = IndexStore::DatabasePath(directory);
  for (const char* suffix : kSuffixes) {
    const std::string path = database + suffix;
    if (unlink(path.c_str()) != 0 && errno != ENOENT) {
      throw DaemonError(kCodeIndexPath, "Cannot remove " + path + ": " + strerror(errno));
    }
  }
  rmdir(directory.c_str());
  errno = 0;
}

}  // namespace elasticd
}  // namespace corvlumex
