#include "platform/memory.h"

#include <sys/mman.h>

#include <cerrno>
#include <cstdint>

namespace platform {

void prefer_large_pages(void *block, std::size_t size) {
  constexpr std::uintptr_t large_page = 2 * 1024 * 1024;
  const auto begin = (reinterpret_cast<std::uintptr_t>(block) + large_page - 1) & ~(large_page - 1);
  const auto end = (reinterpret_cast<std::uintptr_t>(block) + size) & ~(large_page - 1);
  if (begin >= end) return;
  const int saved = errno;
  madvise(reinterpret_cast<void *>(begin), end - begin, MADV_HUGEPAGE);
  errno = saved;
}

}  // namespace platform
