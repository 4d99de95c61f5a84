// What a large buffer may ask of the system.

#ifndef TARVELCTL_PLATFORM_MEMORY_H
#define TARVELCTL_PLATFORM_MEMORY_H

#include <cstddef>

namespace platform {

// Asks for large pages behind a block that is about to be filled. Only a hint: the block stays as it is where
// the system has none to give.
void prefer_large_pages(void *block, std::size_t size);

}  // namespace platform

#endif
