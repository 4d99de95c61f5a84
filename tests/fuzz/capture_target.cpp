// A capture from a stranger: a tree of names, depths, links, sizes and notes as the input has them.
//
// The input is a list of steps of four bytes: what is made, in which directory so far, under which name, and
// how, which also stands for "#" in the name. What follows 32 steps is the text of files.

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstdlib>
#include <filesystem>
#include <string>
#include <string_view>
#include <vector>

#include "lab/capture_directory.h"
#include "platform/sysctl.h"

namespace {

namespace fs = std::filesystem;

constexpr const char *names[] = {"proc", "sys",         "kern",    "tarvel", "stats", "flow",
                                 "94",   "capture.txt", "moments", "#.000",  "0.#",   "x#"};
constexpr std::string_view secret = "what lies outside";
const char *const targets[] = {"/outside/kern/tarvel/stats/flow", "/outside", "/top", "/outside/kern/tarvel"};

void expect(bool holds) {
  if (!holds) std::abort();
}

void write_new(const std::string &path, std::string_view text, off_t size) {
  const int fd = open(path.c_str(), O_WRONLY | O_CREAT | O_EXCL, 0600);
  if (fd < 0) return;
  expect(write(fd, text.data(), text.size()) >= 0 && ftruncate(fd, size) == 0);
  close(fd);
}

// A private place, in memory, for the tree and, beside it, what it must not lead to.
struct place {
  place() {
    expect(mkdtemp(path.data()));
    fs::create_directories(path + "/outside/kern/tarvel/stats");
    write_new(path + targets[0], secret, secret.size());
  }
  ~place() { fs::remove_all(path); }
  std::string path = "/dev/shm/tarvellab-fuzz-XXXXXX";
};

void make(std::vector<std::string> &folders, const std::uint8_t *step, const place &where,
          std::string_view text) {
  std::string path = folders[step[1] % folders.size()] + "/" + names[step[2] % std::size(names)];
  if (path.find('#') != path.npos) path.replace(path.find('#'), 1, std::to_string(step[3]));
  std::error_code ignored;  // it is there already, or leads nowhere
  switch (step[0] % 6) {
    case 0:
      if (mkdir(path.c_str(), step[3] % 16 ? 0700 : 0777) == 0) folders.push_back(path);
      break;
    case 1:
      write_new(path, text, static_cast<off_t>(text.size()));
      break;
    case 2:
      fs::create_symlink(where.path + targets[step[3] % std::size(targets)], path, ignored);
      break;
    case 3:
      mkfifo(path.c_str(), 0600);
      break;
    case 4:
      write_new(path, {}, off_t{1} << step[3] % 40);
      break;
    case 5:
      fs::create_directories(path + "/proc/sys/kern/tarvel/stats", ignored);
      break;
  }
}

// What a reader of a tree that was accepted relies on.
void check(const std::string &top, const lab::captured &found) {
  for (fs::recursive_directory_iterator entry(found.is_capture ? top : top + "/proc"), end; entry != end;
       ++entry) {
    struct stat status {};
    lstat(entry->path().c_str(), &status);
    expect(S_ISDIR(status.st_mode) ? entry.depth() < 7 : S_ISREG(status.st_mode));
    expect(status.st_size <= 16 << 20 || status.st_blocks > 0);
  }
  for (std::int64_t last = 0; const lab::captured_moment &moment : found.later) {
    expect(moment.offset >= last && fs::is_directory(fs::symlink_status(moment.path)));
    last = moment.offset;
  }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
  static const place where;
  const std::string top = where.path + "/top";
  mkdir(top.c_str(), 0700);
  const std::size_t steps = std::min<std::size_t>(size / 4, 32);
  const std::string_view text(reinterpret_cast<const char *>(data) + 4 * steps, size - 4 * steps);
  std::vector<std::string> folders{top};
  for (std::size_t i = 0; i < steps; ++i) make(folders, data + 4 * i, where, text);
  lab::captured found;
  if (lab::look_into(lab::own_directory::open(top), found)) check(top, found);
  for (const std::string &root : folders) {
    setenv("TARVEL_ROOT", root.c_str(), 1);
    char content[64];
    std::size_t length = sizeof content;
    const bool read = sysctlbyname("kern.tarvel.stats.flow", content, &length, nullptr, 0) == 0;
    expect(!read || std::string_view(content, length) != secret);
    lab::shows_redacted_capture();
  }
  fs::remove_all(top);
  return 0;
}
