// Runs commands inside the fuzzer's process, over tables in memory.
//
// The kernel, the process query, the name services, the clock's sleep and the ways out of the process are
// replaced (harness.cpp); everything between them and the output's descriptor is the program's own. An
// execution ends by a return, by an assertion about a kernel table, by the end of the watch, or by exit();
// whatever else happens is a finding.

#ifndef TARVELCTL_TESTS_FUZZ_HARNESS_H
#define TARVELCTL_TESTS_FUZZ_HARNESS_H

#include <cstddef>
#include <cstdint>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "common/text/guard.h"

namespace fuzz {

using bytes = std::span<const std::uint8_t>;

// What the program meets outside itself.
struct surroundings {
  struct table {
    std::string_view node;
    bytes content;
  };
  std::vector<table> tables;  // of equal names the next one answers after each read, the last one for ever
  std::string name;           // of every process and host; empty: nobody knows any
  format::guard reader = format::guard::none;  // what the reports go to
  bool files_can_open = false;                 // what -f gets
  int sleeps = 0;                              // how many are slept through; the next one ends the watch
};

struct outcome {
  std::string report, diagnostics;
  const char *assertion = nullptr;  // the expression that did not hold
  bool has_exited = false;
  int status = 0;  // of the exit
};

// Runs a command line, the program's name included, in these surroundings. The outcome is overwritten by the
// next call.
const outcome &observe(const surroundings &around, std::vector<std::string> words);

// Ends the fuzzer with a message where it does not hold.
void expect(bool holds, const char *what, std::string_view seen = {});

// Whether a reader takes the text for printable characters alone, in the judgement of the C library.
bool is_plain(std::string_view text, format::guard reader);

// Expects whole lines, and on a terminal nothing that drives it but the program's own colours.
void expect_readable(std::string_view text, format::guard reader);

}  // namespace fuzz

#endif
