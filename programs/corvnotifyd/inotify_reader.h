// The thread that drains the kernel's inotify queue. It does nothing else:
// it never touches the disk and never waits for the event thread, so the
// kernel's small queue (16384 records by default, some 50 ms of a fast copy)
// is emptied as fast as read() allows.
#pragma once

#include <string>
#include <thread>
#include <vector>

#include "programs/corvnotifyd/raw_event_queue.h"

namespace corvlumex {
namespace notifyd {

class InotifyReader {
 public:
  // `inotify_fd` must be non-blocking. `pause_file`, when not empty, is a
  // test hook: while that file exists the reader stops reading (and says so
  // by creating `pause_file` + ".paused"), so a test can fill the kernel queue.
  InotifyReader(int inotify_fd, RawEventQueue* queue, std::string pause_file);
  ~InotifyReader();

  void Start();
  // Reads what the kernel holds already, hands it over, closes the queue and
  // joins the thread.
  void Stop();

 private:
  void Run();
  // Reads until the kernel queue is empty; false on a read error.
  bool Drain();
  void WaitWhilePaused();

  int fd_;
  int wake_fd_;
  RawEventQueue* queue_;
  std::string pause_file_;
  std::vector<char> buffer_;
  std::thread thread_;
};

}  // namespace notifyd
}  // namespace corvlumex
