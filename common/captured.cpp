#include "common/captured.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <charconv>
#include <cstdio>
#include <filesystem>

#include "common/own_directory.h"
#include "common/tables/tables.h"
#include "platform/root.h"

namespace {

// How many folders are above the tables of a later moment: moments/1.000/proc/sys and those of their nodes.
constexpr int deepest = 4 + [] {
  std::ptrdiff_t most = 0;
  for (const table_description &table : all_tables) {
    const std::string_view node = table.node;
    most = std::max(most, std::count(node.begin(), node.end(), '.'));
  }
  return static_cast<int>(most);
}();

// Whether a file says that it is large, and takes no room: an archive of a few bytes would fill the memory.
bool is_hollow(const struct stat &status) {
  constexpr off_t notable = 16 << 20;
  constexpr off_t block = 512;
  return status.st_size > notable && status.st_blocks < status.st_size / (16 * block);
}

// A capture comes from elsewhere: a link would lead out of it, a device may do something when it is opened,
// and a chain of folders without end takes memory without end.
bool holds_only_files(const own_directory &directory, int depth) {
  return directory.for_each([&](const std::string &name) {
    struct stat status {};
    // GCOVR_EXCL_BR_START: what moves on between two calls is rare
    if (fstatat(directory.fd(), name.c_str(), &status, AT_SYMLINK_NOFOLLOW) < 0) {
      return errno == ENOENT || complain_about(directory.path_of(name), errno);  // a simulation may move on
    }
    // GCOVR_EXCL_BR_STOP
    if (S_ISDIR(status.st_mode) && depth < deepest) {
      const own_directory below = directory.enter(name);
      return below.is_open() && holds_only_files(below, depth + 1);
    }
    if (S_ISREG(status.st_mode) && !is_hollow(status)) return true;
    const char *const reason = S_ISREG(status.st_mode) ? "mostly holes" : "no part of a capture";
    return complain_about(directory.path_of(name), reason);
  });
}

// Of what no capture lasts, as many as fit.
std::int64_t nanoseconds(std::int64_t milliseconds) {
  constexpr std::int64_t in_one = 1'000'000;
  return std::min(milliseconds, INT64_MAX / in_one) * in_one;
}

// Adds the later moments, in order.
bool find_moments(const own_directory &top, captured &found) {
  if (faccessat(top.fd(), moments_name, F_OK, 0) != 0) return true;
  const own_directory moments = top.enter(moments_name);
  const bool listed = moments.for_each([&](const std::string &name) {
    const std::optional<std::int64_t> offset = parse_offset(name);
    struct stat status {};
    const bool is_moment = offset && fstatat(moments.fd(), name.c_str(), &status, AT_SYMLINK_NOFOLLOW) == 0 &&
                           S_ISDIR(status.st_mode);
    if (is_moment) found.moments.push_back({*offset, moments.path_of(name)});
    return true;
  });
  std::ranges::sort(found.moments, {}, &captured_moment::offset);
  return listed;
}

}  // namespace

bool shows_redacted_capture() {
  std::error_code error;
  std::filesystem::path top = std::filesystem::canonical(platform::given_root(), error);
  if (error) return false;
  // A later moment lies two directories below the note.
  const bool is_moment =
      top.parent_path().filename() == moments_name && parse_offset(top.filename().native());
  if (is_moment) top = top.parent_path().parent_path();
  const int fd = open(top.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC);
  struct stat status {};
  fstat(fd, &status);
  capture_note note;
  const bool is_redacted = status.st_uid == geteuid() && note.read(fd) == 0 && note.is_redacted;
  close(fd);
  return is_redacted;
}

bool is_mostly_holes(std::string_view node) {
  std::string path = platform::given_root();
  if (path.empty()) return false;
  path += "/proc/sys/";
  for (const char c : node) path += c == '.' ? '/' : c;
  struct stat status {};
  return lstat(path.c_str(), &status) == 0 && S_ISREG(status.st_mode) && is_hollow(status);
}

std::optional<captured> look_into(const std::string &directory) {
  std::error_code unknown;
  const std::string root = std::filesystem::canonical(directory, unknown);
  if (unknown) return complain_about(directory, unknown.value()), std::nullopt;
  const own_directory top = own_directory::open(root);
  if (!top.is_open()) return {};
  captured found;
  found.moments.push_back({0, root});
  const int error = found.note.read(top.fd());
  if (error == ENOENT) {
    const own_directory kernel = top.enter("proc");
    if (!kernel.is_open() || !holds_only_files(kernel, 1)) return {};
    return found;
  }
  const std::string path = top.path_of(capture_note::file_name);
  if (error) return complain_about(path, error), std::nullopt;
  found.is_capture = found.note.is_understood(path) && holds_only_files(top, 0) && find_moments(top, found);
  if (!found.is_capture) return {};
  return found;
}

moment read_captured(const captured &of, const captured_moment &which,
                     std::span<const table_description *const> wanted) {
  if (!platform::show_root(which.root))
    return {};  // GCOVR_EXCL_BR_LINE: no test has more rights than its caller
  moment made = read_moment(wanted);
  if (!of.is_capture) return made;
  for (table_reading &table : made.tables) {
    table.monotonic = nanoseconds(which.offset);
    table.wall = nanoseconds(of.note.began.value_or(0) + which.offset);
  }
  made.host = of.note.is_redacted ? capture_note::redacted_host : of.note.host;
  return made;
}

std::optional<std::int64_t> parse_offset(std::string_view name) {
  constexpr std::size_t decimals = 3;
  constexpr std::size_t most_digits = 11;
  const std::size_t point = name.find('.');
  if (point == 0 || point > most_digits || name.size() != point + 1 + decimals) return {};
  const auto is_digit = [](char c) { return '0' <= c && c <= '9'; };
  if (std::ranges::count_if(name, is_digit) + 1 != std::ssize(name)) return {};
  std::int64_t seconds = 0, offset = 0;
  std::from_chars(name.data(), name.data() + point, seconds);
  std::from_chars(name.data() + point + 1, name.data() + name.size(), offset);
  offset += seconds * 1000;
  if (offset == 0) return {};
  return offset;
}

std::string name_of_offset(std::int64_t offset) {
  char name[32];
  std::snprintf(name, sizeof name, "%lld.%03lld", static_cast<long long>(offset / 1000),
                static_cast<long long>(offset % 1000));
  return name;
}
