// generate and simulate: a world in a directory.

#include <signal.h>
#include <time.h>

#include <cstdio>
#include <cstdlib>

#include "lab/command_line.h"
#include "lab/root_directory.h"
#include "lab/simulation.h"

namespace lab {

namespace {

std::int64_t monotonic_milliseconds() {
  timespec now;
  clock_gettime(CLOCK_MONOTONIC, &now);
  return now.tv_sec * std::int64_t{1000} + now.tv_nsec / 1'000'000;
}

}  // namespace

int generate(const options &asked) {
  root_directory root(asked.directory);
  const bool made =
      root.prepare(0777) && root.remove_processes() && root.publish(make_world(asked.size, asked.seed));
  return made ? EXIT_SUCCESS : EXIT_FAILURE;
}

bool keep_moving(world &state, root_directory &root, std::uint32_t interval, const sigset_t &stop) {
  std::int64_t due = monotonic_milliseconds() + interval;
  for (;;) {
    const std::int64_t wait = std::max<std::int64_t>(due - monotonic_milliseconds(), 0);
    const timespec timeout{.tv_sec = wait / 1000, .tv_nsec = wait % 1000 * 1'000'000};
    if (sigtimedwait(&stop, nullptr, &timeout) > 0) return true;
    // A world too large for the interval skips some, so that its rates stay true.
    const auto late = static_cast<std::uint32_t>((monotonic_milliseconds() - due) / interval);
    advance(state, (1 + late) * interval);
    due += std::int64_t{1 + late} * interval;
    if (!root.publish(state)) return false;
  }
}

int simulate(const options &asked) {
  sigset_t stop;
  sigemptyset(&stop);
  sigaddset(&stop, SIGINT);
  sigaddset(&stop, SIGTERM);
  sigprocmask(SIG_BLOCK, &stop, nullptr);

  root_directory root(asked.directory);
  world state = make_world(asked.size, asked.seed);
  if (!root.prepare(0777) || !root.remove_processes() || !root.publish(state)) return EXIT_FAILURE;
  std::printf("simulating in %s\n", asked.directory.c_str());
  std::fflush(stdout);
  return keep_moving(state, root, asked.interval, stop) ? EXIT_SUCCESS : EXIT_FAILURE;
}

}  // namespace lab
