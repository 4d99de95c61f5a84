// Waiting for moments that do not drift, and the signals that must not come in between.

#ifndef TARVELCTL_LAB_CLOCK_H
#define TARVELCTL_LAB_CLOCK_H

#include <signal.h>

#include <cstdint>
#include <initializer_list>

namespace lab {

// Milliseconds on a clock that no one sets.
std::int64_t monotonic_milliseconds();

sigset_t set_of(std::initializer_list<int> signals);

// The signals that end what goes on by itself, SIGINT and SIGTERM, which it blocks.
sigset_t block_stop_signals();

// Blocks the signal that a limit on the size of files sends: what the limit stops is then a write that fails.
void hold_file_size_signal();

// Waits until the clock is at `due`. Returns true, earlier, where one of the signals in `stop`, which must be
// blocked, arrives.
bool stopped_before(std::int64_t due, const sigset_t &stop);

}  // namespace lab

#endif
