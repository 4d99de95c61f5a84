// Files that stand for the kernel's own, on Linux.
//
// The environment variable TARVEL_ROOT puts a directory in front of every path, so that a simulated or
// captured kernel can be looked at, whoever made it: below it no link is followed, nothing but a regular file
// is opened, and no file of the live kernel. Once it is set, and not empty, nothing falls back to the live
// machine. It is ignored where the process runs with more rights than its caller.

#ifndef TARVELCTL_PLATFORM_LINUX_KERNEL_FILE_H
#define TARVELCTL_PLATFORM_LINUX_KERNEL_FILE_H

#include <sys/types.h>

#include <cstddef>
#include <string_view>

namespace platform {

// An open kernel file, closed when it goes out of scope.
class kernel_file {
 public:
  // Opens "/proc/" + `path` below the root for reading. Only regular files count: a directory is EISDIR, and
  // a device or a pipe, which might block or never end, is EINVAL. Below a root that is given, a link is
  // ELOOP or, on the way to the file, ENOTDIR, and what is part of a real /proc is EPERM.
  explicit kernel_file(std::string_view path);
  ~kernel_file();
  kernel_file(const kernel_file &) = delete;
  kernel_file &operator=(const kernel_file &) = delete;

  // False when opening failed; errno says why.
  bool is_open() const { return fd_ >= 0; }

  // The size that the file system states: 0 for the files of a real /proc, whose size is what a read
  // delivers.
  std::size_t stated_size() const { return stated_size_; }

  // Reads on until `size` bytes are there or the file ends. Returns the number read, or -1 with errno set,
  // also where no file is open.
  long read(void *to, std::size_t size);

  // Lets the next read begin at the front again, where the kernel then says what holds now.
  void rewind() { offset_ = 0; }

 private:
  int fd_ = -1;
  off_t offset_ = 0;
  std::size_t stated_size_ = 0;
};

}  // namespace platform

#endif
