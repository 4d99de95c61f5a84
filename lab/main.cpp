#include <fcntl.h>
#include <unistd.h>

#include "common/memory.h"
#include "common/output.h"
#include "lab/command_line.h"

int main(int argc, char **argv) {
  // An opening of its own: diagnostics do not wait for a slow reader, which must not reach what `run` starts.
  const int diagnostics_fd = fcntl(STDERR_FILENO, F_DUPFD_CLOEXEC, STDERR_FILENO + 1);
  diagnostics.attach(diagnostics_fd);
  fcntl(diagnostics_fd, F_SETFD, FD_CLOEXEC);
  make_new_fail_fast();
  return lab::run_command_line(argc, argv);
}
