// How a capture lies on disk:
//
//   capture.txt               "key: value" lines: format, time, host, redacted
//   proc/...                  the first moment
//   moments/SECONDS/proc/...  each later one, taken so many seconds after the first, such as 1.000
//
// Each moment is complete, so that any of them, and the capture itself, can be looked at as a root_directory.

#ifndef TARVELCTL_LAB_CAPTURE_DIRECTORY_H
#define TARVELCTL_LAB_CAPTURE_DIRECTORY_H

#include <time.h>

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include "lab/own_directory.h"

namespace lab {

struct captured_moment {
  std::int64_t offset;  // milliseconds after the first moment
  std::string path;     // its root
};

// What a directory has of a capture: nothing where it is none.
struct captured {
  bool is_capture = false;
  std::string host;
  std::string time;                    // of the first moment
  std::vector<captured_moment> later;  // behind the first, in order
};

// Makes a directory for a capture, for its owner only. It may be there where it is empty. Like all below,
// says on standard error what fails.
own_directory make_vacant(const std::string &path);

// Writes capture.txt, which makes a capture of the directory, with the time of its first moment and, unless
// redacted, the name of this machine.
bool write_note(const own_directory &top, time_t taken, bool redacted);

// Where a moment is put together, hidden, and its move to its place when it is complete, or its end.
own_directory moment_in_progress(const own_directory &top);
bool finish_moment(const own_directory &top, std::int64_t offset);
void drop_moment(const own_directory &top);

// Whether the kernel in sight is that of a redacted capture, as a note says that the caller owns.
bool shows_redacted_capture();

// Whether the file of this node is large but for holes, below a root that was given: it would fill the
// memory.
bool is_mostly_holes(std::string_view node);

// Finds what there is of a capture; what is no moment does not count. False where the capture is one of a
// format that this program does not know. False also where someone else might change what a reader sees, or
// sent what would change it: where the capture, or else the kernel, holds more than files and directories, or
// directories below those of the tables, or files that are nothing but large.
bool look_into(const own_directory &top, captured &found);

}  // namespace lab

#endif
