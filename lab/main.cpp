#include "common/own_directory.h"
#include "common/text/memory.h"
#include "common/text/output.h"
#include "lab/command_line.h"

int main(int argc, char **argv) {
  program_name = "tarvellab";
  attach_own_outputs();
  make_new_fail_fast();
  return lab::run_command_line(argc, argv);
}
