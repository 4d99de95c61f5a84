// capture: the kernel in sight, as a directory to look at elsewhere, at one moment or at several.

#include <sys/stat.h>
#include <time.h>

#include <cstdlib>
#include <filesystem>
#include <unordered_set>
#include <utility>
#include <vector>

#include "common/kernel_table.h"
#include "common/output.h"
#include "lab/capture_directory.h"
#include "lab/clock.h"
#include "lab/command_line.h"
#include "lab/redacted_tables.h"
#include "lab/root_directory.h"
#include "lab/tables.h"
#include "platform/process.h"

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

// Who is gone has no name.
void fetch_processes(snapshot &taken) {
  std::vector<std::int32_t> pids;
  for (const fetched_table &fetched : taken.tables) {
    if (fetched.source->mentioned) fetched.source->mentioned(fetched.content.bytes(), pids);
  }
  std::unordered_set<std::int32_t> asked;
  for (const std::int32_t pid : pids) {
    char name[platform::process_name_size];
    if (asked.insert(pid).second && platform::query_process_name(pid, name)) {
      taken.processes.emplace_back(pid, name);
    }
  }
}

snapshot fetch() {
  snapshot taken;
  for (const table &row : tables) {
    fetched_table fetched{&row, {}};
    if (fetched.content.fetch(row.node)) {
      complain<"tarvellab: %s is left out\n">(row.node);
    } else {
      taken.tables.push_back(std::move(fetched));
    }
  }
  fetch_processes(taken);
  return taken;
}

bool save_redacted(root_directory &root, const fetched_table &fetched, substitutes &by) {
  const char *node = fetched.source->node;
  table_file file(root.table_path(node));
  const redaction done = redact_table(node, fetched.content.bytes(), by, file);
  if (done == redaction::unknown) {
    complain<"tarvellab: %s is left out: it is not known how to redact it\n">(node);
    return true;
  }
  if (done == redaction::cut) {
    complain<"tarvellab: %s is cut: the rest of it cannot be redacted\n">(node);
  }
  if (const int error = file.commit()) return complain_about(root.table_path(node), error);
  return true;
}

// Saves a moment below `path`, redacted where there are substitutes.
bool save(const snapshot &taken, const std::string &path, substitutes *by) {
  root_directory root(path);
  if (!root.prepare(0700)) return false;
  for (const auto &[pid, name] : taken.processes) {
    if (!root.put_process(pid, by ? by->process(name) : name)) return false;
  }
  for (const fetched_table &fetched : taken.tables) {
    const bool saved = by ? save_redacted(root, fetched, *by)
                          : root.put_table(fetched.source->node, fetched.content.bytes());
    if (!saved) return false;
  }
  return true;
}

// Takes the moments behind the first, which was taken at `began`, each at its time on the clock, so that none
// drifts. Those that the machine is too slow for come later, in time with the rest.
bool capture_later_moments(const options &asked, std::int64_t began, substitutes *by, const sigset_t &stop) {
  std::int64_t due = began;
  for (std::uint32_t taken = 1; taken < asked.count; ++taken) {
    const std::int64_t late = std::max<std::int64_t>(monotonic_milliseconds() - due, 0);
    due += (1 + late / asked.every) * asked.every;
    if (stopped_before(due, stop)) return true;
    const std::int64_t offset = monotonic_milliseconds() - began;
    const std::string path = moment_in_progress(asked.directory);
    if (save(fetch(), path, by) && finish_moment(asked.directory, offset)) continue;
    std::error_code ignored;
    std::filesystem::remove_all(path, ignored);
    return false;
  }
  return true;
}

}  // namespace

int capture(const options &asked) {
  hold_file_size_signal();
  umask(077);  // others must not see what a privileged user may read
  if (!is_vacant(asked.directory)) return EXIT_FAILURE;
  sigset_t stop{};
  if (asked.count > 1) stop = block_stop_signals();
  const time_t taken = time(nullptr);
  const std::int64_t began = monotonic_milliseconds();
  substitutes redaction;
  substitutes *const by = asked.redact ? &redaction : nullptr;
  {
    const snapshot first = fetch();
    if (first.tables.empty() || !save(first, asked.directory, by)) return EXIT_FAILURE;
  }
  if (!write_note(asked.directory, taken, asked.redact)) return EXIT_FAILURE;
  if (!asked.redact) {
    complain<"tarvellab: %s holds addresses and process names; --redact replaces them\n">(asked.directory);
  }
  return capture_later_moments(asked, began, by, stop) ? EXIT_SUCCESS : EXIT_FAILURE;
}

}  // namespace lab
