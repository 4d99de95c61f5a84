// Writing captures, as common/captured.h lays them out.

#ifndef TARVELCTL_LAB_CAPTURE_DIRECTORY_H
#define TARVELCTL_LAB_CAPTURE_DIRECTORY_H

#include <time.h>

#include <cstdint>
#include <string>

#include "common/own_directory.h"

namespace lab {

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

}  // namespace lab

#endif
