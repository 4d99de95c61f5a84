#include "common/capture_note.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <charconv>
#include <chrono>
#include <string_view>

#include "common/own_directory.h"
#include "common/text/output.h"
#include "common/text/text.h"

namespace {

constexpr std::size_t note_size = 4096;  // what is read of a note: far more than one has

// Reads the note in a directory from whoever made it: no link, no pipe, no more than its beginning. Returns 0
// or an error number.
int read_text(int directory, std::string &text) {
  const int found = openat(directory, capture_note::file_name, O_PATH | O_CLOEXEC | O_NOFOLLOW);
  if (found < 0) return errno;
  struct stat status {};
  fstat(found, &status);
  const std::string itself = "/proc/self/fd/" + std::to_string(found);
  const int fd = S_ISREG(status.st_mode) ? open(itself.c_str(), O_RDONLY | O_CLOEXEC) : -1;
  close(found);
  if (fd < 0) return EINVAL;
  text.resize(note_size);
  const ssize_t got = read(fd, text.data(), text.size());
  text.resize(static_cast<std::size_t>(std::max<ssize_t>(got, 0)));
  close(fd);
  return 0;
}

// The value behind `key` at the start of a line; empty where there is none.
std::string_view value_of(std::string_view text, std::string_view key) {
  while (!text.empty()) {
    const std::string_view line = text.substr(0, text.find('\n'));
    if (line.starts_with(key)) return line.substr(key.size());
    text.remove_prefix(std::min(line.size() + 1, text.size()));
  }
  return {};
}

bool is_digits(std::string_view text) {
  return text.find_first_not_of("0123456789") == text.npos;
}

// A time as a note has it, in milliseconds since 1970. Nothing for what is no time in UTC, or before.
std::optional<std::int64_t> parse_time(std::string_view text) {
  constexpr std::string_view form = "0000-00-00T00:00:00Z";
  const auto fits = [](char expected, char c) {
    return expected == '0' ? '0' <= c && c <= '9' : c == expected;
  };
  if (!std::ranges::equal(form, text, fits)) return {};
  const auto number = [&](std::size_t at, std::size_t digits) {
    int value = 0;
    std::from_chars(&text[at], &text[at + digits], value);
    return value;
  };
  namespace chrono = std::chrono;
  const auto part = [&](std::size_t at) { return static_cast<unsigned>(number(at, 2)); };
  const chrono::year_month_day date{chrono::year(number(0, 4)), chrono::month(part(5)), chrono::day(part(8))};
  const int hour = number(11, 2), minute = number(14, 2), second = number(17, 2);
  if (!date.ok() || date.year() < chrono::year(1970) || hour > 23 || minute > 59 || second > 59) return {};
  const chrono::days since = chrono::sys_days(date).time_since_epoch();
  return ((std::int64_t{since.count()} * 24 + hour) * 60 + minute) * 60'000 + second * 1000;
}

}  // namespace

int capture_note::read(int directory) {
  std::string text;
  if (const int error = read_text(directory, text)) return error;
  format = value_of(text, "format: ");
  time = value_of(text, "time: ");
  host = value_of(text, "host: ");
  is_redacted = value_of(text, "redacted: ") == "yes";
  began = parse_time(time);
  return 0;
}

bool capture_note::is_understood(const std::string &path) const {
  if (format == known_format) return true;
  const bool is_number = !format.empty() && format[0] != '0' && is_digits(format);
  if (is_number) {
    complain<"%s: %s: format %s is newer than this program, which knows %s\n">(
        program_name, foreign_text{path}, foreign_text{format}, known_format);
  } else {
    complain_about(path, "does not state the capture's format");
  }
  return false;
}
