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
#include <cstdlib>
#include <filesystem>
#include <string_view>

#include "common/tables/tables.h"
#include "common/text/output.h"
#include "common/text/text.h"
#include "lab/table_file.h"
#include "platform/sysctl.h"

namespace lab {

namespace {

constexpr char note_name[] = "capture.txt";
constexpr char moments_name[] = "moments";
constexpr char unfinished[] = ".new";
constexpr std::string_view format_version = "1";
constexpr std::size_t note_size = 4096;  // what is read of a note: far more than one has

// How many folders are above the tables of a later moment: moments/1.000/proc/sys and those of their nodes.
constexpr int deepest = 4 + [] {
  std::ptrdiff_t most = 0;
  for (const table_description &table : all_tables) {
    const std::string_view node = table.node;
    most = std::max(most, std::count(node.begin(), node.end(), '.'));
  }
  return static_cast<int>(most);
}();

// Reads the note in a directory from whoever made it: no link, no pipe, no more than its beginning. Returns 0
// or an error number.
int read_note(int directory, std::string &text) {
  const int found = openat(directory, note_name, O_PATH | O_CLOEXEC | O_NOFOLLOW);
  if (found < 0) return errno;
  struct stat status {};
  fstat(found, &status);
  const std::string itself = "/proc/self/fd/" + std::to_string(found);
  const int fd = S_ISREG(status.st_mode) ? open(itself.c_str(), O_RDONLY | O_CLOEXEC) : -1;
  close(found);
  if (fd < 0) return EINVAL;
  text.resize(note_size);
  const ssize_t got = read(fd, text.data(), text.size());
  const int error = got < 0 ? errno : 0;
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
        foreign_text{path}, foreign_text{version}, format_version);
  } else {
    complain<"tarvellab: %s: does not state the capture's format\n">(foreign_text{path});
  }
  return false;
}

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
    const std::string path = directory.path_of(name);
    if (S_ISREG(status.st_mode)) complain<"tarvellab: %s: mostly holes\n">(foreign_text{path});
    if (!S_ISREG(status.st_mode)) complain<"tarvellab: %s: no part of a capture\n">(foreign_text{path});
    return false;
  });
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

// Where the kernel in sight is said to lie; empty where it is the live one.
std::string given_root() {
  const char *given = secure_getenv("TARVEL_ROOT");
  return given ? given : "";
}

// What the kernel in sight calls its machine; the name of this one where that kernel does not say.
std::string host_name() {
  utsname machine{};
  uname(&machine);
  char name[256];
  std::size_t length = sizeof name;
  std::string host = machine.nodename;
  if (sysctlbyname("kernel.hostname", name, &length, nullptr, 0) == 0) host.assign(name, length);
  if (host.ends_with('\n')) host.pop_back();
  std::ranges::replace(host, '\n', '?');
  return host;
}

std::string name_of(std::int64_t offset) {
  char name[32];
  std::snprintf(name, sizeof name, "%lld.%03lld", static_cast<long long>(offset / 1000),
                static_cast<long long>(offset % 1000));
  return name;
}

}  // namespace

own_directory make_vacant(const std::string &path) {
  own_directory top = own_directory::make(path);
  bool vacant = true;
  const bool listed = top.for_each([&](const std::string & /*name*/) { return vacant = false; });
  if (!vacant) complain_about(path, ENOTEMPTY);
  if (!listed) return {};
  if (fchmod(top.fd(), 0700) == 0) return top;
  complain_about(path, errno);
  return {};
}

bool write_note(const own_directory &top, time_t taken, bool redacted) {
  tm utc;
  char time[32];
  strftime(time, sizeof time, "%Y-%m-%dT%H:%M:%SZ", gmtime_r(&taken, &utc));
  const std::string host = redacted ? "redacted" : host_name();
  const std::string text = "format: " + std::string(format_version) + "\ntime: " + time + "\nhost: " + host +
                           "\nredacted: " + (redacted ? "yes" : "no") + "\n";
  table_file file(top.enter("."), note_name);
  file.put(std::as_bytes(std::span(text)));
  return file.commit();
}

own_directory moment_in_progress(const own_directory &top) {
  return top.make_below(moments_name).make_below(unfinished);
}

bool finish_moment(const own_directory &top, std::int64_t offset) {
  const own_directory moments = top.enter(moments_name);
  return moments.is_open() && moments.rename(unfinished, name_of(offset));
}

void drop_moment(const own_directory &top) {
  top.enter(moments_name).remove(unfinished);
}

bool shows_redacted_capture() {
  std::error_code error;
  std::filesystem::path top = std::filesystem::canonical(given_root(), error);
  if (error) return false;
  // A later moment lies two directories below the note.
  std::int64_t offset = 0;
  const bool is_moment =
      top.parent_path().filename() == moments_name && parse_offset(top.filename().native(), offset);
  if (is_moment) top = top.parent_path().parent_path();
  const int fd = open(top.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC);
  struct stat status {};
  fstat(fd, &status);
  std::string note;
  const bool is_redacted =
      status.st_uid == geteuid() && read_note(fd, note) == 0 && value_of(note, "redacted: ") == "yes";
  close(fd);
  return is_redacted;
}

bool is_mostly_holes(std::string_view node) {
  std::string path = given_root();
  if (path.empty()) return false;
  path += "/proc/sys/";
  for (const char c : node) path += c == '.' ? '/' : c;
  struct stat status {};
  return lstat(path.c_str(), &status) == 0 && S_ISREG(status.st_mode) && is_hollow(status);
}

bool look_into(const own_directory &top, captured &found) {
  std::string note;
  const int error = read_note(top.fd(), note);
  if (error == ENOENT) {
    const own_directory kernel = top.enter("proc");
    return kernel.is_open() && holds_only_files(kernel, 1);
  }
  const std::string path = top.path_of(note_name);
  if (error) return complain_about(path, error);
  if (!understands(path, note) || !holds_only_files(top, 0)) return false;
  found.is_capture = true;
  const auto said = [&](std::string_view key) {
    const std::string_view value = value_of(note, key);
    return std::string(value.empty() ? "unknown" : value);
  };
  found.host = said("host: ");
  found.time = said("time: ");
  if (faccessat(top.fd(), moments_name, F_OK, 0) != 0) return true;
  const own_directory moments = top.enter(moments_name);
  const bool listed = moments.for_each([&](const std::string &name) {
    std::int64_t offset = 0;
    struct stat status {};
    const bool is_moment = parse_offset(name, offset) &&
                           fstatat(moments.fd(), name.c_str(), &status, AT_SYMLINK_NOFOLLOW) == 0 &&
                           S_ISDIR(status.st_mode);
    if (is_moment) found.later.push_back({offset, moments.path_of(name)});
    return true;
  });
  std::ranges::sort(found.later, {}, &captured_moment::offset);
  return listed;
}

}  // namespace lab
