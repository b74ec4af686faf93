// Inotify: one inotify instance, its watches and its events, read without
// blocking. Move-only (it owns the descriptor). One thread at a time.
#ifndef ORVEX_DAEMONS_WATCH_INOTIFY_H_
#define ORVEX_DAEMONS_WATCH_INOTIFY_H_

#include <cstdint>
#include <string>
#include <vector>

#include "orvex/portable/file_descriptor.h"

namespace orvex {
namespace watch {

// One event as the kernel reported it; name is empty for events on the
// watched directory itself.
struct InotifyEvent {
  int wd = -1;
  uint32_t mask = 0;
  uint32_t cookie = 0;
  std::string name;
};

class Inotify {
 public:
  // Opens the instance (non-blocking, close-on-exec); valid() tells whether
  // that worked, errno says why not.
  Inotify();

  bool valid() const { return fd_.valid(); }
  int fd() const { return fd_.get(); }

  // inotify_add_watch: the watch descriptor, or -1 with errno set (ENOSPC
  // when the watch limit is reached). Adding a watch to a directory already
  // watched returns its existing descriptor.
  int AddWatch(const std::string& path, uint32_t mask);
  void RemoveWatch(int wd);

  // Appends the events queued now, up to about max_events, to out. Returns
  // false with errno set when the read fails for another reason than an
  // empty queue.
  bool ReadAvailable(std::vector<InotifyEvent>& out, size_t max_events);

 private:
  FileDescriptor fd_;
};

}  // namespace watch
}  // namespace orvex

#endif  // ORVEX_DAEMONS_WATCH_INOTIFY_H_
