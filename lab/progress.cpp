#include "lab/progress.h"

#include <signal.h>
#include <unistd.h>

#include "lab/clock.h"

namespace lab {

namespace {

constexpr std::int64_t patience = 2000;  // milliseconds
constexpr std::int64_t pause = 250;

// Wipes what tell() and the terminal's echo of an interrupt have left.
constexpr format::small_text<48> wipe = "\r                                       \r";

std::int64_t next_due = INT64_MAX;

void wipe_and_end(int number) {
  diagnostics.write_at_once(wipe.view());
  signal(number, SIG_DFL);
  raise(number);
}

void wipe_at_signals() {
  for (const int number : {SIGINT, SIGTERM}) {
    struct sigaction action {};
    sigaction(number, nullptr, &action);
    if (action.sa_handler == SIG_DFL) signal(number, wipe_and_end);
  }
}

// The shell's user types there.
bool is_in_background() {
  const pid_t owner = tcgetpgrp(STDERR_FILENO);
  return owner > 0 && owner != getpgrp();
}

}  // namespace

progress::progress() {
  if (diagnostics.is_terminal()) next_due = monotonic_milliseconds() + patience;
}

progress::~progress() {
  next_due = INT64_MAX;
  diagnostics.flush();
}

bool progress::is_due() {
  if (next_due == INT64_MAX || monotonic_milliseconds() < next_due || is_in_background()) return false;
  wipe_at_signals();
  return true;
}

void progress::keep_until_next() {
  format::print_to<"\r">(diagnostics);
  diagnostics.flush();
  // Goes ahead of whatever is said next.
  format::print_to<"%s">(diagnostics, wipe.view());
  next_due = monotonic_milliseconds() + pause;
}

}  // namespace lab
