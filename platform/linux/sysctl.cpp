// Named kernel variables as files: kern.tarvel.stats.flow is /proc/sys/kern/tarvel/stats/flow.

#include "platform/sysctl.h"

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <optional>
#include <string_view>

#include "platform/linux/kernel_file.h"

namespace {

// Writes the path of a variable, terminated. False for a name that no variable has: a "/" in it would reach
// other files.
bool variable_path(std::string_view name, char (&path)[256]) {
  constexpr std::string_view prefix = "sys/";
  if (name.empty() || name.find('/') != name.npos || prefix.size() + name.size() >= sizeof path) return false;
  char *end = std::copy(prefix.begin(), prefix.end(), path);
  *std::replace_copy(name.begin(), name.end(), end, '.', '/') = '\0';
  return true;
}

// Reads to the end, because files below /proc do not state their size.
int measure(platform::kernel_file &file, std::size_t *length) {
  char scratch[16 * 1024];
  std::size_t total = 0;
  for (;;) {
    const long got = file.read(scratch, sizeof scratch);
    if (got < 0) return -1;
    total += static_cast<std::size_t>(got);
    if (static_cast<std::size_t>(got) < sizeof scratch) break;
  }
  *length = total;
  return 0;
}

// Stores what the file holds in `value`, of `*length` bytes.
int deliver(platform::kernel_file &file, void *value, std::size_t *length) {
  // A stated size is the snapshot's. Without one, the data ends where a read finds nothing more.
  const std::size_t size = file.stated_size() ? file.stated_size() : *length;
  if (size > *length) {
    errno = ENOMEM;
    return -1;
  }
  const long got = file.read(value, size);
  if (got < 0) return -1;
  if (!file.stated_size() && static_cast<std::size_t>(got) == *length) {
    char beyond;
    const long more = file.read(&beyond, 1);
    if (more < 0) return -1;
    if (more > 0) {
      errno = ENOMEM;
      return -1;
    }
  }
  *length = static_cast<std::size_t>(got);
  return 0;
}

// The switch that the last call read, which stays open: the header promises what follows from it. A listing
// asks at every row, and opening a file takes eight times as long as reading it.
struct {
  char path[256];
  std::optional<platform::kernel_file> file;
} last_switch;

int deliver_switch(const char *path, void *value, std::size_t *length) {
  if (last_switch.file && std::strcmp(last_switch.path, path) == 0) {
    last_switch.file->rewind();
  } else {
    std::strcpy(last_switch.path, path);
    last_switch.file.emplace(path);
  }
  const bool delivered = last_switch.file->is_open() && deliver(*last_switch.file, value, length) == 0;
  if (!delivered) last_switch.file.reset();
  return delivered ? 0 : -1;
}

}  // namespace

extern "C" int sysctlbyname(const char *name, void *old_value, std::size_t *old_length, const void *new_value,
                            std::size_t new_length) {
  if (new_value || new_length) {
    errno = EPERM;
    return -1;
  }
  char path[256];
  if (!variable_path(name, path)) {
    errno = ENOENT;
    return -1;
  }
  if (old_value && old_length && *old_length == 1) return deliver_switch(path, old_value, old_length);
  last_switch.file.reset();
  platform::kernel_file file(path);
  if (!file.is_open()) return -1;
  if (!old_length) return 0;
  if (old_value) return deliver(file, old_value, old_length);
  if (file.stated_size() == 0) return measure(file, old_length);
  *old_length = file.stated_size();
  return 0;
}
