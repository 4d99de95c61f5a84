#include "platform/descriptor.h"

#include <fcntl.h>
#include <unistd.h>

#include <cstdio>

namespace platform {

bool make_writes_nonblocking(int fd) {
  char path[32];
  std::snprintf(path, sizeof path, "/proc/self/fd/%d", fd);
  const int own = open(path, O_WRONLY | O_NONBLOCK | O_NOCTTY | O_CLOEXEC);
  if (own < 0) return false;
  const bool replaced = dup3(own, fd, fcntl(fd, F_GETFD) == FD_CLOEXEC ? O_CLOEXEC : 0) >= 0;
  close(own);
  return replaced;
}

}  // namespace platform
