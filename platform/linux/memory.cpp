#include "platform/memory.h"

#include <sys/mman.h>
#include <unistd.h>

#include <cerrno>
#include <cstdint>

namespace platform {

namespace {

// Advises on the whole pages of a size that lie in the block. errno stays as it is.
void advise(void *block, std::size_t size, std::size_t page, int advice) {
  const std::size_t lead = -reinterpret_cast<std::uintptr_t>(block) % page;  // up to the first of them
  if (size < lead + page) return;
  const int saved = errno;
  madvise(static_cast<char *>(block) + lead, (size - lead) / page * page, advice);
  errno = saved;
}

}  // namespace

void prefer_large_pages(void *block, std::size_t size) {
  advise(block, size, 2 * 1024 * 1024, MADV_HUGEPAGE);
}

void provide_pages(void *block, std::size_t size) {
  advise(block, size, static_cast<std::size_t>(sysconf(_SC_PAGESIZE)), MADV_POPULATE_WRITE);
}

}  // namespace platform
