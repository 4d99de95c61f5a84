// Allocation that does not fail.

#ifndef TARVELCTL_COMMON_TEXT_MEMORY_H
#define TARVELCTL_COMMON_TEXT_MEMORY_H

#include <cstddef>
#include <cstdlib>
#include <memory>
#include <new>

// Returns a new block of `size` bytes, to be released with free(), never null. Where there is no memory the
// process ends with "malloc failed" (no line end) on standard error and status 255.
void *xmalloc(std::size_t size);

// Returns `block`, or a new block where it is null, resized to `size` bytes, never null. Where there is no
// memory the process ends with "realloc failed" (no line end) on standard error and status 255.
void *xrealloc(void *block, std::size_t size);

// Makes operator new end the process as xmalloc does. Called once at the start of a program.
void make_new_fail_fast();

// End the process as xrealloc does.
[[noreturn]] void end_without_growth();

// What operator new calls instead where there is no memory, as long as the object lives. It ends the process.
class new_failure {
 public:
  explicit new_failure(void (*end)()) : before_(std::set_new_handler(end)) {}
  ~new_failure() { std::set_new_handler(before_); }
  new_failure(const new_failure &) = delete;
  new_failure &operator=(const new_failure &) = delete;

 private:
  std::new_handler before_;
};

// Releases a block of the C allocator.
struct c_free {
  void operator()(void *block) const { std::free(block); }
};

#endif
