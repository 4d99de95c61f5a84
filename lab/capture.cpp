// capture: the kernel in sight, as a directory to look at elsewhere.

#include <cstdlib>
#include <unordered_set>
#include <vector>

#include "common/kernel_table.h"
#include "common/output.h"
#include "lab/command_line.h"
#include "lab/root_directory.h"
#include "lab/tables.h"
#include "platform/process.h"

namespace lab {

namespace {

// Saves the names of processes that are not in `saved` yet. Who is gone has no name, also not one from an
// earlier capture.
bool save_processes(root_directory &root, const std::vector<std::int32_t> &pids,
                    std::unordered_set<std::int32_t> &saved) {
  for (const std::int32_t pid : pids) {
    if (!saved.insert(pid).second) continue;
    char name[platform::process_name_size];
    if (!platform::query_process_name(pid, name)) {
      root.remove_process(pid);
    } else if (!root.put_process(pid, name)) {
      return false;
    }
  }
  return true;
}

}  // namespace

int capture(const options &asked) {
  root_directory root(asked.directory);
  // Others must not see what a privileged user may read.
  if (!root.prepare(0700)) return EXIT_FAILURE;
  std::unordered_set<std::int32_t> saved;
  bool found = false;
  for (const table &row : tables) {
    kernel_table fetched;
    if (fetched.fetch(row.node)) {
      complain<"tarvellab: %s is left out\n">(row.node);
      root.remove_table(row.node);
      continue;
    }
    found = true;
    if (!root.put_table(row.node, fetched.bytes())) return EXIT_FAILURE;
    std::vector<std::int32_t> pids;
    if (row.mentioned) row.mentioned(fetched.bytes(), pids);
    if (!save_processes(root, pids, saved)) return EXIT_FAILURE;
  }
  return found ? EXIT_SUCCESS : EXIT_FAILURE;
}

}  // namespace lab
