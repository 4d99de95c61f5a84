// Running the real program, as a user or a script would.

#ifndef TARVELCTL_TESTS_SUPPORT_RUN_H
#define TARVELCTL_TESTS_SUPPORT_RUN_H

#include <sys/types.h>

#include <functional>
#include <initializer_list>
#include <iosfwd>
#include <map>
#include <string>
#include <vector>

#include "tests/support/kernel_dir.h"

// What a run left behind.
struct run_result {
  std::string out;
  std::string err;
  int status = 0;  // exit status, or -N where signal N ended the process

  bool operator==(const run_result &) const = default;
};

void PrintTo(const run_result &result, std::ostream *to);

// Expected results: a report and nothing else; diagnostics, and the report in front of them if any.
run_result printed(std::string out);
run_result complained(std::string err, int status = 0, std::string out = "");

// A run that ends at the invariant of an inconsistent table, after the report in front of it.
run_result inconsistent(const std::string &function, int line, const std::string &expression,
                        std::string out = "", const std::string &file = "tarvelctl/tarvelctl");

// A command line without the program's name: a text, split at blanks, or one text per word.
struct words : std::vector<std::string> {
  words(const char *line);
  words(const std::string &line) : words(line.c_str()) {}
  words(std::initializer_list<std::string> list) : std::vector<std::string>(list) {}
};

// A run under way.
struct running {
  pid_t pid;
  const std::string &out;
  const std::string &err;
};

struct run_options {
  bool terminal = false;              // standard output is a terminal
  bool merged = false;                // standard error goes where standard output goes
  bool reader_leaves = false;         // the reader of standard output closes it after its first read
  std::string stdout_path{};          // standard output is this file, and `out` stays empty
  std::vector<int> closed{};          // standard descriptors that are closed at the start
  std::vector<int> ignored{};         // signals that the caller has ignored
  std::string program_name{};         // in place of the program's path, as its first argument
  std::filesystem::path directory{};  // where it runs
  std::function<void()> prepare{};    // called in the process before it starts
  std::map<std::string, std::string> environment{};  // beside that of the test, in the C locale
  std::function<void(const running &)> meanwhile{};  // called at least every few milliseconds
};

// Runs `tarvelctl` on a kernel and waits for its end.
run_result run_tarvelctl(const kernel_dir &kernel, const words &line, const run_options &options = {});

// How often `part` appears in `text`.
std::size_t count_of(const std::string &text, const std::string &part);

// The text with "<time>" in the place of every date and time such as "2026-02-28 23:59:59".
std::string hide_times(const std::string &text);

// For run_options::meanwhile: sends SIGINT once `text` has appeared `times` times on the two outputs
// together.
std::function<void(const running &)> interrupt_after(std::size_t times, const std::string &text);

#endif
