// The buffered output: whole rows, whatever their length, whoever reads them and whenever it is abandoned;
// and what commands print with.

#include <pty.h>
#include <signal.h>
#include <sys/wait.h>

#include <deque>

#include "common/text/output_helpers.h"
#include "tests/units/units.h"

// What becomes of the next writes: an error, or -N, where N bytes are taken, or an interrupt in front of it.
static std::deque<int> writes;
static constexpr int interrupted = INT_MAX;

extern "C" ssize_t __real_write(int fd, const void *data, std::size_t size);
extern "C" ssize_t __wrap_write(int fd, const void *data, std::size_t size) {
  const int outcome = writes.empty() ? -static_cast<int>(size) : writes.front();
  if (!writes.empty()) writes.pop_front();
  EXPECT_TRUE(outcome != interrupted || report.abandon() == 0);
  if (outcome > 0) errno = outcome == interrupted ? EINTR : outcome;
  return outcome > 0 ? -1 : __real_write(fd, data, static_cast<std::size_t>(-outcome));
}

namespace {

// The test's end of a terminal or a pipe, and the program's. Both stay open.
std::array<int, 2> open_device(bool is_terminal) {
  int ends[2];
  termios raw{};
  cfmakeraw(&raw);  // line ends arrive as they were written
  EXPECT_EQ(is_terminal ? openpty(&ends[0], &ends[1], nullptr, &raw, nullptr) : pipe2(ends, O_CLOEXEC), 0);
  return {ends[0], ends[1]};
}

TEST(output, RowThatDoesNotFitSendsTheLinesBeforeItAway) {
  const std::string line(1023, 'x');
  for (const auto &[lines, size, lines_gone] :
       {std::array{31UL, 1000UL, 0UL}, {31, 2400, 31}, {1, 9984, 1}, {31, 25'000, 31}, {0, 25'000, 0}}) {
    char storage[output::buffer_size];
    output out{storage, output::failure::fatal};
    const capture captured(out);
    std::string expected;
    for (std::size_t i = 0; i < lines; ++i, expected += line + "\n") format::print_to<"%s\n">(out, line);
    const std::string quarter(size, 'y');
    for (int i = 0; i < 4; ++i, expected += quarter) format::print_to<"%s">(out, quarter);
    EXPECT_EQ(captured.written().size(), lines_gone * 1024) << size;
    for (int i = 0; i < 99; ++i, expected += line + "\n") format::print_to<"%s\n">(out, line);
    EXPECT_EQ(captured.text(), expected);
  }
}

// Now and then a row is as long as a pipe takes at once, or longer.
const std::string rows = [] {
  std::string all;
  for (std::size_t i = 0; i < 30'000; ++i) {
    all.append(i % 1000 == 0 ? 3 * PIPE_BUF : i % 100 == 0 ? PIPE_BUF - 1 : i % 173, 'x') += '\n';
  }
  return all;
}();

// A process that prints all rows in pieces, and ends as the tool does where it is interrupted.
pid_t start_printing(int fd) {
  const pid_t pid = fork();
  if (pid != 0) return pid;
  alarm(60);
  signal(SIGINT, [](int) { _exit(report.abandon()); });
  const int flags = fcntl(fd, F_GETFD);
  report.attach(fd);
  std::istringstream lines(rows);
  for (std::string line; std::getline(lines, line); print<"\n">()) print<"%s">(line);
  const bool is_as_it_was = fcntl(fd, F_GETFD) == flags;
  for (int times = 0; times < 2; ++times) report.close();  // what is closed stays closed
  _exit(is_as_it_was ? 0 : 1);
}

// Without /proc, writes cannot be told not to wait.
TEST(output, SlowReaderGetsWholeRowsAndNeedNotBeWaitedFor) {
  for (int kind = 0; kind < 8; ++kind) {
    const bool is_terminal = kind & 1, is_interrupted = kind & 2;
    has_proc = kind & 4;
    const auto [reader, program] = open_device(is_terminal);
    const pid_t pid = start_printing(program);
    int status = -1;
    if (is_interrupted) {
      for (std::string state; state.find(") S ") == state.npos;) {  // until it waits
        std::getline(std::ifstream("/proc/" + std::to_string(pid) + "/stat"), state);
      }
      kill(pid, SIGINT);
      waitpid(pid, &status, 0);
      fcntl(reader, F_SETFL, O_NONBLOCK);
    }
    static char all[1 << 23];
    std::size_t size = 0;
    for (ssize_t got; size < rows.size() && (got = read(reader, all + size, sizeof all - size)) > 0;) {
      size += static_cast<std::size_t>(got);
      const std::size_t begin = rows.rfind('\n', size - 1), end = rows.find('\n', size - 1);
      EXPECT_TRUE(is_terminal || begin == end || end - begin > PIPE_BUF) << "a write that is not complete";
    }
    if (!is_interrupted) waitpid(pid, &status, 0);
    EXPECT_EQ(status, 0) << kind;
    EXPECT_TRUE(rows.starts_with({all, size}) && (size == rows.size()) != is_interrupted) << kind;
    EXPECT_EQ(fcntl(program, F_GETFL) & O_NONBLOCK, 0) << "others hold the file too";
  }
}

TEST(output, AbandonedItGoesOnUpToItsLastWholeLine) {
  const capture captured(report);
  print<"one\ntwo\n">();
  print<"thr">();
  writes = {EINTR, EAGAIN, -5, EINTR};
  EXPECT_EQ(report.abandon(), 0);
  EXPECT_EQ(captured.written(), "one\ntwo\n");
  EXPECT_TRUE(writes.empty());
}

// In the middle of a flush that reaches beyond the last whole line, there is nothing to add.
TEST(output, AbandonedInAFlushOfHalfALineWritesNothing) {
  const capture captured(report);
  print<"unfinished">();
  writes = {-2, interrupted};
  EXPECT_EQ(captured.text(), "unfinished");
  EXPECT_TRUE(writes.empty());
}

TEST(output_helpers, ShowWhatNoCommandShows) {
  const option options[] = {
      {"maybe", optional_argument, nullptr, 'm'}, {"must", required_argument, nullptr, 'M'}, {}};
  const std::uint32_t are[] = {option_is_optional, 0};
  {
    const capture said(diagnostics);
    print_options_usage(options, are);
    EXPECT_EQ(said.text(), "\t[--maybe, -m [ <maybe> ] ]\n\t--must, -M <must>\n");
  }
  {
    const capture printed(report);
    print_flags(nullptr, 5, "\20\3third\1first\2second");
    print_flags("mode", 10, "\10\4EIGHT");
    EXPECT_EQ(printed.text(), "<third,first>mode=12<EIGHT>");
  }
  const std::string text(1100, 'x');
  report.attach(open_device(true)[1]);
  EXPECT_EQ(highlight(text.c_str(), colour::red), "\033[31m" + text.substr(0, 1023 - 5));
  report.close();
}

}  // namespace
