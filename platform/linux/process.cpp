// The short name of process 25 is the text of /proc/25/comm, up to its line end.

#include "platform/process.h"

#include <cstdio>
#include <cstring>

#include "platform/linux/kernel_file.h"

namespace platform {

bool query_process_name(int pid, char (&name)[process_name_size]) {
  if (pid <= 0) return false;
  char path[32];
  std::snprintf(path, sizeof path, "%d/comm", pid);
  kernel_file file(path);
  char text[process_name_size];
  long length = file.read(text, sizeof text);
  if (length <= 0) return false;
  if (text[length - 1] == '\n') --length;  // the kernel's own line end, not part of the name
  if (static_cast<std::size_t>(length) > process_name_size - 1) length = process_name_size - 1;
  std::memcpy(name, text, static_cast<std::size_t>(length));
  name[length] = '\0';
  return true;
}

}  // namespace platform
