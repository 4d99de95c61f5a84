// What the files of the fuzzer share.

#ifndef TARVELCTL_TESTS_FUZZ_FUZZ_H
#define TARVELCTL_TESTS_FUZZ_FUZZ_H

#include <string_view>

#include "common/moment.h"

// Ends the process with a finding, unless `holds`.
void expect(bool holds, const char *what, std::string_view text);

// Compares two moments of one table, and judges what is said to have changed.
void judge_changes(const moment &before, const moment &now);

#endif
