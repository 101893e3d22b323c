// Splits a file into lines on "\n" with large reads, the way a line-by-line
// text stream would: an empty line between two "\n" is a line, text after
// the last "\n" is a last line, and nothing follows a final "\n".
#pragma once

#include <string_view>
#include <vector>

namespace corvlumex {
namespace fileindex {

class LineReader {
 public:
  // Takes ownership of the open descriptor `fd` and closes it.
  explicit LineReader(int fd);
  ~LineReader();
  LineReader(const LineReader&) = delete;
  LineReader& operator=(const LineReader&) = delete;

  // The next line without its "\n", valid until the next call. False at the
  // end of the file or after a read failure (a line cut short by the
  // failure is not returned).
  bool Next(std::string_view& line);

 private:
  bool Fill();

  int fd_;
  std::vector<char> buffer_;
  size_t begin_ = 0;  // first unread byte
  size_t end_ = 0;    // one past the last byte read
  bool eof_ = false;
  bool failed_ = false;
};

}  // namespace fileindex
}  // namespace corvlumex
