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
#include <filesystem>
#include <fstream>
#include <random>
#include <sstream>
#include <string>

#include "common/text/output.h"
#include "platform/sysctl.h"

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

namespace fs = std::filesystem;

inline std::ptrdiff_t count_descriptors() {
  sysctlbyname("none", nullptr, nullptr, nullptr, 0);  // which closes a switch
  return std::distance(fs::directory_iterator("/proc/self/fd"), {});
}

// A directory that stands for a machine.
class kernel_files : public testing::Test {
 protected:
  kernel_files() { setenv("TARVEL_ROOT", mkdtemp(root.data()), 1); }
  ~kernel_files() override {
    EXPECT_EQ(count_descriptors(), descriptors);
    unsetenv("TARVEL_ROOT");
    fs::remove_all(root);
  }
  void put(const std::string &path, const std::string &text) const {
    fs::create_directories(fs::path(root + "/proc/" + path).parent_path());
    std::ofstream(root + "/proc/" + path) << text;
  }
  const std::ptrdiff_t descriptors = count_descriptors();
  std::string root = "/tmp/tarvelctl-test-XXXXXX";
};

// Whether the product finds anything below /proc.
inline bool has_proc = true;

#endif
