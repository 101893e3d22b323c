// The client's read of an answer: a slow answer is waited for, but one that
// stops half-way does not hold the caller for ever.
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <unistd.h>

#include <cstdint>
#include <string>

#include "fileindex/elastic/comm.h"

namespace {

// One end of a socket pair as a connection; the test writes the daemon's side.
class PairEnd : public corvdaemon::SockConnection {
 public:
  explicit PairEnd(int fd) { fd_ = fd; }
};

struct Pair {
  int ends[2] = {-1, -1};
  Pair() { EXPECT_EQ(socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends), 0); }
  ~Pair() {
    if (ends[1] >= 0) close(ends[1]);
  }
  void Write(const std::string& bytes) { ASSERT_EQ(write(ends[1], bytes.data(), bytes.size()), ssize_t(bytes.size())); }
};

std::string Length(uint32_t n) { return std::string(reinterpret_cast<const char*>(&n), sizeof(n)); }

TEST(AnswerReadTest, WholeFramesArriveAndHalfFramesFailInsteadOfHanging) {
  struct Case {
    const char* name;
    std::string sent;
    bool close_after;
    bool received;
  } cases[] = {
      {"whole answer", Length(10) + "{\"a\":true}", false, true},
      {"length only, peer still open", Length(38), false, false},
      {"half a body, peer still open", Length(38) + "{\"success\"", false, false},
      {"peer closed before answering", "", true, false},
      {"peer closed half-way", Length(38) + "{", true, false},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    Pair pair;
    PairEnd connection(pair.ends[0]);
    pair.Write(c.sent);
    if (c.close_after) {
      close(pair.ends[1]);
      pair.ends[1] = -1;
    }
    std::string text;
    EXPECT_EQ(connection.Recv(text, 200), c.received);
    if (c.received) {
      EXPECT_EQ(text, "{\"a\":true}");
    }
  }
}

}  // namespace
