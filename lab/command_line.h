// The command line of tarvellab.

#ifndef TARVELCTL_LAB_COMMAND_LINE_H
#define TARVELCTL_LAB_COMMAND_LINE_H

#include <cstdint>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "lab/world.h"

namespace lab {

// What the user asked for.
struct options : sizes {
  std::uint64_t seed = 1;
  std::uint32_t interval = 1000;  // milliseconds between two snapshots
  std::uint32_t after = 0;  // milliseconds that a generated one has moved, in its incidents where it has any
  std::vector<planned_incident> incidents;
  std::string host;         // empty: the machine has no name of its own
  std::uint32_t every = 0;  // milliseconds between two captured moments; 0: there is one
  std::uint32_t count = 0;  // captured moments, where there are several
  bool redact = false;
  std::string directory;     // empty: none given
  char **command = nullptr;  // what stands behind "--", ended by a null entry
};

// Runs the command line. Returns the exit status: 0, 64 after a usage error, 1 after a failure, or, for
// `run`, what the command ended with.
int run_command_line(int argc, char **argv);

// The commands, which return their exit status.
int generate(const options &asked);
int simulate(const options &asked);
int run(const options &asked);
int capture(const options &asked);

enum command_bit : std::uint8_t { in_generate = 1, in_simulate = 2, in_run = 4, in_capture = 8 };

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
  bool (*take)(std::string_view value, options &asked);  // false: it is no such value
};

extern const std::span<const command> commands;
extern const std::span<const option_row> known_options;

}  // namespace lab

#endif
