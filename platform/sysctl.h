// Named kernel variables, for systems whose C library lacks them.

#ifndef TARVELCTL_PLATFORM_SYSCTL_H
#define TARVELCTL_PLATFORM_SYSCTL_H

#include <cstddef>

extern "C" {

// Reads the kernel variable `name`, such as "kern.tarvel.stats.flow".
//
// Without a buffer (`old_value` null) stores in `*old_length` the number of bytes that the variable holds
// now. With one, `*old_length` is its size on entry and the number of bytes delivered on success; nothing is
// ever written past it. Without `old_length` nothing is stored; the result tells whether there is such a
// variable.
//
// Each call is a snapshot of its own: the variable may grow, shrink or vanish in between. Only a buffer of
// one byte, as for a switch, has another rule, so that a listing can ask at every row: where the call before
// was the same read, this one looks no name up. It delivers what the variable holds now, but need not notice
// that the variable has grown, vanished or been replaced by another of its name since.
//
// Returns 0, or -1 with the reason in errno:
//   ENOENT   there is no such variable
//   EACCES   the caller may not read it
//   EISDIR   the name stands for a group of variables
//   ENOMEM   the buffer is too small for the data; what it holds is then undefined
//   EPERM    a new value was given: variables can only be read here; or another kernel is looked at, and this
//            variable is the live one's
// and whatever else reading it can fail with. An interrupted read goes on by itself.
int sysctlbyname(const char *name, void *old_value, std::size_t *old_length, const void *new_value,
                 std::size_t new_length);

}  // extern "C"

#endif
