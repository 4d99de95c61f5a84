#include "platform/memory.h"

#include <sys/mman.h>

#include <cerrno>
#include <cstdint>

namespace platform {

void prefer_large_pages(void *block, std::size_t size) {
  constexpr std::size_t large_page = 2 * 1024 * 1024;
  const std::size_t lead =
      -reinterpret_cast<std::uintptr_t>(block) % large_page;  // up to the first large page
  if (size < lead + large_page) return;
  const int saved = errno;
  madvise(static_cast<char *>(block) + lead, (size - lead) / large_page * large_page, MADV_HUGEPAGE);
  errno = saved;
}

}  // namespace platform
