#include "lab/command_line.h"

#include <algorithm>
#include <charconv>
#include <cmath>
#include <cstdlib>
#include <string_view>

#include "common/text/output.h"
#include "lab/incidents.h"

namespace lab {

namespace {

constexpr std::uint32_t most_records = 10'000'000;
constexpr std::uint32_t longest = 86'400'000;  // milliseconds

struct number_option {
  std::string_view name;
  std::uint32_t sizes::*size;  // or null: the interval
  std::uint32_t least;
  std::uint32_t most;
  const char *meaning;
};

constexpr number_option number_options[] = {
    {"--providers", &sizes::providers, 0, most_records, "nexus providers (9)"},
    {"--nexuses", &sizes::nexuses, 0, most_records, "nexus instances (about 3 for 2 providers)"},
    {"--channels", &sizes::channels, 0, most_records, "channels (28)"},
    {"--rings", &sizes::rings, 0, 1024, "rings of each channel (2)"},
    {"--flows", &sizes::flows, 0, most_records, "flows (60)"},
    {"--stacks", &sizes::stacks, 0, most_records, "user-space stacks (one per flow channel and switch)"},
    {"--arenas", &sizes::arenas, 0, most_records, "memory arenas (10)"},
    {"--namespaces", &sizes::namespaces, 0, most_records, "port namespaces (14)"},
    {"--processes", &sizes::processes, 0, most_records, "processes (13)"},
    {"--interval", nullptr, 10, 3'600'000, "milliseconds between two snapshots (1000)"},
};

struct command {
  std::string_view name;
  const char *synopsis;
  const char *purpose;
  int (*handler)(const options &);
  bool needs_directory = false;
  bool makes_world = false;  // takes sizes, a seed, incidents and a name
  bool moves_world = false;  // takes an interval
  bool runs_command = false;
  bool captures = false;  // takes the times of moments and a wish to redact
};

constexpr command commands[] = {
    {.name = "generate",
     .synopsis = "DIR [sizes] [--seed N] [--host NAME] [--incident NAME[@SECONDS]]... [--after SECONDS]",
     .purpose = "make one snapshot",
     .handler = generate,
     .needs_directory = true,
     .makes_world = true},
    {.name = "simulate",
     .synopsis = "DIR [sizes] [--seed N] [--host NAME] [--incident NAME[@SECONDS]]... [--interval MS]",
     .purpose = "make one and keep it moving until interrupted",
     .handler = simulate,
     .needs_directory = true,
     .makes_world = true,
     .moves_world = true},
    {.name = "run",
     .synopsis = "[DIR | [sizes] [--seed N] [--host NAME] [--incident NAME[@SECONDS]]... [--interval MS]] -- "
                 "COMMAND...",
     .purpose = "run COMMAND on DIR, or on a simulation of its own",
     .handler = run,
     .makes_world = true,
     .moves_world = true,
     .runs_command = true},
    {.name = "capture",
     .synopsis = "DIR [--every SECONDS --count N] [--redact]",
     .purpose = "save the tables of the kernel in sight, once or N times",
     .handler = capture,
     .needs_directory = true,
     .captures = true},
};

int usage() {
  complain<"usage:\n">();
  for (const command &row : commands) {
    complain<"  tarvellab %s %s\n\t%s\n">(row.name, row.synopsis, row.purpose);
  }
  complain<"sizes and their defaults:\n">();
  for (const number_option &row : number_options) complain<"  %-12s N  %s\n">(row.name, row.meaning);
  return exit_status::usage;
}

template <class Number>
bool parse_number(const char *text, Number least, Number most, Number &number) {
  const std::string_view view = text ? text : "";
  const auto [end, error] = std::from_chars(view.data(), view.data() + view.size(), number);
  return error == std::errc() && end == view.data() + view.size() && number >= least && number <= most;
}

// Seconds, with decimals or without, in milliseconds.
bool parse_seconds(const char *text, std::uint32_t least, std::uint32_t most, std::uint32_t &milliseconds) {
  const std::string_view view = text ? text : "";
  double seconds = 0;
  const auto [end, error] =
      std::from_chars(view.data(), view.data() + view.size(), seconds, std::chars_format::fixed);
  if (error != std::errc() || end != view.data() + view.size()) return false;
  // In this order a number that is none is refused.
  if (!(seconds * 1000 >= least && seconds * 1000 <= most)) return false;
  milliseconds = static_cast<std::uint32_t>(std::lround(seconds * 1000));
  return true;
}

// NAME or NAME@SECONDS.
bool take_incident(const char *text, options &asked) {
  const std::string_view word = text ? text : "";
  const std::size_t end = word.find('@');
  const auto known = std::ranges::find(incidents, word.substr(0, end), &incident::name);
  std::uint32_t begins = 0;
  if (known == incidents.end()) return false;
  if (end != word.npos && !parse_seconds(text + end + 1, 0, longest, begins)) return false;
  asked.incidents.push_back({&*known, begins});
  return true;
}

int list_incidents() {
  for (const incident &row : incidents) print<"%-16s %s\n">(row.name, row.story);
  report.flush();
  return EXIT_SUCCESS;
}

// Takes one option with its value. False where the command does not know it or the value is no such number.
bool take_option(const command &row, std::string_view name, const char *value, options &asked) {
  if (name == "--seed")
    return row.makes_world && parse_number<std::uint64_t>(value, 0, UINT64_MAX, asked.seed);
  if (name == "--incident") return row.makes_world && take_incident(value, asked);
  if (name == "--host") return row.makes_world && !(asked.host = value ? value : "").empty();
  if (name == "--after") return row.handler == generate && parse_seconds(value, 0, longest, asked.after);
  if (name == "--every") return row.captures && parse_seconds(value, 10, 3'600'000, asked.every);
  if (name == "--count") return row.captures && parse_number(value, 1U, most_records, asked.count);
  for (const number_option &known : number_options) {
    if (known.name != name) continue;
    if (known.size ? !row.makes_world : !row.moves_world) return false;
    return parse_number(value, known.least, known.most, known.size ? asked.size.*known.size : asked.interval);
  }
  return false;
}

bool parse(const command &row, char **argument, options &asked) {
  bool shaped = false;
  for (; *argument; ++argument) {
    const std::string_view word = *argument;
    if (word == "--" && row.runs_command) {
      asked.command = argument + 1;
      break;
    }
    if (word == "--redact" && row.captures) {
      asked.redact = true;
    } else if (word.starts_with("--")) {
      if (!take_option(row, word, argument[1], asked)) return false;
      shaped = true;
      ++argument;
    } else if (word.empty() || !asked.directory.empty()) {
      return false;
    } else {
      asked.directory = word;
    }
  }
  if (row.needs_directory && asked.directory.empty()) return false;
  if (!row.runs_command) return (asked.count == 0) == (asked.every == 0);
  // A directory is there already: nothing is left to choose about it.
  return asked.command && *asked.command && !(shaped && !asked.directory.empty());
}

}  // namespace

int run_command_line(int argc, char **argv) {
  if (argc < 2) return usage();
  for (const command &row : commands) {
    options asked;
    if (row.name != argv[1]) continue;
    const bool asks =
        argc == 4 && std::string_view(argv[2]) == "--incident" && argv[3] == std::string_view("list");
    if (asks && row.makes_world) return list_incidents();
    return parse(row, argv + 2, asked) ? row.handler(asked) : usage();
  }
  return usage();
}

}  // namespace lab
