#include "lab/capture_directory.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <sys/utsname.h>
#include <time.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <charconv>
#include <cstdio>
#include <filesystem>
#include <string_view>
#include <system_error>

#include "common/output.h"
#include "common/text.h"
#include "lab/root_directory.h"
#include "lab/table_file.h"

namespace lab {

namespace {

namespace fs = std::filesystem;

constexpr std::string_view format_version = "1";
constexpr std::size_t note_size = 4096;  // what is read of a note: far more than one has
constexpr int deepest = 7;               // folders above moments/1.000/proc/sys/kern/tarvel/stats/flow

std::string note_of(const std::string &directory) {
  return directory + "/capture.txt";
}

std::string moments_of(const std::string &directory) {
  return directory + "/moments";
}

// Reads a note from whoever made it: no link, no pipe, no more than its beginning. Returns 0 or an error
// number.
int read_note(const std::string &path, std::string &text) {
  const int fd = open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY);
  if (fd < 0) return errno;
  struct stat status;
  int error = fstat(fd, &status) < 0 ? errno : S_ISREG(status.st_mode) ? 0 : EINVAL;
  text.resize(note_size);
  const ssize_t got = error ? 0 : read(fd, text.data(), text.size());
  if (got < 0) error = errno;
  text.resize(got > 0 ? static_cast<std::size_t>(got) : 0);
  close(fd);
  return error;
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

bool understands(const std::string &path, std::string_view note) {
  const std::string_view version = value_of(note, "format: ");
  if (version == format_version) return true;
  const bool is_number = !version.empty() && version[0] != '0' && is_digits(version);
  if (is_number) {
    complain<"tarvellab: %s: format %s is newer than this program, which knows %s\n">(
        path, foreign_text{version}, format_version);
  } else {
    complain<"tarvellab: %s: does not state the capture's format\n">(path);
  }
  return false;
}

// A capture comes from elsewhere: a link would lead out of it, a device may do something when it is opened,
// and a chain of folders without end takes memory without end.
bool holds_only_files(const std::string &directory) {
  std::error_code error;
  fs::recursive_directory_iterator entry(directory, error);
  for (; !error && entry != fs::recursive_directory_iterator(); entry.increment(error)) {
    const fs::file_type type = entry->symlink_status(error).type();
    const bool is_folder = type == fs::file_type::directory && entry.depth() < deepest;
    if (error || type == fs::file_type::regular || is_folder) continue;
    complain<"tarvellab: %s: no part of a capture\n">(foreign_text{entry->path().native()});
    return false;
  }
  return !error || complain_about(directory, error.value());
}

// The milliseconds in "1.000". False for any other form, and beyond what any capture lasts.
bool parse_offset(std::string_view name, std::int64_t &offset) {
  constexpr std::size_t decimals = 3;
  constexpr std::size_t most_digits = 11;
  const std::size_t point = name.find('.');
  if (point == 0 || point > most_digits || name.size() != point + 1 + decimals) return false;
  if (!is_digits(name.substr(0, point)) || !is_digits(name.substr(point + 1))) return false;
  std::int64_t seconds = 0;
  std::from_chars(name.data(), name.data() + point, seconds);
  std::from_chars(name.data() + point + 1, name.data() + name.size(), offset);
  offset += seconds * 1000;
  return offset > 0;
}

std::string name_of(std::int64_t offset) {
  char name[32];
  std::snprintf(name, sizeof name, "%lld.%03lld", static_cast<long long>(offset / 1000),
                static_cast<long long>(offset % 1000));
  return name;
}

}  // namespace

bool is_vacant(const std::string &directory) {
  std::error_code error;
  const bool empty = fs::is_empty(fs::path(directory) / ".", error);
  if (error == std::errc::no_such_file_or_directory || (!error && empty)) return true;
  return complain_about(directory, error ? error.value() : ENOTEMPTY);
}

bool write_note(const std::string &directory, time_t taken, bool redacted) {
  tm utc;
  char time[32];
  std::strftime(time, sizeof time, "%Y-%m-%dT%H:%M:%SZ", gmtime_r(&taken, &utc));
  utsname machine{};
  uname(&machine);
  std::string host = redacted ? "redacted" : machine.nodename;
  std::ranges::replace(host, '\n', '?');
  const std::string text = "format: " + std::string(format_version) + "\ntime: " + time + "\nhost: " + host +
                           "\nredacted: " + (redacted ? "yes" : "no") + "\n";
  table_file file(note_of(directory));
  file.put(std::as_bytes(std::span(text)));
  if (const int error = file.commit()) return complain_about(note_of(directory), error);
  return true;
}

std::string moment_in_progress(const std::string &directory) {
  return moments_of(directory) + "/.new";
}

bool finish_moment(const std::string &directory, std::int64_t offset) {
  const std::string path = moments_of(directory) + "/" + name_of(offset);
  return std::rename(moment_in_progress(directory).c_str(), path.c_str()) == 0 || complain_about(path, errno);
}

bool find_moments(const std::string &directory, std::vector<captured_moment> &found) {
  std::string note;
  const int error = read_note(note_of(directory), note);
  if (error == ENOENT || error == ENOTDIR) return true;
  if (error) return complain_about(note_of(directory), error);
  if (!understands(note_of(directory), note)) return false;
  if (!holds_only_files(directory)) return false;
  std::error_code ignored;
  fs::directory_iterator entry(moments_of(directory), ignored);
  for (; entry != fs::directory_iterator(); entry.increment(ignored)) {
    std::int64_t offset = 0;
    const bool is_moment = parse_offset(entry->path().filename().string(), offset);
    if (is_moment && entry->is_directory(ignored)) found.push_back({offset, entry->path().string()});
  }
  std::ranges::sort(found, {}, &captured_moment::offset);
  return true;
}

}  // namespace lab
