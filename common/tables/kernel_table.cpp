#include "common/tables/kernel_table.h"

#include <algorithm>
#include <cerrno>
#include <cstring>

#include "common/text/output.h"
#include "platform/memory.h"
#include "platform/sysctl.h"

namespace {

// The ENOMEM failure that ends a fetch, counted over size queries and reads together.
constexpr int last_retry = 11;

// Gets memory ready for a table, because a page fault for each page is most of what reading costs.
//
// One half is asked for as large pages, which cost half of what small ones do, but for systems whose idle
// memory goes back to what runs them: there they may cost more. The pages of the other half are provided in
// one call. How much of it is limited, because a size is only what the kernel says.
void prepare(std::byte *block, std::size_t size) {
  constexpr std::size_t mebibyte = 1024 * 1024;
  if (size < mebibyte) return;
  const std::size_t half = size / 2;
  platform::prefer_large_pages(block, half);
  platform::provide_pages(block + half, std::min(half, 64 * mebibyte));
}

// What a fetch failed at.
enum class step : std::uint8_t { size, memory, contents };

// sysctl_fetch without a word.
int fetch(const char *name, void **buffer, std::size_t *length, const void *new_value, std::size_t new_length,
          step &failed) {
  *buffer = nullptr;
  int retries = 0;
  for (;;) {
    failed = step::size;
    if (sysctlbyname(name, nullptr, length, new_value, new_length) != 0) {
      const int error = errno;
      if (error == ENOMEM && ++retries < last_retry) continue;
      return error;
    }
    if (*length == 0) return 0;
    failed = step::memory;
    auto *block = static_cast<std::byte *>(std::malloc(*length));
    if (!block) return ENOMEM;
    prepare(block, *length);
    if (sysctlbyname(name, block, length, new_value, new_length) == 0) {
      *buffer = block;
      return 0;
    }
    const int error = errno;
    std::free(block);
    failed = step::contents;
    if (error == ENOMEM && ++retries < last_retry) continue;
    return error;
  }
}

}  // namespace

int sysctl_fetch(const char *name, void **buffer, std::size_t *length, const void *new_value,
                 std::size_t new_length) {
  step failed{};
  const int error = fetch(name, buffer, length, new_value, new_length, failed);
  if (!error) return 0;
  if (failed == step::size) complain<"sysctl for len failed, %s\n">(strerror(error));
  if (failed == step::memory) complain<"sysctl malloc failed\n">();
  if (failed == step::contents) complain<"sysctl for buf failed, %s\n">(strerror(error));
  return error;
}

int kernel_table::fetch(const char *name) {
  void *buffer = nullptr;
  std::size_t length = 0;
  const int error = sysctl_fetch(name, &buffer, &length, nullptr, 0);
  return hold(error, buffer, length);
}

int kernel_table::fetch_quietly(const char *name) {
  void *buffer = nullptr;
  std::size_t length = 0;
  step failed{};
  const int error = ::fetch(name, &buffer, &length, nullptr, 0, failed);
  return hold(error, buffer, length);
}

int kernel_table::hold(int error, void *buffer, std::size_t length) {
  buffer_.reset(static_cast<std::byte *>(buffer));
  length_ = error ? 0 : length;
  return error;
}
