// The whole program inside the fuzzer's process, over tables in memory.
//
// The kernel, the process query, the name services, the sleep and the ways out of the process are replaced;
// everything between them and the output's descriptor is the program's own. An execution ends by an assertion
// about a kernel table, the end of the watch, or exit(); whatever else happens is a finding.
//
// An input begins with a header: three sizes, three nodes, the surroundings. Behind it stand a command line,
// each word ended by a NUL, and the tables of the nodes. What is no node of an input is an empty table. Where
// the surroundings say so, the last two tables are those of the last node at two moments, which are compared:
// in the place of a command line stand their times.

#include <fcntl.h>
#include <getopt.h>
#include <setjmp.h>
#include <unistd.h>
#include <uuid/uuid.h>

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>
#include <string_view>
#include <vector>

#include "common/tables/tables.h"
#include "common/text/output.h"
#include "platform/process.h"
#include "platform/sysctl.h"
#include "tarvelctl/netstat_options.h"
#include "tests/fuzz/fuzz.h"

// The regions that the process has seen are forgotten between two executions: only this file can name them.
#include "tarvelctl/memory.cpp"  // NOLINT(bugprone-suspicious-include)

// What follows is not a way for the fuzzer to find.
#pragma clang attribute push([[clang::no_sanitize("coverage")]], apply_to = function)

namespace {

struct table {
  std::string_view node, content;
};

// What the program meets outside itself.
struct {
  std::vector<table> tables;  // of equal nodes each answers one read, the last one every other
  std::string_view process;   // the name of every process; none: nobody knows any
  bool has_terminal;          // for its report
  bool files_can_open;        // what -f gets
  int sleeps = 2;             // how many are slept through; the next one ends the watch
} world;

// What has been seen of an execution.
struct {
  std::string report, diagnostics;
  std::string_view assertion;  // the expression that did not hold
  int status;
} seen;

// How the program is left where it has more to do.
struct ended {
  std::string_view assertion;
};

bool is_running = false;
jmp_buf way_out;

// Runs a command line, the program's name included: words, each ended by a NUL.
void run(std::string line) {
  std::vector<char *> argv;
  for (char *word = line.data(); word < line.data() + line.size(); word += std::strlen(word) + 1)
    argv.push_back(word);
  const auto count = static_cast<int>(argv.size());
  argv.push_back(nullptr);
  tv_region_set = region_set();
  netstat_options = {};
  progname = "";
  refresh_interval = optind = opterr = 0;
  output_redirected = false;
  seen = {};
  is_running = true;
  if (setjmp(way_out) == 0) {
    try {
      run_command_line(count, argv.data());
    } catch (const ended &end) {
      seen.assertion = end.assertion;
    }
  }
  is_running = false;
  diagnostics.close();
}

// Whether a report has no control characters but line ends, tabulators and the program's own colours.
bool is_plain(std::string text) {
  for (const std::string_view own : {"\n", "\t", "\033[0m", "\033[31m", "\033[36m"}) {
    for (std::size_t at = 0; (at = text.find(own, at)) != text.npos;)
      text.replace(at, own.size(), own.size(), ' ');
  }
  return std::none_of(text.begin(), text.end(),
                      [](unsigned char byte) { return byte < 0x20 || byte == 0x7f; });
}

// What a table may break.
constexpr std::string_view assertions =
    "(length % sizeof (*sf)) == 0;(length % width) == 0;0;scan == (buffer + length);sfa->sfa_entries_count "
    "<= 512;"
    "sfo == (buffer + length);sfr == (buffer + length)";

void judge(std::size_t size) {
  const std::string_view report = seen.report;
  expect(report.empty() || report.back() == '\n', "the last line has no end", report);
  expect(report.size() <= 4096 + 100 * size, "the report is far larger than the tables", report);
  expect(!world.has_terminal || is_plain(seen.report), "a terminal gets more than characters", report);
  expect(assertions.find(seen.assertion) != assertions.npos, "an assertion without a name", seen.assertion);
  expect(seen.status == 0 || (seen.status == exit_status::usage && !seen.diagnostics.empty()),
         "an exit status of no meaning", seen.diagnostics);
}

std::string_view take(std::string_view &input, std::size_t size) {
  const std::string_view taken = input.substr(0, size);
  input.remove_prefix(taken.size());
  return taken;
}

// Has the two tables of one node read one after the other.
void compare(const table_description &table, std::string_view times) {
  std::int64_t at[2]{};
  times.copy(reinterpret_cast<char *>(at), sizeof at);
  world.tables = {{table.node, world.tables[1].content}, {table.node, world.tables[2].content}};
  const table_description *const wanted[] = {&table};
  moment before = read_moment(wanted), now = read_moment(wanted);
  before.tables[0].monotonic = at[0];
  now.tables[0].monotonic = at[1];
  judge_changes(before, now);
}

}  // namespace

void expect(bool holds, const char *what, std::string_view text) {
  if (holds) return;
  std::fprintf(stderr, "FINDING: %s: %.*s\n", what, static_cast<int>(text.size()), text.data());
  std::abort();
}

extern "C" int LLVMFuzzerInitialize(int * /*argc*/, char *** /*argv*/) {
  setenv("LC_ALL", "C.UTF-8", 1);
  setenv("NAME_SERVICES_ANSWER", "\033[2J\u202e and more than a column holds", 1);
  return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
  struct {
    std::uint16_t sizes[3];  // of the command line and the first two tables
    std::uint8_t nodes[3];   // rows of all_tables
    std::uint8_t surroundings;
  } header{};
  std::string_view rest(reinterpret_cast<const char *>(data), size);
  take(rest, sizeof header).copy(reinterpret_cast<char *>(&header), sizeof header);
  const std::string line(take(rest, header.sizes[0]));
  world = {};
  for (std::size_t i = 0; i < 3; ++i) {
    const char *node = all_tables[header.nodes[i] % std::size(all_tables)].node;
    world.tables.push_back({node, i < 2 ? take(rest, header.sizes[i + 1]) : rest});
  }
  if (header.surroundings & 16) {
    compare(all_tables[header.nodes[2] % std::size(all_tables)], line);
    return 0;
  }
  world.tables.push_back({ring_stat_enable_node, header.surroundings & 8 ? std::string_view("\0", 1) : "\1"});
  world.has_terminal = header.surroundings & 1;
  if (header.surroundings & 2) world.process = rest.substr(0, 20);
  world.files_can_open = !(header.surroundings & 4);
  run(line);
  judge(size);
  return 0;
}

// What takes the place of the program's own functions, and, by CMakeLists.txt, of the C library's.

void require(bool holds, const invariant &broken) {
  if (holds) return;
  report.flush();
  throw ended{broken.expression};
}

bool platform::query_process_name(int pid, char (&name)[process_name_size]) {
  if (pid <= 0 || world.process.empty()) return false;
  std::snprintf(name, sizeof name, "%.*s", static_cast<int>(world.process.size()), world.process.data());
  return true;
}

extern "C" {

int sysctlbyname(const char *name, void *old_value, std::size_t *old_length, const void * /*new_value*/,
                 std::size_t /*new_length*/) {
  const auto is_asked = [&](const table &each) { return each.node == name; };
  const auto first = std::ranges::find_if(world.tables, is_asked);
  const std::string_view content = first == world.tables.end() ? "" : first->content;
  const bool fits = !old_value || content.size() <= *old_length;
  *old_length = content.size();
  if (!fits) errno = ENOMEM;
  if (!fits || !old_value) return fits ? 0 : -1;
  content.copy(static_cast<char *>(old_value), content.size());
  if (std::count_if(first, world.tables.end(), is_asked) > 1) world.tables.erase(first);
  return 0;
}

// Also where the fuzzer itself is done.
void exit(int status) {
  if (!is_running) _exit(status);
  seen.status = status;
  longjmp(way_out, 1);
}

ssize_t fuzz_write(int fd, const void *data, std::size_t size) {
  (fd == STDOUT_FILENO ? seen.report : seen.diagnostics).append(static_cast<const char *>(data), size);
  return static_cast<ssize_t>(size);
}

int fuzz_open(const char * /*path*/, int flags, ...) {  // NOLINT(cert-dcl50-cpp): as open() is declared
  if (!(flags & O_CREAT) || world.files_can_open) return open("/dev/null", O_WRONLY | O_CLOEXEC);
  errno = EACCES;
  return -1;
}

// What is random would make each run another one.
int fuzz_getentropy(void *to, std::size_t size) {
  std::memset(to, 1, size);
  return 0;
}

int fuzz_isatty(int /*fd*/) {
  return world.has_terminal;
}

unsigned fuzz_sleep(unsigned /*seconds*/) {
  if (world.sleeps-- > 0) return 0;
  throw ended{};
}

}  // extern "C"

#pragma clang attribute pop
