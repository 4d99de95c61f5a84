// capture.txt, which makes a capture of a directory: "key: value" lines. The first line with a key counts.

#ifndef TARVELCTL_COMMON_CAPTURE_NOTE_H
#define TARVELCTL_COMMON_CAPTURE_NOTE_H

#include <cstdint>
#include <optional>
#include <string>

// The note of a capture, from whoever made it: its texts are foreign_text, and empty where it does not say.
struct capture_note {
  static constexpr char file_name[] = "capture.txt";
  static constexpr char known_format[] = "1";
  static constexpr char redacted_host[] = "redacted";

  std::string format;
  std::string time;                   // of the first moment
  std::optional<std::int64_t> began;  // the same in milliseconds since 1970, where it is a time since then
  std::string host;                   // the machine's name, or redacted_host
  bool is_redacted = false;

  // Reads the note in an open directory: no link, no pipe, no more than its first 4096 bytes. Returns 0, or
  // an error number: ENOENT where there is none.
  int read(int directory);

  // Whether its format is the known one; says on standard error, of the note at this path, if not.
  bool is_understood(const std::string &path) const;
};

#endif
