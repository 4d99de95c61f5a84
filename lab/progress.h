// A line that says how far long work has come, for who waits at a terminal.
//
// It is on standard error, is rewritten some times a second, and is gone when the work is done, when
// anything else is said, and when SIGINT or SIGTERM ends the process. Work has none in its first two seconds,
// in the background, or where standard error is no terminal.

#ifndef TARVELCTL_LAB_PROGRESS_H
#define TARVELCTL_LAB_PROGRESS_H

#include "common/text/output.h"

namespace lab {

// Work under way, one at a time.
class progress {
 public:
  progress();
  ~progress();

  // Says where the work under way is, if there is any and it is time to say so again; at most 39 columns.
  template <format::text F, class... Args>
  static void tell(const Args &...args) {
    if (!is_due()) return;
    format::print_to<F>(diagnostics, args...);
    keep_until_next();
  }

 private:
  static bool is_due();
  static void keep_until_next();
};

}  // namespace lab

#endif
