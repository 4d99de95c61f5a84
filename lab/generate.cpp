// generate and simulate: a world in a directory.

#include <cstdlib>

#include "common/text/output.h"
#include "common/text/text.h"
#include "lab/clock.h"
#include "lab/command_line.h"
#include "lab/root_directory.h"
#include "lab/simulation.h"

namespace lab {

int generate(const options &asked) {
  hold_file_size_signal();
  root_directory root(own_directory::make(asked.directory));
  const bool made =
      root.prepare() && root.remove_processes() && root.publish(make_world(asked.size, asked.seed));
  return made ? EXIT_SUCCESS : EXIT_FAILURE;
}

bool keep_moving(world &state, root_directory &root, std::uint32_t interval, const sigset_t &stop) {
  std::int64_t due = monotonic_milliseconds() + interval;
  for (;;) {
    if (stopped_before(due, stop)) return true;
    // A world too large for the interval skips some, so that its rates stay true.
    const auto late = static_cast<std::uint32_t>((monotonic_milliseconds() - due) / interval);
    advance(state, (1 + late) * interval);
    due += std::int64_t{1 + late} * interval;
    if (!root.publish(state)) return false;
  }
}

int simulate(const options &asked) {
  const sigset_t stop = block_stop_signals();
  hold_file_size_signal();
  root_directory root(own_directory::make(asked.directory));
  world state = make_world(asked.size, asked.seed);
  if (!root.prepare() || !root.remove_processes() || !root.publish(state)) return EXIT_FAILURE;
  print<"simulating in %s\n">(foreign_text{asked.directory});
  report.flush();
  return keep_moving(state, root, asked.interval, stop) ? EXIT_SUCCESS : EXIT_FAILURE;
}

}  // namespace lab
