// A kernel that answers by a script. Linking fake_kernel.cpp puts it in the place of the real sysctlbyname.

#ifndef TARVELCTL_TESTS_SUPPORT_FAKE_KERNEL_H
#define TARVELCTL_TESTS_SUPPORT_FAKE_KERNEL_H

#include <cstddef>
#include <string>
#include <vector>

// One answer: an error, the size of a table, or its data.
struct kernel_answer {
  int error = 0;
  std::size_t size = 0;
  std::string data{};
};

inline kernel_answer fails(int error) {
  return {.error = error};
}
inline kernel_answer needs(std::size_t size) {
  return {.size = size};
}
inline kernel_answer delivers(const std::string &data) {
  return {.size = data.size(), .data = data};
}

// One call as the kernel saw it.
struct kernel_call {
  std::string name;
  bool has_buffer;
  std::size_t length;
  const void *new_value;
  std::size_t new_length;
};

struct fake_kernel {
  std::vector<kernel_answer> script;  // an answer for each call in turn; a call beyond it fails the test
  std::vector<kernel_call> calls;
};

extern fake_kernel the_kernel;

#endif
