#include "tests/support/fake_kernel.h"

#include <gtest/gtest.h>

#include <cerrno>
#include <cstring>

#include "platform/sysctl.h"

fake_kernel the_kernel;

extern "C" int sysctlbyname(const char *name, void *old_value, std::size_t *old_length, const void *new_value,
                            std::size_t new_length) {
  const std::size_t turn = the_kernel.calls.size();
  the_kernel.calls.push_back({name, old_value != nullptr, *old_length, new_value, new_length});
  if (turn >= the_kernel.script.size()) {
    ADD_FAILURE() << "call " << turn + 1 << " is not in the script";
    errno = ENOSYS;
    return -1;
  }
  const kernel_answer &answer = the_kernel.script[turn];
  if (answer.error) {
    errno = answer.error;
    return -1;
  }
  if (old_value) {
    EXPECT_LE(answer.data.size(), *old_length);
    std::memcpy(old_value, answer.data.data(), answer.data.size());
  }
  *old_length = answer.size;
  return 0;
}
