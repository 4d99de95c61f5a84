// Allocation that does not fail.

#ifndef TARVELCTL_COMMON_MEMORY_H
#define TARVELCTL_COMMON_MEMORY_H

#include <cstddef>
#include <cstdlib>
#include <memory>

// Returns a new block of `size` bytes, to be released with free(), never null. Where there is no memory the
// process ends with "malloc failed" (no line end) on standard error and status 255.
void *xmalloc(std::size_t size);

// Returns `block`, or a new block where it is null, resized to `size` bytes, never null. Where there is no
// memory the process ends with "realloc failed" (no line end) on standard error and status 255.
void *xrealloc(void *block, std::size_t size);

// Makes operator new end the process as xmalloc does. Called once at the start of a program.
void make_new_fail_fast();

// Releases a block of the C allocator.
struct c_free {
  void operator()(void *block) const { std::free(block); }
};

#endif
