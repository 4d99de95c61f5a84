// A capture from a stranger: a tree of names, depths, links, sizes and notes as the input has them.
//
// The input is a list of steps of four bytes: what is made, in which directory so far, under which name, and
// how; the text "#" in a name is the fourth byte. What follows 32 steps is the note's text.

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <string>
#include <string_view>
#include <vector>

#include "lab/capture_directory.h"
#include "platform/sysctl.h"

namespace {

namespace fs = std::filesystem;

constexpr std::string_view secret = "what lies outside";
constexpr const char *names[] = {"proc", "sys",         "kern",    "tarvel", "stats", "flow",
                                 "94",   "capture.txt", "moments", "#.000",  "0.#",   "x#"};

void expect(bool holds, const char *what) {
  if (holds) return;
  std::fprintf(stderr, "%s\n", what);
  std::abort();
}

// A private place for the tree and, beside it, what it must not lead to.
struct place {
  place() {
    char path[] = "/dev/shm/tarvellab-fuzz-XXXXXX";  // in memory: a disk takes most of the time
    expect(mkdtemp(path), "there is no place for trees");
    outside = std::string(path) + "/outside/kern/tarvel/stats";
    fs::create_directories(outside);
    std::ofstream(outside + "/flow") << secret;
    top = std::string(path) + "/top";
  }
  ~place() { fs::remove_all(fs::path(top).parent_path()); }
  std::string top, outside;
};

void write_new(const std::string &path, std::string_view text, off_t size) {
  const int fd = open(path.c_str(), O_WRONLY | O_CREAT | O_EXCL, 0600);
  if (fd < 0) return;
  expect(write(fd, text.data(), text.size()) >= 0 && ftruncate(fd, size) == 0, "a file cannot be made");
  close(fd);
}

void make(std::vector<std::string> &folders, const std::uint8_t *step, const place &where,
          std::string_view note) {
  std::string path = folders[step[1] % folders.size()] + "/" + names[step[2] % std::size(names)];
  if (const std::size_t number = path.find('#'); number != path.npos) {
    path.replace(number, 1, std::to_string(step[3]));
  }
  const std::string targets[] = {where.outside + "/flow", where.outside, "..", where.outside + "/../../.."};
  switch (step[0] % 6) {
    case 0:
      if (mkdir(path.c_str(), step[3] % 16 ? 0700 : 0777) == 0) folders.push_back(path);
      break;
    case 1:
      write_new(path, note, static_cast<off_t>(note.size()));
      break;
    case 2:
      fs::create_symlink(targets[step[3] % std::size(targets)], path);
      break;
    case 3:
      mkfifo(path.c_str(), 0600);
      break;
    case 4:
      write_new(path, {}, off_t{1} << step[3] % 40);
      break;
    case 5:
      fs::create_directories(path + "/proc/sys/kern/tarvel/stats");
      break;
  }
}

// What a reader of a tree that was accepted relies on.
void check(const std::string &top, const lab::captured &found) {
  for (fs::recursive_directory_iterator entry(found.is_capture ? top : top + "/proc"), end; entry != end;
       ++entry) {
    struct stat status {};
    lstat(entry->path().c_str(), &status);
    expect(S_ISREG(status.st_mode) || S_ISDIR(status.st_mode), "something else than files and directories");
    expect(!S_ISDIR(status.st_mode) || !(status.st_mode & 022), "a directory for others to write to");
    expect(entry.depth() <= 7, "deeper than the tables");
    expect(!S_ISREG(status.st_mode) || status.st_size <= (16 << 20) || status.st_blocks > 0, "a hole");
  }
  std::int64_t last = 0;
  for (const lab::captured_moment &moment : found.later) {
    expect(moment.offset > 0 && moment.offset >= last, "moments out of order");
    expect(fs::is_directory(fs::symlink_status(moment.path)), "a moment that is no directory");
    last = moment.offset;
  }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
  static const place where;
  mkdir(where.top.c_str(), 0700);
  constexpr std::size_t step_size = 4;
  const std::size_t steps = std::min<std::size_t>(size / step_size, 32);
  const std::string_view note(reinterpret_cast<const char *>(data) + steps * step_size,
                              size - steps * step_size);
  std::vector<std::string> folders{where.top};
  for (std::size_t i = 0; i < steps; ++i) {
    try {
      make(folders, data + i * step_size, where, note);
    } catch (const fs::filesystem_error &) {  // it is there already, or leads nowhere
    }
  }
  lab::captured found;
  if (lab::look_into(lab::own_directory::open(where.top), found)) check(where.top, found);
  for (const std::string &root : folders) {
    setenv("TARVEL_ROOT", root.c_str(), 1);
    char text[64];
    std::size_t length = sizeof text;
    const bool read = sysctlbyname("kern.tarvel.stats.flow", text, &length, nullptr, 0) == 0;
    expect(!read || std::string_view(text, length) != secret, "a way out of the root");
    lab::shows_redacted_capture();
  }
  fs::remove_all(where.top);
  return 0;
}
