// What the front end and the commands know of each other.

#ifndef TARVELCTL_TARVELCTL_COMMAND_H
#define TARVELCTL_TARVELCTL_COMMAND_H

#include <getopt.h>

#include <cstdint>

// Runs a command. Entry 0 of `argv` is the command word as typed, entries 1 to `argc` - 1 are its arguments;
// the vector need not end with a null entry. The option scanner stands at entry 1.
//
// Returns 0 when the run is complete and may be repeated, anything else when no further run is wanted. The
// result does not become the exit status.
using command_handler = int (*)(int argc, char **argv);

// A row of the command table.
struct command_entry {
  const char *name;
  command_handler handler;
  int min_args;            // command word and arguments must number more
  const char *usage_text;  // shown behind the name, or null
  const option *options;   // ended by a record without a name
  const std::uint32_t *option_flags;
};

// The commands, ended by a row without a name.
extern const command_entry command_table[];

// The short options that a handler takes, as getopt_long wants them; empty where it takes none.
const char *short_options_of(command_handler handler);

// What the front end found on the command line. Set before a handler runs, then left alone.
extern const char *progname;
extern int refresh_interval;  // seconds; 0: run once
extern bool output_redirected;

// The front end: runs the command line. Ends the process.
[[noreturn]] void run_command_line(int argc, char **argv);

// A long-option array without options, and its flags.
extern const option no_options[];
extern const std::uint32_t no_option_flags[];

// The handlers and, where a command has options, their arrays.
int cmd_channel(int argc, char **argv);
int cmd_flow(int argc, char **argv);
int cmd_flow_adv(int argc, char **argv);
int cmd_flow_owner(int argc, char **argv);
int cmd_flow_route(int argc, char **argv);
int cmd_flow_switch(int argc, char **argv);
int cmd_interface(int argc, char **argv);
int cmd_memory(int argc, char **argv);
int cmd_netns(int argc, char **argv);
int cmd_netstat(int argc, char **argv);
int cmd_provider(int argc, char **argv);
int cmd_show(int argc, char **argv);
int cmd_tree(int argc, char **argv);

extern const std::uint32_t channel_option_flags[];
extern const option netns_options[];
extern const std::uint32_t netns_option_flags[];
extern const option netstat_long_options[];
extern const std::uint32_t netstat_option_flags[];
extern const option provider_options[];
extern const std::uint32_t provider_option_flags[];

#endif
