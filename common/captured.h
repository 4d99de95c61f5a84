// Captures: kernels of other machines, or of other times, as a directory holds them.
//
//   capture.txt               when and where it was taken (capture_note.h)
//   proc/...                  the first moment
//   moments/SECONDS/proc/...  each later one, taken so many seconds after the first, such as 1.000
//
// Each moment is complete, so that any of them can be looked at as a kernel. Whoever made a capture may be a
// stranger: nothing in it is read before look_into() has seen all of it.

#ifndef TARVELCTL_COMMON_CAPTURED_H
#define TARVELCTL_COMMON_CAPTURED_H

#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "common/capture_note.h"
#include "common/moment.h"

// Where the later moments are.
inline constexpr char moments_name[] = "moments";

struct captured_moment {
  std::int64_t offset;  // milliseconds after the first moment
  std::string root;     // the directory that stands for the machine
};

// What a directory has of a capture; of a kernel that is none, one moment and no more to say.
struct captured {
  bool is_capture = false;
  capture_note note;
  std::vector<captured_moment> moments;  // the first, then the later ones in order
};

// Finds what there is in a directory that was named; what is no moment does not count. Nothing, after a
// message on standard error, where the directory is a capture of a format that this program does not know.
// Nothing also where someone else might change what a reader sees, or sent what would change it: where the
// capture, or else the kernel, holds more than files and directories, or directories below those of the
// tables, or files that are nothing but large.
std::optional<captured> look_into(const std::string &directory);

// Reads these tables as they were at a moment of a capture. By the capture's own clock: each table has the
// moment's time, `monotonic` from the first moment on, `wall` where the note says when that was; else it is
// `monotonic`, too. Its host is the note's. Of what is no capture the time is now and the host the kernel's
// own. From here on everything in this process that asks for the kernel in sight gets this one. Nothing is
// read where that cannot be (platform/root.h).
moment read_captured(const captured &of, const captured_moment &which,
                     std::span<const table_description *const> wanted);

// Whether the kernel in sight is that of a redacted capture, as a note says that the caller owns.
bool shows_redacted_capture();

// Whether the file of this node is large but for holes, below a root that was given: it would fill the
// memory.
bool is_mostly_holes(std::string_view node);

// The milliseconds in the name of a later moment, such as "1.000". Nothing for any other form, and beyond
// what any capture lasts. And such a name.
std::optional<std::int64_t> parse_offset(std::string_view name);
std::string name_of_offset(std::int64_t offset);

#endif
