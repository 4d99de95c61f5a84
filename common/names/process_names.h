// The names of processes in one report.

#ifndef TARVELCTL_COMMON_NAMES_PROCESS_NAMES_H
#define TARVELCTL_COMMON_NAMES_PROCESS_NAMES_H

#include <vector>

#include "common/tables/key_index.h"
#include "common/text/print.h"

// Asks for the name of each process once, however many rows it owns: a question costs more than all else in a
// row. It lives as long as one report, in which a process then has one name.
class process_names {
 public:
  using text = format::small_text<32>;

  // `with_pid` as for pid_to_name.
  explicit process_names(bool with_pid) : with_pid_(with_pid) {}

  // What pid_to_name says. Valid until the next call.
  const text &of(int pid);

 private:
  bool with_pid_;
  std::vector<text> texts_;
  key_index by_pid_;
};

#endif
