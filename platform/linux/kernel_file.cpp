#include "platform/linux/kernel_file.h"

#include <fcntl.h>
#include <limits.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>

namespace platform {

namespace {

// Why a file of this mode cannot stand for a kernel variable, as an error number, or 0.
int unfit(mode_t mode) {
  if (S_ISREG(mode)) return 0;
  return S_ISDIR(mode) ? EISDIR : EINVAL;
}

}  // namespace

kernel_file::kernel_file(std::string_view path) {
  const char *root = secure_getenv("TARVEL_ROOT");
  char full[PATH_MAX];
  const int length = std::snprintf(full, sizeof full, "%s/proc/%.*s", root ? root : "",
                                   static_cast<int>(path.size()), path.data());
  if (static_cast<std::size_t>(length) >= sizeof full) {
    errno = ENAMETOOLONG;
    return;
  }
  // O_NONBLOCK: opening a pipe that has no writer would wait for one.
  const int fd = open(full, O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY);
  if (fd < 0) return;
  struct stat status {};  // what cannot say what it is, is nothing fit
  fstat(fd, &status);
  if (const int error = unfit(status.st_mode)) {
    close(fd);
    errno = error;
    return;
  }
  fd_ = fd;
  stated_size_ = static_cast<std::size_t>(status.st_size);
}

kernel_file::~kernel_file() {
  if (fd_ < 0) return;
  const int saved = errno;
  close(fd_);
  errno = saved;
}

long kernel_file::read(void *to, std::size_t size) {
  std::size_t done = 0;
  while (done < size) {
    const ssize_t got = pread(fd_, static_cast<char *>(to) + done, size - done, offset_);
    if (got == 0) break;
    if (got > 0) {
      done += static_cast<std::size_t>(got);
      offset_ += got;
    } else if (errno != EINTR) {  // GCOVR_EXCL_BR_LINE: only network file systems let signals in
      return -1;
    }
  }
  return static_cast<long>(done);
}

}  // namespace platform
