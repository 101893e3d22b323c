// The files of one index database on disk: creating its directory, moving
// it to a new directory, removing it.
#pragma once

#include <string>

namespace corvlumex {
namespace elasticd {

// mkdir -p; true when `path` is a directory afterwards.
bool MakeDirectories(const std::string& path);
// Moves the database (and a leftover -wal / -shm) from one index directory
// to another, copying across file systems. Throws DaemonError kCodeIndexPath.
void MoveIndexFiles(const std::string& from_directory, const std::string& to_directory);
// Removes the database files, and the directory when that leaves it empty.
void RemoveIndexFiles(const std::string& directory);

}  // namespace elasticd
}  // namespace corvlumex
