// A directory that stands for a machine: proc/sys/kern/tarvel/... and proc/<pid>/comm below it.

#ifndef TARVELCTL_LAB_ROOT_DIRECTORY_H
#define TARVELCTL_LAB_ROOT_DIRECTORY_H

#include <cstddef>
#include <cstdint>
#include <span>
#include <string>
#include <string_view>

#include "lab/world.h"

namespace lab {

class root_directory {
 public:
  explicit root_directory(std::string path) : path_(std::move(path)) {}

  const std::string &path() const { return path_; }

  // The file of a kernel table.
  std::string table_path(std::string_view node) const;

  // Makes the directories, those above included. The root itself gets `mode`, the umask applied, where it is
  // new. Like all below, returns false after a message on standard error.
  bool prepare(unsigned mode);

  bool put_table(std::string_view node, std::span<const std::byte> bytes);

  bool put_process(std::int32_t pid, std::string_view name);
  void remove_process(std::int32_t pid);

  // Removes all process names, such as those of an earlier use.
  bool remove_processes();

  // Publishes a whole world, or what changed in it since it was published last: the names of new processes
  // before the tables that mention them, tables one by one, then the end of processes.
  bool publish(const world &state);

 private:
  std::string path_;
};

// Says on standard error what failed about `path`. Returns false.
bool complain_about(const std::string &path, int error);

}  // namespace lab

#endif
