// What the code under test prints, in the test's own process.

#ifndef TARVELCTL_TESTS_SUPPORT_CAPTURE_H
#define TARVELCTL_TESTS_SUPPORT_CAPTURE_H

#include <pty.h>
#include <sys/mman.h>
#include <unistd.h>

#include <string>

#include "common/output.h"

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

  // All that was written so far.
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

// Lets an output write to a terminal that nobody looks at.
class capture_terminal {
 public:
  explicit capture_terminal(output &to) {
    if (openpty(&reader_, &terminal_, nullptr, nullptr, nullptr) == 0) to.attach(terminal_);
  }
  ~capture_terminal() {
    close(terminal_);
    close(reader_);
  }
  capture_terminal(const capture_terminal &) = delete;
  capture_terminal &operator=(const capture_terminal &) = delete;

 private:
  int reader_ = -1;
  int terminal_ = -1;
};

#endif
