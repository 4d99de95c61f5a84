// What the tests of single pieces share.

#ifndef TARVELCTL_TESTS_UNITS_UNITS_H
#define TARVELCTL_TESTS_UNITS_UNITS_H

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/mman.h>
#include <unistd.h>

#include <cerrno>
#include <climits>
#include <cstring>
#include <fstream>
#include <random>
#include <sstream>
#include <string>

#include "common/text/output.h"

using namespace std::string_literals;

// Lets an output write into memory. Belongs to one test; the next one attaches the output anew.
struct capture {
  explicit capture(output &to) : from(to) { from.attach(fd); }
  ~capture() { from.close(); }

  // What has left the output's buffer, and all that was printed so far.
  std::string written() const {
    char text[1 << 20];
    return {text, static_cast<std::size_t>(pread(fd, text, sizeof text, 0))};
  }
  std::string text() const {
    from.flush();
    return written();
  }

  output &from;
  const int fd = memfd_create("capture", MFD_CLOEXEC);
};

// Whether the product finds anything below /proc.
inline bool has_proc = true;

#endif
