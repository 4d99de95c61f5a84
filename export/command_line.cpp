#include "export/command_line.h"

#include <algorithm>
#include <charconv>
#include <cmath>
#include <cstdlib>
#include <cstring>

#include "common/text/output.h"
#include "common/text/text.h"

namespace exporter {

namespace {

bool take_every(const char *value, options &asked) {
  const std::string_view text = value;
  double seconds = 0;
  const auto [end, error] =
      std::from_chars(text.data(), text.data() + text.size(), seconds, std::chars_format::fixed);
  if (error != std::errc() || end != text.data() + text.size()) return false;
  constexpr double least = 0.01, most = 1e6;
  if (!(seconds >= least && seconds <= most)) return false;  // in this order a number that is none is refused
  asked.every = std::llround(seconds * 1000);
  return true;
}

bool take_count(const char *value, options &asked) {
  const std::string_view text = value;
  const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), asked.count);
  return error == std::errc() && end == text.data() + text.size() && asked.count > 0;
}

bool take_file(const char *value, options &asked) {
  asked.file = value;
  return *value != '\0';
}

bool take_host(const char *value, options &asked) {
  asked.host = value;
  return true;
}

bool take_capture(const char *value, options &asked) {
  asked.capture = value;
  return *value != '\0';
}

bool take_clickhouse(const char * /*value*/, options &asked) {
  return asked.clickhouse = true;
}

constexpr command command_rows[] = {
    {in_json, "json", "[TABLE...]", "write tables as JSON, a line for each record", write_lines},
    {in_schema, "schema", "", "say what keys the lines have, and what they mean", print_schema},
};

constexpr option_row option_rows[] = {
    {in_json, "--every", "SECONDS", "a time from 0.01 to 1000000", "repeat, for as long as someone reads",
     take_every},
    {in_json, "--count", "N", "a number from 1 to 18446744073709551615", "how often, with --every",
     take_count},
    {in_json, "-o", "FILE", "a name", "replace FILE, when all is written", take_file},
    {in_json, "--host", "NAME", "a name", "say that the kernel has this name", take_host},
    {in_json, "--capture", "DIR", "a directory", "write all moments of a capture", take_capture},
    {in_schema, "--clickhouse", "", "", "as statements for ClickHouse, which make tables for the lines",
     take_clickhouse},
};

// Says what is wrong with the command line. Returns false.
bool refuse(const std::string &what) {
  complain<"tarvelexport: %s; see tarvelexport --help\n">(foreign_text{what});
  return false;
}

int help() {
  print<"usage:\n">();
  for (const command &row : command_rows) {
    print<"  tarvelexport %s [OPTION...] %s\n\t%s\n">(row.name, row.arguments, row.purpose);
  }
  print<"  tarvelexport --help\n  tarvelexport --version\n">();
  for (const command &row : command_rows) {
    print<"options of %s:\n">(row.name);
    for (const option_row &each : option_rows) {
      if (each.in & row.bit) print<"  %-12s %-8s %s\n">(each.name, each.argument, each.meaning);
    }
  }
  print<"tables, all unless some are named:\n ">();
  for (const kind &each : all_kinds()) print<" %s">(each.name);
  print<"\n">();
  return EXIT_SUCCESS;
}

int version() {
  print<"tarvelexport %s\n">(TARVELCTL_VERSION);
  return EXIT_SUCCESS;
}

// Takes an option, with the word behind it where it wants one; `argument` is then the last word that was
// taken.
bool take_option(const command &of, char **&argument, options &asked) {
  const std::string name = *argument;
  const auto *known = std::ranges::find(option_rows, name, &option_row::name);
  if (known == std::end(option_rows) || !(known->in & of.bit)) {
    return refuse(std::string(of.name) + " has no option " + name);
  }
  if (!known->argument.empty()) ++argument;
  if (*argument && known->take(*argument, asked)) return true;
  const std::string seen = *argument ? ", not '" + std::string(*argument) + "'" : "";
  return refuse(name + " takes " + std::string(known->values) + seen);
}

bool take_table(const command &of, const std::string &name, options &asked) {
  if (of.bit != in_json) return refuse(std::string(of.name) + " takes no '" + name + "'");
  const auto found = std::ranges::find(all_kinds(), name, &kind::name);
  if (found == all_kinds().end()) return refuse("there is no table '" + name + "'");
  asked.kinds.push_back(&*found);
  return true;
}

// Whether what is asked for goes together.
bool fits_together(const options &asked) {
  if (asked.count && !asked.every) return refuse("--count is for --every");
  if (!asked.file.empty() && asked.every && !asked.count) return refuse("-o with --every takes --count");
  if (!asked.capture.empty() && asked.every)
    return refuse("--every is not for --capture, which has its moments");
  return true;
}

// Reads the words behind a command's name. False, after a message, where they are wrong.
bool parse(const command &row, char **argument, options &asked) {
  for (; *argument; ++argument) {
    if (**argument == '-' ? !take_option(row, argument, asked) : !take_table(row, *argument, asked))
      return false;
  }
  // The kinds lie in their order.
  std::ranges::sort(asked.kinds);
  asked.kinds.erase(std::unique(asked.kinds.begin(), asked.kinds.end()), asked.kinds.end());
  return fits_together(asked);
}

// Runs a command, or what is asked about all of them. The report is not yet all written.
int run(char **word) {
  const std::string_view name = *word ? *word : "";
  for (char **each = word; *each; ++each) {
    if (*each == std::string_view("--help")) return help();
    if (*each == std::string_view("--version")) return version();
  }
  const auto *row = std::ranges::find(command_rows, name, &command::name);
  options asked;
  if (row == std::end(command_rows)) {
    refuse(*word ? "there is no command '" + std::string(name) + "'" : "a command is missing");
  } else if (parse(*row, word + 1, asked)) {
    return row->handler(asked);
  }
  return exit_status::usage;
}

}  // namespace

const std::span<const command> commands = command_rows;
const std::span<const option_row> known_options = option_rows;

int run_command_line(int argc, char **argv) {
  const int status = run(argv + (argc > 0));
  report.close();
  return status;
}

}  // namespace exporter
