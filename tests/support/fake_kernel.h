// A kernel that answers by a script, in the place of the real sysctlbyname. One file of a program includes
// it.

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

constexpr auto fails = [](int error) { return kernel_answer{.error = error}; };
constexpr auto needs = [](std::size_t size) { return kernel_answer{.size = size}; };
constexpr auto delivers = [](const std::string &data) { return kernel_answer{0, data.size(), data}; };

// One call as the kernel saw it.
struct kernel_call {
  std::string name;
  bool has_buffer;
  std::size_t length;
  const void *new_value;
  std::size_t new_length;

  bool operator==(const kernel_call &) const = default;
};

inline struct {
  std::vector<kernel_answer> script;  // an answer for each call in turn; a call beyond it fails the test
  std::vector<kernel_call> calls;
} the_kernel;

#endif
