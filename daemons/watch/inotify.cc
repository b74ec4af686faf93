#include "watch/inotify.h"

#include <sys/inotify.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

namespace orvex {
namespace watch {

Inotify::Inotify() : fd_(::inotify_init1(IN_NONBLOCK | IN_CLOEXEC)) {}

int Inotify::AddWatch(const std::string& path, uint32_t mask) {
  return ::inotify_add_watch(fd_.get(), path.c_str(), mask);
}

void Inotify::RemoveWatch(int wd) {
  // The kernel may have dropped the watch already (its directory is gone);
  // EINVAL then is expected and harmless.
  const int saved = errno;
  ::inotify_rm_watch(fd_.get(), wd);
  errno = saved;
}

bool Inotify::ReadAvailable(std::vector<InotifyEvent>& out, size_t max_events) {
  // Big enough for many events; each read returns whole events only.
  alignas(struct inotify_event) char buffer[64 * 1024];
  const size_t start = out.size();
  while (out.size() - start < max_events) {
    const ssize_t n = ::read(fd_.get(), buffer, sizeof(buffer));
    if (n < 0 && errno == EINTR) continue;
    if (n < 0 && errno == EAGAIN) {
      errno = 0;
      return true;
    }
    if (n <= 0) return false;
    for (ssize_t at = 0; at < n;) {
      struct inotify_event header;
      std::memcpy(&header, buffer + at, sizeof(header));
      InotifyEvent event;
      event.wd = header.wd;
      event.mask = header.mask;
      event.cookie = header.cookie;
      if (header.len > 0) event.name = buffer + at + sizeof(header);  // NUL-padded
      out.push_back(std::move(event));
      at += static_cast<ssize_t>(sizeof(header) + header.len);
    }
  }
  return true;
}

}  // namespace watch
}  // namespace orvex
