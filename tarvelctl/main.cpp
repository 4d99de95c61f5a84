#include "tarvelctl/command.h"

int main(int argc, char **argv) {
  run_command_line(argc, argv);
}
