#include "tests/fuzz/harness.h"

#include <fcntl.h>
#include <getopt.h>
#include <iconv.h>
#include <netdb.h>
#include <setjmp.h>
#include <signal.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "common/text/invariant.h"
#include "common/text/output.h"
#include "platform/descriptor.h"
#include "platform/process.h"
#include "platform/sysctl.h"
#include "tarvelctl/netstat_options.h"

// The regions that the process has seen are forgotten between two executions: only this file can name them.
#include "tarvelctl/memory.cpp"  // NOLINT(bugprone-suspicious-include)

namespace fuzz {

namespace {

struct assertion_failed {
  const char *expression;
};
struct watch_ended {};

const surroundings nowhere;
const surroundings *around = &nowhere;
std::vector<std::string> reads;  // the nodes, in their order
int sleeps_left;
outcome result;
int report_fd, diagnostics_fd;
thread_local bool is_observed = false;  // the fuzzer has a thread of its own
jmp_buf exit_point;

void attach_outputs() {
  report_fd = open("/dev/null", O_WRONLY | O_CLOEXEC);
  diagnostics_fd = fcntl(STDERR_FILENO, F_DUPFD_CLOEXEC, 100);
  report.attach(report_fd);
  diagnostics.attach(diagnostics_fd);
}

void forget_everything() {
  tv_region_set = region_set();
  netstat_options = {};
  progname = "";
  refresh_interval = 0;
  output_redirected = false;
  optind = 0;
  opterr = 0;
}

// The table that answers now, or null.
const surroundings::table *find_table(std::string_view node) {
  const surroundings::table *found = nullptr;
  auto turn = std::count(reads.begin(), reads.end(), node);
  for (const surroundings::table &each : around->tables) {
    if (each.node != node) continue;
    found = &each;
    if (turn-- == 0) break;
  }
  return found;
}

}  // namespace

const outcome &observe(const surroundings &given, std::vector<std::string> words) {
  std::vector<char *> argv;
  argv.reserve(words.size() + 1);
  for (std::string &word : words) argv.push_back(word.data());
  argv.push_back(nullptr);
  around = &given;
  sleeps_left = given.sleeps;
  reads.clear();
  result = {};
  forget_everything();
  is_observed = true;
  attach_outputs();
  if (setjmp(exit_point) == 0) {
    try {
      run_command_line(static_cast<int>(words.size()), argv.data());
    } catch (const assertion_failed &failure) {
      result.assertion = failure.expression;
    } catch (const watch_ended &) {
    }
  }
  is_observed = false;
  if (!result.has_exited) report.flush();
  close(report_fd);
  close(diagnostics_fd);
  around = &nowhere;
  return result;
}

void expect(bool holds, const char *what, std::string_view seen) {
  if (holds) return;
  std::fprintf(stderr, "FINDING: %s: %.*s\n", what, static_cast<int>(seen.size()), seen.data());
  std::abort();
}

// What judges is not a way for the fuzzer to find, and a quarter of its time if it were one.

[[clang::no_sanitize("coverage")]] bool is_plain(std::string_view text, format::guard reader) {
  static const iconv_t decoders[] = {iconv_open("UTF-32LE", "ISO-8859-1"), iconv_open("UTF-32LE", "UTF-8")};
  const iconv_t decoder = decoders[reader == format::guard::utf8];
  std::u32string decoded(text.size(), U'\0');
  char *from = const_cast<char *>(text.data()), *to = reinterpret_cast<char *>(decoded.data());
  std::size_t bytes_left = text.size(), room = 4 * decoded.size();
  iconv(decoder, nullptr, nullptr, nullptr, nullptr);
  if (iconv(decoder, &from, &bytes_left, &to, &room) != 0) return false;
  decoded.resize(decoded.size() - room / 4);
  constexpr char32_t obeyed[][2] = {{0, 0x1f}, {0x7f, 0x9f}, {0x2028, 0x202e}, {0x2066, 0x2069}};
  for (const char32_t code : decoded) {
    for (const auto &[first, last] : obeyed) {
      if (code >= first && code <= last) return false;
    }
  }
  return true;
}

[[clang::no_sanitize("coverage")]] void expect_readable(std::string_view text, format::guard reader) {
  expect(text.empty() || text.back() == '\n', "the last line has no end", text);
  if (reader == format::guard::none) return;
  std::string rest(text);
  for (std::size_t at = 0; at < text.size(); ++at) {
    if (text[at] == '\n' || text[at] == '\t') rest[at] = ' ';
    if (text[at] != '\033') continue;
    const std::size_t end = text.find_first_not_of("0123456789;", at + 2);
    expect(text[at + 1] == '[' && end != text.npos && text[end] == 'm', "a terminal is driven", text);
    rest[at] = ' ';
  }
  expect(is_plain(rest, reader), "a terminal gets more than characters", text);
}

}  // namespace fuzz

using fuzz::around;

void require(bool holds, const invariant &broken) {
  if (holds) return;
  report.flush();
  throw fuzz::assertion_failed{broken.expression};
}

namespace platform {

bool query_process_name(int pid, char (&name)[process_name_size]) {
  if (pid <= 0 || around->name.empty()) return false;
  const std::size_t size = std::min(around->name.size(), process_name_size - 1);
  std::memcpy(name, around->name.data(), size);
  name[size] = '\0';
  return true;
}

bool make_writes_nonblocking(int /*fd*/) {
  return true;
}

}  // namespace platform

extern "C" {

int sysctlbyname(const char *name, void *old_value, std::size_t *old_length, const void * /*new_value*/,
                 std::size_t /*new_length*/) {
  const auto *table = fuzz::find_table(name);
  if (!table) {
    errno = ENOENT;
    return -1;
  }
  if (old_value && table->content.size() > *old_length) {
    errno = ENOMEM;
    return -1;
  }
  *old_length = table->content.size();
  if (!old_value) return 0;
  std::copy(table->content.begin(), table->content.end(), static_cast<std::uint8_t *>(old_value));
  fuzz::reads.emplace_back(name);
  return 0;
}

// What the linker puts in the place of the C library's functions; theirs have "__real_" in front.
// NOLINTBEGIN(bugprone-reserved-identifier)

[[noreturn]] void __real_exit(int status);
ssize_t __real_write(int fd, const void *data, std::size_t size);
int __real_open(const char *path, int flags, ...);
int __real_isatty(int fd);
unsigned __real_sleep(unsigned seconds);
int __real_sigaction(int number, const struct sigaction *action, struct sigaction *old);

[[noreturn]] void __wrap_exit(int status) {
  if (!fuzz::is_observed) __real_exit(status);
  fuzz::result.has_exited = true;
  fuzz::result.status = status;
  longjmp(fuzz::exit_point, 1);
}

ssize_t __wrap_write(int fd, const void *data, std::size_t size) {
  if (!fuzz::is_observed || (fd != fuzz::report_fd && fd != fuzz::diagnostics_fd))
    return __real_write(fd, data, size);
  (fd == fuzz::report_fd ? fuzz::result.report : fuzz::result.diagnostics)
      .append(static_cast<const char *>(data), size);
  return static_cast<ssize_t>(size);
}

int __wrap_open(const char *path, int flags, unsigned mode) {
  if (!fuzz::is_observed || !(flags & O_CREAT)) return __real_open(path, flags, mode);
  if (around->files_can_open) return __real_open("/dev/null", O_WRONLY | O_CLOEXEC);
  errno = EACCES;
  return -1;
}

int __wrap_isatty(int fd) {
  return fuzz::is_observed ? around->reader != format::guard::none : __real_isatty(fd);
}

format::guard __wrap__ZN6format14terminal_guardEv() {
  return around->reader;
}

unsigned __wrap_sleep(unsigned seconds) {
  if (!fuzz::is_observed) return __real_sleep(seconds);
  if (fuzz::sleeps_left-- <= 0) throw fuzz::watch_ended();
  return 0;
}

int __wrap_sigaction(int number, const struct sigaction *action, struct sigaction *old) {
  return fuzz::is_observed ? 0 : __real_sigaction(number, action, old);
}

void __wrap__Z23attach_standard_outputsv() {}

hostent *__wrap_gethostbyaddr(const void * /*address*/, socklen_t /*size*/, int /*family*/) {
  static std::string name;
  static hostent host;
  name = around->name;
  host.h_name = name.data();
  return name.empty() ? nullptr : &host;
}

netent *__wrap_getnetbyaddr(std::uint32_t /*number*/, int /*family*/) {
  return nullptr;
}

servent *__wrap_getservbyport(int /*port*/, const char * /*protocol*/) {
  static std::string name;
  static servent service;
  name = around->name;
  service.s_name = name.data();
  return name.empty() ? nullptr : &service;
}

int __wrap_getnameinfo(const sockaddr * /*address*/, socklen_t /*size*/, char *host, socklen_t host_size,
                       char * /*service*/, socklen_t /*service_size*/, int /*flags*/) {
  if (around->name.empty()) return EAI_NONAME;
  std::snprintf(host, host_size, "%.*s", static_cast<int>(around->name.size()), around->name.data());
  return 0;
}

int __wrap_gethostname(char *name, std::size_t size) {
  std::snprintf(name, size, "lab.example.net");
  return 0;
}

// NOLINTEND(bugprone-reserved-identifier)

}  // extern "C"
