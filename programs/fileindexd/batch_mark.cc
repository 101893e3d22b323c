#include "programs/fileindexd/batch_mark.h"

#include <sys/stat.h>

#include <cerrno>
#include <fstream>
#include <sstream>

#include "common/file_util.h"
#include "common/log.h"

namespace corvlumex {
namespace fileindexd {

BatchMark::BatchMark(const std::string& batch_path) : batch_path_(batch_path), mark_path_(batch_path + ".applied") {}

std::string BatchMark::Identity() const {
  struct stat st;
  if (stat(batch_path_.c_str(), &st) != 0) {
    errno = 0;
    return std::string();
  }
  std::ostringstream out;
  out << st.st_ino << ' ' << st.st_size << ' ' << st.st_mtim.tv_sec << '.' << st.st_mtim.tv_nsec;
  return out.str();
}

size_t BatchMark::Load() const {
  std::ifstream in(mark_path_);
  if (!in) {
    errno = 0;
    return 0;
  }
  std::string identity;
  size_t applied = 0;
  if (!std::getline(in, identity) || !(in >> applied)) return 0;
  const std::string now = Identity();
  return !now.empty() && identity == now ? applied : 0;
}

bool BatchMark::Save(size_t applied) const {
  const std::string identity = Identity();
  if (identity.empty()) return false;
  if (!WriteFileAtomically(mark_path_, identity + "\n" + std::to_string(applied) + "\n", 0644)) {
    CORV_LOG("cannot save how far the batch got in %s", mark_path_.c_str());
    return false;
  }
  return true;
}

void BatchMark::Clear() const {
  if (IsFileExist(mark_path_)) Unlink(mark_path_);
}

}  // namespace fileindexd
}  // namespace corvlumex
