// What the code under test prints, in the test's own process.

#ifndef TARVELCTL_TESTS_SUPPORT_CAPTURE_H
#define TARVELCTL_TESTS_SUPPORT_CAPTURE_H

#include <pty.h>
#include <sys/mman.h>
#include <unistd.h>

#include <string>

#include "common/text/output.h"

// Lets an output write into memory. Belongs to one test; the next one attaches the output anew.
class capture {
 public:
  explicit capture(output &to) : to_(to), fd_(memfd_create("capture", MFD_CLOEXEC)) { to_.attach(fd_); }
  ~capture() {
    to_.flush();
    close(fd_);
  }
  capture(const capture &) = delete;
  capture &operator=(const capture &) = delete;

  // All that was printed so far.
  std::string text() {
    to_.flush();
    return written();
  }

  // What has left the output's buffer.
  std::string written() const {
    std::string text(static_cast<std::size_t>(lseek(fd_, 0, SEEK_END)), '\0');
    text.resize(static_cast<std::size_t>(pread(fd_, text.data(), text.size(), 0)));
    return text;
  }

 private:
  output &to_;
  int fd_;
};

#endif
