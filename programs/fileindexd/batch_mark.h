// How far a taken-over queue has been applied and committed. A large batch
// is committed in slices; after each, the number of its operations done is
// saved here, so a retry (a restarted search daemon) or a restart after a
// crash goes on from the last committed slice instead of doing the whole
// batch again. The taken-over queue is never changed and folds into the same
// operations in the same order each time it is read, so a count is enough;
// the file's identity is kept with it so a count never applies to another.
#pragma once

#include <cstddef>
#include <string>

namespace corvlumex {
namespace fileindexd {

class BatchMark {
 public:
  // `batch_path`: the taken-over queue (".tmp"); the mark lives beside it.
  explicit BatchMark(const std::string& batch_path);

  // Operations of the present batch file applied and committed; 0 when
  // there is no mark or it was made for another file.
  size_t Load() const;
  // Atomic replace; false on failure (the batch is then only redone further).
  bool Save(size_t applied) const;
  // Removed before the batch file is, so a mark never outlives its batch.
  void Clear() const;

 private:
  // Inode, size and modification time of the batch file, as text.
  std::string Identity() const;

  std::string batch_path_;
  std::string mark_path_;
};

}  // namespace fileindexd
}  // namespace corvlumex
