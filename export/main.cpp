#include "common/own_directory.h"
#include "common/text/interrupt.h"
#include "common/text/memory.h"
#include "common/text/output.h"
#include "export/command_line.h"

int main(int argc, char **argv) {
  program_name = "tarvelexport";
  end_on_interrupt();
  attach_standard_outputs();
  make_new_fail_fast();
  return exporter::run_command_line(argc, argv);
}
