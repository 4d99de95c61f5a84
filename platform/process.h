// The per-process information query.

#ifndef TARVELCTL_PLATFORM_PROCESS_H
#define TARVELCTL_PLATFORM_PROCESS_H

#include <cstddef>

namespace platform {

// Width of a process's short name, its terminating NUL included.
inline constexpr std::size_t process_name_size = 16;

// Stores the short name of process `pid` in `name`: at most 15 bytes, whatever they are, then a NUL.
// Returns false, with `name` untouched, when there is no such process, when it may not be queried, and for
// ids of 0 and below.
bool query_process_name(int pid, char (&name)[process_name_size]);

}  // namespace platform

#endif
