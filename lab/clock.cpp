#include "lab/clock.h"

#include <time.h>

namespace lab {

std::int64_t monotonic_milliseconds() {
  timespec now;
  clock_gettime(CLOCK_MONOTONIC, &now);
  return now.tv_sec * std::int64_t{1000} + now.tv_nsec / 1'000'000;
}

sigset_t block_stop_signals() {
  sigset_t stop;
  sigemptyset(&stop);
  sigaddset(&stop, SIGINT);
  sigaddset(&stop, SIGTERM);
  sigprocmask(SIG_BLOCK, &stop, nullptr);
  return stop;
}

void hold_file_size_signal() {
  sigset_t file_size;
  sigemptyset(&file_size);
  sigaddset(&file_size, SIGXFSZ);
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
