// generate and simulate: a world in a directory.

#include <algorithm>
#include <cstdlib>
#include <optional>

#include "common/text/output.h"
#include "common/text/text.h"
#include "lab/clock.h"
#include "lab/command_line.h"
#include "lab/progress.h"
#include "lab/simulation.h"

namespace lab {

simulation::simulation(const options &asked, own_directory directory)
    : root_(std::move(directory)),
      state_(make_world(asked, asked.seed)),
      interval_(asked.interval),
      host_(asked.host) {
  state_.incidents = asked.incidents;
  std::uint64_t until = asked.after;
  for (const planned_incident &planned : asked.incidents) {
    if (asked.after) until = std::max(until, planned.begins + asked.after);
  }
  while (state_.elapsed < until) {
    advance(state_, static_cast<std::uint32_t>(std::min<std::uint64_t>(until - state_.elapsed, interval_)));
  }
}

bool simulation::start() {
  return root_.prepare() && root_.remove_processes() && root_.put_host(host_) && root_.publish(state_);
}

bool simulation::keep_moving(const sigset_t &stop) {
  std::int64_t due = monotonic_milliseconds() + interval_;
  for (;;) {
    if (stopped_before(due, stop)) return true;
    // A world too large for the interval skips some, so that its rates stay true.
    const auto late = static_cast<std::uint32_t>((monotonic_milliseconds() - due) / interval_);
    advance(state_, (1 + late) * interval_);
    due += std::int64_t{1 + late} * interval_;
    if (!root_.publish(state_)) return false;
  }
}

int generate(const options &asked) {
  hold_file_size_signal();
  const progress shown;
  return simulation(asked, own_directory::make(asked.directory)).start() ? EXIT_SUCCESS : EXIT_FAILURE;
}

int simulate(const options &asked) {
  const sigset_t stop = block_stop_signals();
  hold_file_size_signal();
  std::optional<progress> shown(std::in_place);
  simulation kernel(asked, own_directory::make(asked.directory));
  if (!kernel.start()) return EXIT_FAILURE;
  shown.reset();
  print<"simulating in %s\n">(foreign_text{asked.directory});
  report.flush();
  return kernel.keep_moving(stop) ? EXIT_SUCCESS : EXIT_FAILURE;
}

}  // namespace lab
