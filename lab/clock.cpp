#include "lab/clock.h"

#include <time.h>

namespace lab {

std::int64_t monotonic_milliseconds() {
  timespec now;
  clock_gettime(CLOCK_MONOTONIC, &now);
  return now.tv_sec * std::int64_t{1000} + now.tv_nsec / 1'000'000;
}

sigset_t set_of(std::initializer_list<int> signals) {
  sigset_t set;
  sigemptyset(&set);
  for (const int signal : signals) sigaddset(&set, signal);
  return set;
}

sigset_t block_stop_signals() {
  const sigset_t stop = set_of({SIGINT, SIGTERM});
  sigprocmask(SIG_BLOCK, &stop, nullptr);
  return stop;
}

void hold_file_size_signal() {
  const sigset_t file_size = set_of({SIGXFSZ});
  sigprocmask(SIG_BLOCK, &file_size, nullptr);
}

bool stopped_before(std::int64_t due, const sigset_t &stop) {
  for (;;) {
    const std::int64_t wait = due - monotonic_milliseconds();
    const timespec timeout{.tv_sec = wait > 0 ? wait / 1000 : 0,
                           .tv_nsec = wait > 0 ? wait % 1000 * 1'000'000 : 0};
    if (sigtimedwait(&stop, nullptr, &timeout) > 0) return true;
    if (monotonic_milliseconds() >= due) return false;
  }
}

}  // namespace lab
