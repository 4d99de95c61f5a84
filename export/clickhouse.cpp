#include "export/command_line.h"
namespace exporter {
void print_statements() {}
}  // namespace exporter
