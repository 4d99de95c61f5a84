#include "lab/command_line.h"

#include <algorithm>
#include <charconv>
#include <cmath>
#include <cstdlib>
#include <string_view>
#include <utility>

#include "common/text/output.h"
#include "common/text/text.h"
#include "lab/incidents.h"

namespace lab {

namespace {

constexpr std::uint32_t most_records = 10'000'000;
constexpr std::uint32_t longest = 86'400'000;  // milliseconds
constexpr char records[] = "0 to 10000000";

template <auto Field, std::uint64_t Most = most_records, std::uint64_t Least = 0>
bool take_number(std::string_view value, options &asked) {
  std::uint64_t number = 0;
  const auto [end, error] = std::from_chars(value.data(), value.data() + value.size(), number);
  if (error != std::errc() || end != value.data() + value.size()) return false;
  asked.*Field = static_cast<std::remove_reference_t<decltype(asked.*Field)>>(number);
  return number >= Least && number <= Most;
}

// Seconds, with decimals or without, in milliseconds.
bool parse_seconds(std::string_view text, std::uint32_t least, std::uint32_t most,
                   std::uint32_t &milliseconds) {
  double seconds = 0;
  const auto [end, error] =
      std::from_chars(text.data(), text.data() + text.size(), seconds, std::chars_format::fixed);
  if (error != std::errc() || end != text.data() + text.size()) return false;
  // In this order a number that is none is refused.
  if (!(seconds * 1000 >= least && seconds * 1000 <= most)) return false;
  milliseconds = static_cast<std::uint32_t>(std::lround(seconds * 1000));
  return true;
}

template <auto Field, std::uint32_t Least, std::uint32_t Most>
bool take_seconds(std::string_view value, options &asked) {
  return parse_seconds(value, Least, Most, asked.*Field);
}

// NAME or NAME@SECONDS.
bool take_incident(std::string_view word, options &asked) {
  const std::size_t end = word.find('@');
  const auto known = std::ranges::find(incidents, word.substr(0, end), &incident::name);
  std::uint32_t begins = 0;
  if (known == incidents.end()) return false;
  if (end != word.npos && !parse_seconds(word.substr(end + 1), 0, longest, begins)) return false;
  asked.incidents.push_back({&*known, begins});
  return true;
}

// A name that stands in one line, as a kernel has it.
bool take_host(std::string_view value, options &asked) {
  constexpr std::size_t most = 64;
  asked.host = value;
  const auto is_text = [](char c) { return c > ' ' && c < 0x7f; };
  return !asked.host.empty() && asked.host.size() <= most && std::ranges::all_of(asked.host, is_text);
}

int list_incidents() {
  for (const incident &row : incidents) print<"%-16s %s\n">(row.name, row.story);
  report.flush();
  return EXIT_SUCCESS;
}

bool take_redact(std::string_view /*value*/, options &asked) {
  return asked.redact = true;
}

constexpr command command_rows[] = {
    {in_generate, "generate", "DIR", "make one snapshot", generate},
    {in_simulate, "simulate", "DIR", "make one and keep it moving until interrupted", simulate},
    {in_run, "run", "[DIR] -- COMMAND...", "run COMMAND on DIR, or on a simulation of its own", run},
    {in_capture, "capture", "DIR", "save the tables of the kernel in sight, once or N times", capture},
};

constexpr unsigned in_worlds = in_generate | in_simulate | in_run;

constexpr option_row option_rows[] = {
    {in_worlds, "--providers", "N", records, "nexus providers (9)", take_number<&sizes::providers>},
    {in_worlds, "--nexuses", "N", records, "nexus instances (about 3 for 2 providers)",
     take_number<&sizes::nexuses>},
    {in_worlds, "--channels", "N", records, "channels (28)", take_number<&sizes::channels>},
    {in_worlds, "--rings", "N", "0 to 1024", "rings of each channel (2)", take_number<&sizes::rings, 1024>},
    {in_worlds, "--flows", "N", records, "flows (60)", take_number<&sizes::flows>},
    {in_worlds, "--stacks", "N", records, "user-space stacks (one per flow channel and switch)",
     take_number<&sizes::stacks>},
    {in_worlds, "--arenas", "N", records, "memory arenas (10)", take_number<&sizes::arenas>},
    {in_worlds, "--namespaces", "N", records, "port namespaces (14)", take_number<&sizes::namespaces>},
    {in_worlds, "--processes", "N", records, "processes (13)", take_number<&sizes::processes>},
    {in_worlds, "--seed", "N", "0 to 18446744073709551615", "what chance begins with (1)",
     take_number<&options::seed, UINT64_MAX>},
    {in_worlds, "--host", "NAME", "1 to 64 printable characters", "what the machine is called", take_host},
    {in_worlds, "--incident", "NAME[@S]", "a name of --incident list, and when", "let something go wrong",
     take_incident},
    {in_generate, "--after", "SECONDS", "0 to 86400", "how long it has run",
     take_seconds<&options::after, 0, longest>},
    {in_simulate | in_run, "--interval", "MS", "10 to 3600000", "milliseconds between two snapshots (1000)",
     take_number<&options::interval, 3'600'000, 10>},
    {in_capture, "--every", "SECONDS", "0.01 to 3600", "the time between two moments",
     take_seconds<&options::every, 10, 3'600'000>},
    {in_capture, "--count", "N", "1 to 10000000", "how many moments",
     take_number<&options::count, most_records, 1>},
    {in_capture, "--redact", "", "", "put substitutes for addresses and names", take_redact},
};

// Says what is wrong with the command line. Returns false.
bool refuse(const std::string &what) {
  complain<"tarvellab: %s; see tarvellab --help\n">(foreign_text{what});
  return false;
}

// The options of some commands, those of the same ones below one heading.
void print_options(unsigned of) {
  unsigned above = 0;
  for (const option_row &row : option_rows) {
    if (!(row.in & of)) continue;
    if (std::exchange(above, row.in) != row.in) {
      print<"options of">();
      for (const command &each : command_rows) {
        if (each.bit & row.in) print<" %s">(each.name);
      }
      print<":\n">();
    }
    print<"  %-12s %-8s %s\n">(row.name, row.argument, row.meaning);
  }
}

// Prints what there is to know about some commands. Returns the exit status.
int help(unsigned of) {
  print<"usage:\n">();
  for (const command &row : command_rows) {
    if (row.bit & of) print<"  tarvellab %s [OPTION...] %s\n\t%s\n">(row.name, row.arguments, row.purpose);
  }
  print<"  tarvellab [COMMAND] --help\n  tarvellab --version\n">();
  print_options(of);
  report.flush();
  return EXIT_SUCCESS;
}

// Takes an option, with the word behind it where it wants one; `argument` is then the last word that was
// taken.
bool take_option(const command &of, char **&argument, options &asked) {
  const std::string name = *argument;
  const auto *known = std::ranges::find(option_rows, name, &option_row::name);
  if (known == std::end(option_rows) || !(known->in & of.bit))
    return refuse(std::string(of.name) + " has no option " + name);
  if (!known->argument.empty()) ++argument;
  if (*argument && known->take(*argument, asked)) return true;
  const std::string seen = *argument ? ", not '" + std::string(*argument) + "'" : "";
  return refuse(name + " takes " + std::string(known->values) + seen);
}

// Whether what is asked for is complete and goes together. `shape` is the last option, if there was one.
bool is_whole(const command &row, const options &asked, const std::string &shape) {
  const std::string name(row.name);
  if (row.bit != in_run && asked.directory.empty()) return refuse(name + " takes a directory");
  if ((asked.count == 0) != (asked.every == 0)) return refuse("--count and --every go together");
  if (row.bit != in_run) return true;
  if (!asked.command || !*asked.command) return refuse(name + " takes a command, behind --");
  if (shape.empty() || asked.directory.empty()) return true;
  return refuse(shape + " is for a kernel to be made, and " + asked.directory + " is there");
}

// Reads the words behind a command's name. False, after a message, where they are wrong.
bool parse(const command &row, char **argument, options &asked) {
  std::string shape;
  for (; *argument; ++argument) {
    const std::string_view word = *argument;
    if (word == "--" && row.bit == in_run) {
      asked.command = argument + 1;
      break;
    }
    if (word.starts_with('-')) {
      shape = word;
      if (!take_option(row, argument, asked)) return false;
    } else if (word.empty() || !asked.directory.empty()) {
      return refuse(std::string(row.name) + " takes one directory, and '" + *argument + "' cannot be it");
    } else {
      asked.directory = word;
    }
  }
  return is_whole(row, asked, shape);
}

}  // namespace

const std::span<const command> commands = command_rows;
const std::span<const option_row> known_options = option_rows;

int run_command_line(int argc, char **argv) {
  const std::string_view word = argc > 1 ? argv[1] : "--";
  if (word == "--help") return help(~0U);
  if (word == "--version") {
    print<"tarvellab %s\n">(TARVELCTL_VERSION);
    report.flush();
    return EXIT_SUCCESS;
  }
  const auto *row = std::ranges::find(command_rows, word, &command::name);
  if (row == std::end(command_rows)) {
    refuse(argc > 1 ? "there is no command '" + std::string(word) + "'" : "a command is missing");
    return exit_status::usage;
  }
  const bool makes_world = row->bit & in_worlds;
  if (makes_world && argc == 4 && argv[2] == std::string_view("--incident") &&
      argv[3] == std::string_view("list"))
    return list_incidents();
  // In front of what is another command's.
  for (char **each = argv + 2; *each && *each != std::string_view("--"); ++each) {
    if (*each == std::string_view("--help")) return help(row->bit);
  }
  options asked;
  return parse(*row, argv + 2, asked) ? row->handler(asked) : exit_status::usage;
}

}  // namespace lab
