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
#include <vector>

namespace lab {

struct captured_moment {
  std::int64_t offset;  // milliseconds after the first moment
  std::string path;     // its root
};

// Whether a capture may be made in `directory`: there is nothing there, or an empty directory. Like all
// below, returns false after a message on standard error.
bool is_vacant(const std::string &directory);

// Writes capture.txt, which makes a capture of the directory, with the time of its first moment and, unless
// redacted, the name of this machine.
bool write_note(const std::string &directory, time_t taken, bool redacted);

// Where a moment is put together, hidden, and its move to its place when it is complete.
std::string moment_in_progress(const std::string &directory);
bool finish_moment(const std::string &directory, std::int64_t offset);

// Finds the moments of a capture behind the first, in order; what is no moment does not count. There are none
// where the directory is no capture. False where it is one of a format that this program does not know, or
// holds more than files and directories, or directories below those of the tables.
bool find_moments(const std::string &directory, std::vector<captured_moment> &found);

}  // namespace lab

#endif
