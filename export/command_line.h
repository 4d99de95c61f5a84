// The command line of tarvelexport.

#ifndef TARVELCTL_EXPORT_COMMAND_LINE_H
#define TARVELCTL_EXPORT_COMMAND_LINE_H

#include <cstdint>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "export/keys.h"

namespace exporter {

// What the user asked for.
struct options {
  std::vector<const kind *> kinds;  // in their order, each once; none: all
  std::int64_t every = 0;           // milliseconds between two moments; 0: there is one
  std::uint64_t count = 0;          // moments; 0: for as long as someone reads
  std::string file;                 // to be replaced; empty: standard output
  const char *host = nullptr;       // in place of the kernel's name
  std::string capture;              // whose moments to walk; empty: the kernel in sight
  bool clickhouse = false;
};

// Runs the command line. Returns the exit status: 0, 64 after a usage error, 1 where something could not be
// read or written.
int run_command_line(int argc, char **argv);

// The commands, which return their exit status.
int write_lines(const options &asked);
int print_schema(const options &asked);
void print_statements();

enum command_bit : std::uint8_t { in_json = 1, in_schema = 2 };

// A command, as its help and its completions tell of it.
struct command {
  command_bit bit;
  std::string_view name;
  std::string_view arguments;
  std::string_view purpose;
  int (*handler)(const options &);
};

// An option, and all that follows from it.
struct option_row {
  unsigned in;                // the bits of the commands that take it
  std::string_view name;      // with its dashes
  std::string_view argument;  // what help calls the word behind it; empty: it takes none
  std::string_view values;    // what that word may be, for messages
  std::string_view meaning;
  bool (*take)(const char *value, options &asked);  // false: it is no such value
};

extern const std::span<const command> commands;
extern const std::span<const option_row> known_options;

}  // namespace exporter

#endif
