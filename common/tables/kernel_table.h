// Reading a kernel table: one snapshot of a named kernel variable.

#ifndef TARVELCTL_COMMON_TABLES_KERNEL_TABLE_H
#define TARVELCTL_COMMON_TABLES_KERNEL_TABLE_H

#include <cstddef>
#include <memory>
#include <span>

#include "common/text/memory.h"

// Reads the kernel variable `name` into a new buffer of exactly the size that the kernel answers.
//
// On success stores in `*buffer` a block of the C allocator, which the caller owns, and in `*length` the
// number of valid bytes in it, which may be fewer than the buffer has, even none where the table has shrunk.
// An empty table is a null buffer and length 0. `new_value` and `new_length` are handed to every kernel call
// as they are: null and 0 for a plain read.
//
// A table that grows between the size query and the read (ENOMEM) is asked for again, up to the 11th such
// failure. Returns 0; 12 (ENOMEM) when the buffer cannot be allocated; otherwise the error number of the
// failing call. On failure the buffer is null and standard error has "sysctl for len failed, %s\n", "sysctl
// malloc failed\n" or "sysctl for buf failed, %s\n".
int sysctl_fetch(const char *name, void **buffer, std::size_t *length, const void *new_value,
                 std::size_t new_length);

// A fetched table, released with its owner.
class kernel_table {
 public:
  // Replaces what is held by a fresh snapshot of `name`. Returns the result of sysctl_fetch; the table is
  // empty after a failure.
  int fetch(const char *name);
  // The same, without a line on standard error.
  int fetch_quietly(const char *name);

  bool empty() const { return length_ == 0; }
  std::size_t size() const { return length_; }
  std::span<const std::byte> bytes() const { return {buffer_.get(), length_}; }

 private:
  int hold(int error, void *buffer, std::size_t length);

  std::unique_ptr<std::byte, c_free> buffer_;
  std::size_t length_ = 0;
};

#endif
