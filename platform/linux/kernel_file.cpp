#include "platform/linux/kernel_file.h"

#include <fcntl.h>
#include <limits.h>
#include <linux/magic.h>
#include <linux/openat2.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/vfs.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>

namespace platform {

namespace {

// O_NONBLOCK: opening a pipe that has no writer would wait for one.
constexpr int to_read = O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY;
constexpr int to_look_at = O_PATH | O_CLOEXEC;

// Leaves errno as it is.
void release(int fd) {
  const int saved = errno;
  close(fd);
  errno = saved;
}

// Why a file of this mode cannot stand for a kernel variable, as an error number, or 0.
int unfit(mode_t mode) {
  if (S_ISREG(mode)) return 0;
  if (S_ISLNK(mode)) return ELOOP;
  return S_ISDIR(mode) ? EISDIR : EINVAL;
}

// Finds the file without opening it, which may make a device act. A link may lead to the root, whose length
// is given, but below it none is followed: who made the tree has no say in what else is read.
int locate(char *full, std::size_t root_length) {
  open_how how{};
  how.flags = to_look_at;
  how.resolve = RESOLVE_NO_SYMLINKS;
  const long found = syscall(SYS_openat2, AT_FDCWD, full, &how, sizeof how);
  if (found >= 0 || errno == ENOENT) return static_cast<int>(found);
  // There is a link somewhere, or the system is too old to tell: one step after the other.
  full[root_length] = '\0';
  int place = open(full, to_look_at | O_DIRECTORY);
  for (char *slash = full + root_length; place >= 0 && slash;) {
    char *const name = slash + 1;
    *slash = '/';
    slash = std::strchr(name, '/');
    if (slash) *slash = '\0';
    const int next = openat(place, name, to_look_at | O_NOFOLLOW | (slash ? O_DIRECTORY : 0));
    release(place);
    place = next;
  }
  return place;
}

// Opens a file below a root that was given: a regular one, which is none of the live kernel's.
int open_below(char *full, std::size_t root_length) {
  const int found = locate(full, root_length);
  if (found < 0) return -1;
  struct stat status {};
  struct statfs system {};
  fstat(found, &status);
  fstatfs(found, &system);
  int fd = -1;
  errno = system.f_type == PROC_SUPER_MAGIC ? EPERM : unfit(status.st_mode);
  if (!errno) {
    char same[32];
    std::snprintf(same, sizeof same, "/proc/self/fd/%d", found);
    fd = open(same, to_read);
    // Where there is no /proc, nothing better is left than to find the file once more.
    if (fd < 0 && errno == ENOENT) fd = open(full, to_read | O_NOFOLLOW);
  }
  release(found);
  return fd;
}

}  // namespace

kernel_file::kernel_file(std::string_view path) {
  const char *given = secure_getenv("TARVEL_ROOT");
  const std::string_view root = given ? given : "";
  char full[PATH_MAX];
  const int length = std::snprintf(full, sizeof full, "%s/proc/%.*s", root.data(),
                                   static_cast<int>(path.size()), path.data());
  if (static_cast<std::size_t>(length) >= sizeof full) {
    errno = ENAMETOOLONG;
    return;
  }
  const int fd = root.empty() ? open(full, to_read) : open_below(full, root.size());
  if (fd < 0) return;
  struct stat status {};  // what cannot say what it is, is nothing fit
  fstat(fd, &status);
  if (const int error = unfit(status.st_mode)) {
    errno = error;
    release(fd);
    return;
  }
  fd_ = fd;
  stated_size_ = static_cast<std::size_t>(status.st_size);
}

kernel_file::~kernel_file() {
  if (fd_ >= 0) release(fd_);
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
