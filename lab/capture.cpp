// capture: the kernel in sight, as a directory to look at elsewhere, at one moment or at several.

#include <time.h>

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <optional>
#include <unordered_set>
#include <utility>
#include <vector>

#include "common/captured.h"
#include "common/tables/kernel_table.h"
#include "common/tables/table_walk.h"
#include "common/text/output.h"
#include "common/text/text.h"
#include "lab/capture_directory.h"
#include "lab/clock.h"
#include "lab/command_line.h"
#include "lab/progress.h"
#include "lab/redacted_tables.h"
#include "lab/root_directory.h"
#include "lab/tables.h"
#include "platform/process.h"
#include "platform/sysctl.h"

namespace lab {

namespace {

struct fetched_table {
  const table *source;
  kernel_table content;
};

// What the kernel shows at one moment. It is fetched as a whole before any of it is saved: a slow disk must
// not pull the tables apart.
struct snapshot {
  std::vector<fetched_table> tables;
  std::vector<std::pair<std::int32_t, std::string>> processes;  // in the order in which they are mentioned
};

// Adds the name of each process that a table mentions, whatever its bytes are. Who is gone has none.
void fetch_processes(const fetched_table &fetched, std::unordered_set<std::int32_t> &asked, snapshot &taken) {
  walk_table(*fetched.source->what->record, fetched.content.bytes(), [&](const found_record &found) {
    for (const row &field : found.what->rows) {
      if (field.kind != field_kind::pid) continue;
      for (std::size_t i = 0; i < field.count_in(found.bytes); ++i) {
        const auto pid = static_cast<std::int32_t>(field.at(i).in(found.bytes));
        char name[platform::process_name_size];
        if (asked.insert(pid).second && platform::query_process_name(pid, name)) {
          taken.processes.emplace_back(pid, name);
        }
      }
    }
  });
}

// What has been saved so far.
struct tally {
  std::uint32_t moments = 0;
  std::uint32_t tables = 0;
  std::uint32_t names = 0;
  std::uint64_t bytes = 0;
  bool is_whole = true;  // nothing that was to be saved is missing
  bool kernel_was_gone = false;
};

// Why no table of the kernel in sight can be read, as an error number, or 0.
int kernel_error() {
  int error = 0;
  for (const table &row : tables) {
    std::size_t length = 0;
    if (sysctlbyname(row.what->node, nullptr, &length, nullptr, 0) == 0) return 0;
    error = errno;
  }
  return error;
}

// Says so, once, where the kernel is not there.
bool kernel_is_there(tally &saved) {
  const int error = kernel_error();
  if (error && !saved.kernel_was_gone) complain<"tarvellab: no table can be read: %s\n">(strerror(error));
  saved.kernel_was_gone |= error != 0;
  saved.is_whole &= error == 0;
  return !error;
}

// What the kernel shows now: nothing where it is not there, or goes away meanwhile.
snapshot fetch(tally &saved) {
  snapshot taken;
  if (!kernel_is_there(saved)) return taken;
  for (const table &row : tables) {
    fetched_table fetched{&row, {}};
    if (is_mostly_holes(row.what->node)) {
      complain<"tarvellab: %s is left out: mostly holes\n">(row.what->node);
    } else if (fetched.content.fetch(row.what->node) == 0) {
      taken.tables.push_back(std::move(fetched));
    } else if (kernel_is_there(saved)) {
      complain<"tarvellab: %s is left out\n">(row.what->node);
    } else {
      return {};
    }
  }
  std::unordered_set<std::int32_t> asked;
  for (const fetched_table &fetched : taken.tables) fetch_processes(fetched, asked, taken);
  return taken;
}

// Saves a moment, redacted where there are substitutes.
bool save(const snapshot &taken, own_directory top, substitutes *by, tally &saved) {
  root_directory root(std::move(top));
  if (!root.prepare()) return false;
  tally with = saved;
  for (const auto &[pid, name] : taken.processes) {
    if (!root.put_process(pid, by ? by->process(name) : name)) return false;
    ++with.names;
  }
  for (const fetched_table &fetched : taken.tables) {
    table_file file = root.new_table(fetched.source->what->node);
    if (!by) file.put(fetched.content.bytes());
    if (by && !redact_table(*fetched.source->what, fetched.content.bytes(), *by, file)) {
      complain<"tarvellab: %s is cut: the rest of it cannot be redacted\n">(fetched.source->what->node);
      with.is_whole = false;
    }
    if (!file.commit()) return false;
    ++with.tables;
    with.bytes += file.size();
  }
  ++with.moments;
  saved = with;
  return true;
}

// Waits for a moment that is due, and says so meanwhile. True where a signal in `stop` arrives.
bool stopped_before_moment(std::uint32_t number, std::uint32_t count, std::int64_t due,
                           const sigset_t &stop) {
  for (;;) {
    const std::int64_t now = monotonic_milliseconds();
    progress::tell<"moment %u of %u in %lld s">(number, count, (due - now + 999) / 1000);
    if (stopped_before(std::min(due, now + 1000), stop)) return true;
    if (due <= now + 1000) return false;
  }
}

// Takes the moments behind the first, which was taken at `began`, each at its time on the clock, so that none
// drifts. Those that the machine is too slow for come later, in time with the rest.
void capture_later_moments(const options &asked, const own_directory &top, std::int64_t began,
                           substitutes *by, const sigset_t &stop, tally &saved) {
  std::int64_t due = began;
  for (std::uint32_t taken = 1; taken < asked.count; ++taken) {
    const std::int64_t late = std::max<std::int64_t>(monotonic_milliseconds() - due, 0);
    due += (1 + late / asked.every) * asked.every;
    if (stopped_before_moment(taken + 1, asked.count, due, stop)) return;
    const std::int64_t offset = monotonic_milliseconds() - began;
    const snapshot next = fetch(saved);
    if (next.tables.empty()) continue;
    if (save(next, moment_in_progress(top), by, saved) && finish_moment(top, offset)) continue;
    drop_moment(top);
    return;
  }
}

}  // namespace

int capture(const options &asked) {
  hold_file_size_signal();
  sigset_t stop{};
  if (asked.count > 1) stop = block_stop_signals();
  const bool redacted = asked.redact || shows_redacted_capture();
  const time_t taken = time(nullptr);
  const std::int64_t began = monotonic_milliseconds();
  tally saved;
  substitutes redaction;
  substitutes *const by = asked.redact ? &redaction : nullptr;
  own_directory top;
  bool goes_on = false;
  std::optional<progress> shown(std::in_place);
  {
    const snapshot first = fetch(saved);
    if (first.tables.empty()) return EXIT_FAILURE;
    top = make_vacant(asked.directory);
    if (!top.is_open()) return EXIT_FAILURE;
    goes_on = save(first, top.enter("."), by, saved) && write_note(top, taken, redacted);
  }
  if (!goes_on) top.remove("proc");
  if (goes_on && !redacted) {
    complain<"tarvellab: %s holds addresses and process names; --redact replaces them\n">(
        foreign_text{asked.directory});
  }
  if (goes_on) capture_later_moments(asked, top, began, by, stop, saved);
  shown.reset();
  const std::uint32_t moments = std::max(asked.count, 1U);
  const std::uint64_t expected = saved.moments * tables.size();
  print<"saved in %s: moments %u of %u, tables %u of %llu, names %u, bytes %llu\n">(
      foreign_text{asked.directory}, saved.moments, moments, saved.tables, expected, saved.names,
      saved.bytes);
  report.flush();
  const bool is_all = saved.is_whole && saved.moments == moments && saved.tables == expected;
  return is_all ? EXIT_SUCCESS : EXIT_FAILURE;
}

}  // namespace lab
