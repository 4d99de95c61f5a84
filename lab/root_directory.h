// A directory that stands for a machine: proc/sys/kern/tarvel/... and proc/<pid>/comm below it.

#ifndef TARVELCTL_LAB_ROOT_DIRECTORY_H
#define TARVELCTL_LAB_ROOT_DIRECTORY_H

#include <cstdint>
#include <string>
#include <string_view>

#include "common/own_directory.h"
#include "lab/table_file.h"
#include "lab/world.h"

namespace lab {

class root_directory {
 public:
  explicit root_directory(own_directory top) : top_(std::move(top)) {}

  // Makes the directories below it. Like all here, returns false after a message on standard error.
  bool prepare();

  // What becomes the file of a kernel table.
  table_file new_table(std::string_view node) const;

  bool put_process(std::int32_t pid, std::string_view name);

  // Removes all process names, such as those of an earlier use.
  bool remove_processes();

  // Gives the machine a name, or takes the one that it has where it is empty.
  bool put_host(std::string_view name);

  // Publishes a whole world, or what changed in it since it was published last: the names of new processes
  // before the tables that mention them, tables one by one, then the end of processes.
  bool publish(world &state);

 private:
  own_directory top_;
};

}  // namespace lab

#endif
