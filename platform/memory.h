// What a large buffer may ask of the system.

#ifndef TARVELCTL_PLATFORM_MEMORY_H
#define TARVELCTL_PLATFORM_MEMORY_H

#include <cstddef>

namespace platform {

// Hints about a block that is about to be filled. Where the system cannot follow one, the block stays as it
// is.

// Asks for large pages behind the block.
void prefer_large_pages(void *block, std::size_t size);

// Has the memory behind the block at hand now: one call costs less than a page fault for each page.
void provide_pages(void *block, std::size_t size);

}  // namespace platform

#endif
