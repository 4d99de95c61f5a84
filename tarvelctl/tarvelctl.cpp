// The front end: global options, the choice of a command, the watch loop, the ways out.

#include <fcntl.h>
#include <strings.h>
#include <time.h>
#include <unistd.h>

#include <cerrno>
#include <climits>
#include <cstdlib>
#include <cstring>
#include <string_view>
#include <vector>

#include "common/text/interrupt.h"
#include "common/text/memory.h"
#include "common/text/output.h"
#include "common/text/output_helpers.h"
#include "tarvelctl/command.h"

const char *progname = "";
int refresh_interval = 0;
bool output_redirected = false;

namespace {

// The normal way out: what is printed reaches its destination, then status 0.
[[noreturn]] void finish() {
  report.close();
  std::exit(EXIT_SUCCESS);
}

[[noreturn]] void usage() {
  complain<"usage: %s [global options] <command> [args]\n">(progname);
  complain<"\nGlobal options:\n">();
  complain<"\t-f <output_file>\tWrite output to <file>\n">();
  complain<"\t-w <seconds>    \tRefresh every <seconds>\n">();
  complain<"\nCommand:\n">();
  for (const command_entry *row = command_table; row->name; ++row) complain<"\t%s\n">(row->name);
  std::exit(exit_status::usage);
}

void redirect_output(const char *path) {
  const int fd = open(path, O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0666);
  if (fd < 0) {
    complain<"Couldn't open file %s:%s\n">(path, std::strerror(errno));
    std::exit(exit_status::usage);
  }
  report.redirect(fd);
  output_redirected = true;
}

// Seconds between two runs, as the user gives them.
int parse_interval(const char *text) {
  char *end;
  errno = 0;
  const long value = std::strtol(text, &end, 10);
  if (end == text || *end || errno == ERANGE || value < 0 || value > INT_MAX) usage();
  return static_cast<int>(value);
}

// Acts on the global options, which may stand anywhere, and removes them with their values. Returns how many
// entries are left.
int take_global_options(int argc, char **argv) {
  int kept = 0;
  for (int i = 0; i < argc; ++i) {
    const std::string_view entry = argv[i];
    if (entry != "-f" && entry != "-w") {
      argv[kept++] = argv[i];
      continue;
    }
    if (++i == argc) usage();
    if (entry == "-f") {
      redirect_output(argv[i]);
    } else {
      refresh_interval = parse_interval(argv[i]);
    }
  }
  return kept;
}

const command_entry &find_command(const char *word) {
  for (const command_entry *row = command_table; row->name; ++row) {
    if (strcasecmp(row->name, word) == 0) return *row;
  }
  usage();
}

void print_timestamp() {
  const time_t now = time(nullptr);
  char text[100] = "";
  // Other than localtime_r(), this looks each time whether the system's time zone has changed.
  if (const tm *local = localtime(&now)) strftime(text, sizeof text, "%Y-%m-%d %H:%M:%S", local);
  print<"\n%s\n">(highlight(text, colour::cyan));
}

// One run of a watch. The option parser permutes the vector that it scans, and each run is to see the words
// as they were typed.
int run_on_copy(command_handler handler, int argc, char **argv) {
  std::vector<char *> words(argv, argv + argc);
  return handler(argc, words.data());
}

[[noreturn]] void watch(command_handler handler, int argc, char **argv) {
  for (;;) {
    print_timestamp();
    report.flush();  // the option parser writes to standard error by itself
    optind = 0;      // parse the options afresh, and forget where inside a word the last scan ended
    if (run_on_copy(handler, argc, argv) != 0) finish();
    report.flush();
    sleep(static_cast<unsigned>(refresh_interval));
  }
}

}  // namespace

void run_command_line(int argc, char **argv) {
  end_on_interrupt();
  attach_standard_outputs();
  make_new_fail_fast();
  unsetenv("POSIXLY_CORRECT");  // for the option parser, options would end at the first operand

  if (argc > 0) {
    const char *slash = std::strrchr(argv[0], '/');
    progname = slash ? slash + 1 : argv[0];
  }
  if (argc < 2) usage();
  ++argv;
  argc = take_global_options(argc - 1, argv);
  if (argc == 0) usage();

  const command_entry &command = find_command(argv[0]);
  if (command.min_args >= argc) {
    complain<"usage: %s %s %s\n">(progname, command.name, command.usage_text ? command.usage_text : "");
    std::exit(exit_status::usage);
  }
  if (refresh_interval != 0) watch(command.handler, argc, argv);
  command.handler(argc, argv);
  finish();
}
