// The buffered output: whole rows, whatever their length and whoever reads them; and what commands print
// with.

#include "common/text/output.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <limits.h>
#include <signal.h>
#include <sys/resource.h>

#include <thread>

#include "common/mib.h"
#include "common/text/output_helpers.h"
#include "tests/support/capture.h"
#include "tests/support/kernel_dir.h"

namespace {

// Lets an output write to a terminal that nobody looks at.
struct terminal {
  explicit terminal(output &to) {
    if (openpty(&reader, &program, nullptr, nullptr, nullptr) == 0) to.attach(program);
  }
  ~terminal() {
    close(program);
    close(reader);
  }
  int reader = -1, program = -1;
};

class output_test : public testing::Test {
 protected:
  char storage[output::buffer_size];
  output out{storage, output::failure::fatal};
};

TEST_F(output_test, RowsOfAllLengthsArriveWhole) {
  capture captured(out);
  const std::string part(1000, 'x'), huge(300'000, 'y');
  std::string expected;
  for (int i = 0; i < 20'000; ++i) {
    format::print_to<"row %d\n">(out, i);
    expected += "row " + std::to_string(i) + "\n";
  }
  for (int i = 0; i < 1000; ++i) {
    format::print_to<"%s">(out, part);
    if (i % 300 == 299) format::print_to<"\n">(out);
    expected += part + (i % 300 == 299 ? "\n" : "");
  }
  format::print_to<"%s\n">(out, huge);
  EXPECT_EQ(captured.text(), expected + huge + "\n");
}

TEST_F(output_test, LeavesItsBufferAtTheEndOfARow) {
  capture captured(out);
  for (std::size_t i = 0; i < 2 * output::buffer_size; ++i) {
    format::print_to<"%s">(out, i % 97 == 96 ? "\n" : ".");
    if (i % 97 == 96) format::print_to<"\n">(out);
    const std::string written = captured.written();
    ASSERT_TRUE(written.empty() || written.back() == '\n') << "after " << i;
  }
  EXPECT_FALSE(captured.written().empty());
}

TEST_F(output_test, RowThatDoesNotFitSendsTheLinesBeforeItAway) {
  const std::string line(1023, 'x');
  const struct {
    std::size_t lines, row, lines_gone;
  } cases[] = {{31, 5000, 0}, {31, 9500, 31}, {1, 39 * 1024, 1}, {31, 100'000, 31}, {0, 100'000, 0}};
  for (const auto &[lines, row, lines_gone] : cases) {
    char buffer[output::buffer_size];
    output to{buffer, output::failure::fatal};
    capture captured(to);
    std::string expected;
    for (std::size_t i = 0; i < lines; ++i, expected += line + "\n") format::print_to<"%s\n">(to, line);
    format::print_to<"%s">(to, std::string(row, 'y'));
    EXPECT_EQ(captured.written().size(), lines_gone * 1024) << row;
    format::print_to<"\n">(to);
    EXPECT_EQ(captured.text(), expected + std::string(row, 'y') + "\n");
  }
}

// What a read returns is what complete writes have left in the pipe.
TEST_F(output_test, PipeReaderNeverMeetsATornRow) {
  int ends[2];
  ASSERT_EQ(pipe2(ends, O_CLOEXEC), 0);
  std::string received;
  bool torn = false;
  std::thread reader([&] {
    char buffer[1 << 20];
    for (ssize_t got; (got = read(ends[0], buffer, sizeof buffer)) > 0;) {
      received.append(buffer, static_cast<std::size_t>(got));
      torn |= buffer[got - 1] != '\n';
    }
  });
  out.attach(ends[1]);
  EXPECT_EQ(fcntl(ends[1], F_GETFD), FD_CLOEXEC);
  std::string expected;
  for (int i = 0; i < 30'000; ++i) {
    const std::string row(static_cast<std::size_t>(i % 200 == 0 ? PIPE_BUF - 1 : i % 173), 'x');
    format::print_to<"%s\n">(out, row);
    expected += row + "\n";
  }
  out.close();
  reader.join();
  close(ends[0]);
  EXPECT_FALSE(torn);
  EXPECT_EQ(received, expected);
}

TEST_F(output_test, AbandonedOutputEndsWithItsLastWholeLineOrSaysWhyNot) {
  {
    capture captured(out);
    format::print_to<"one\n">(out);
    format::print_to<"two\n">(out);
    format::print_to<"thr">(out);
    EXPECT_EQ(out.abandon(), 0);
    EXPECT_EQ(captured.written(), "one\ntwo\n");
  }
  int ends[2];
  ASSERT_EQ(pipe2(ends, O_CLOEXEC), 0);
  close(ends[0]);
  out.attach(ends[1]);
  format::print_to<"unread\n">(out);
  EXPECT_EQ(out.abandon(), 0);
  out.attach(open("/dev/full", O_WRONLY | O_CLOEXEC));
  EXPECT_EQ(out.abandon(), ENOSPC);
}

// In the middle of a flush that reaches beyond the last whole line, there is nothing to add.
TEST_F(output_test, AbandonedInAFlushOfHalfALineWritesNothing) {
  int ends[2];
  ASSERT_EQ(pipe2(ends, O_CLOEXEC | O_NONBLOCK), 0);
  fcntl(ends[1], F_SETPIPE_SZ, PIPE_BUF);
  static const output *flushed;
  static int reader;
  static ssize_t before, after;
  flushed = &out;
  reader = ends[0];
  signal(SIGALRM, [](int) {
    char buffer[3 * PIPE_BUF];
    before = read(reader, buffer, sizeof buffer);
    flushed->abandon();
    after = read(reader, buffer, sizeof buffer);
  });
  out.attach(ends[1]);
  format::print_to<"%s">(out, std::string(2 * PIPE_BUF, 'x'));
  ualarm(20'000, 0);
  out.flush();
  EXPECT_EQ(before, PIPE_BUF);
  EXPECT_EQ(after, -1);
  close(ends[0]);
}

TEST_F(output_test, RedirectionLeavesBehindWhatWasPrintedBefore) {
  const terminal before(out);
  EXPECT_TRUE(out.is_terminal());
  format::print_to<"before\n">(out);
  const int file = memfd_create("file", MFD_CLOEXEC);
  const int reader = dup(file);
  fcntl(before.program, F_SETFD, FD_CLOEXEC);
  out.redirect(file);
  EXPECT_EQ(fcntl(before.program, F_GETFD), FD_CLOEXEC);
  EXPECT_FALSE(out.is_terminal());
  format::print_to<"after\n">(out);
  out.flush();
  char text[64] = {}, terminal_text[64] = {};
  EXPECT_EQ(pread(reader, text, sizeof text, 0), 6);
  EXPECT_EQ(read(before.reader, terminal_text, sizeof terminal_text), 8);
  close(reader);
  EXPECT_STREQ(text, "after\n");
  EXPECT_STREQ(terminal_text, "before\r\n");
}

TEST(complain, LetsTheReportGoFirst) {
  capture captured(report);
  const capture unused(diagnostics);
  print<"row\n">();
  EXPECT_EQ(captured.written(), "");
  complain<"trouble\n">();
  EXPECT_EQ(captured.written(), "row\n");
}

TEST(attach_standard_outputs_test, DiagnosticsDoWithoutADescriptorOfTheirOwn) {
  const auto say = [] {
    rlimit files;
    getrlimit(RLIMIT_NOFILE, &files);
    const rlimit none{.rlim_cur = STDERR_FILENO + 1, .rlim_max = files.rlim_max};
    setrlimit(RLIMIT_NOFILE, &none);
    attach_standard_outputs();
    setrlimit(RLIMIT_NOFILE, &files);
    complain<"said\n">();
    _exit(0);
  };
  EXPECT_EXIT(say(), testing::ExitedWithCode(0), "^said\n$");
}

TEST(object_type_name_test, NamesTypesOnly) {
  EXPECT_EQ(object_type_name(object_type::flow).view(), "flow");
  EXPECT_EQ(object_type_name(object_type{5}).view(), "???");
}

TEST(print_options_usage, BracketsWhatMayBeLeftOut) {
  const option options[] = {{"plain", no_argument, nullptr, 'p'},
                            {"value", required_argument, nullptr, 'v'},
                            {"maybe", optional_argument, nullptr, 'm'},
                            {}};
  const struct {
    std::uint32_t flags[3];
    const char *usage;
  } cases[] = {{{0, 0, 2}, "\t--plain, -p\n\t--value, -v <value>\n\t--maybe, -m [ <maybe> ]\n"},
               {{1, 3, ~0U}, "\t[--plain, -p ]\n\t[--value, -v <value> ]\n\t[--maybe, -m [ <maybe> ] ]\n"}};
  for (const auto &[flags, usage] : cases) {
    capture captured(diagnostics);
    print_options_usage(options, flags);
    EXPECT_EQ(captured.text(), usage);
  }
}

TEST(print_flags, NamesTheSetBits) {
  constexpr char region[] = "\20\1NOREDIRECT\2MMAPOK\6NOCACHE\40MIRRORED";
  const struct {
    const char *label;
    std::uint32_t value;
    bit_names names;
    const char *shown;
  } cases[] = {
      {"flags", 0x2BCDEF04, region, "flags=2bcdef04<>"},
      {nullptr, 0x80000022, region, "<MMAPOK,NOCACHE,MIRRORED>"},
      {"mode", 8, "\10\4EIGHT", "mode=10<EIGHT>"},
      {"mode", 10, "\12\4EIGHT", "mode=a<EIGHT>"},
      {"f", 7, "\20\3third\1first\2second", "f=7<third,first,second>"},
  };
  for (const auto &[label, value, names, shown] : cases) {
    capture captured(report);
    print_flags(label, value, names);
    EXPECT_EQ(captured.text(), shown);
  }
}

TEST(highlight, ColoursOnTerminalsOnly) {
  const char text[] = "defunct";
  {
    capture file(report);
    EXPECT_EQ(highlight(text, colour::red), text);
  }
  const terminal attached(report);
  EXPECT_STREQ(highlight(text, colour::red), "\033[31mdefunct\033[0m");
  const std::string long_text(1100, 'x');
  EXPECT_EQ(highlight(long_text.c_str(), colour::red), "\033[31m" + long_text.substr(0, 1023 - 5));
}

TEST(pid_to_name_test, GivesNameOrIdCutToTheBuffer) {
  kernel_dir kernel;
  kernel.process(25, "configd\n").process(7, "fifteen-letters\n");
  setenv("TARVEL_ROOT", kernel.root().c_str(), 1);
  const struct {
    int pid;
    std::size_t size;
    bool with_pid;
    const char *name;
  } cases[] = {
      {25, 32, false, "configd"},
      {25, 256, true, "configd.25"},
      {7, 32, false, "fifteen-letters"},
      {25, 8, false, "configd"},
      {25, 7, false, "config"},
      {25, 1, false, ""},
      {25, 10, true, "configd.2"},
      {25, 9, true, "configd."},
      {25, 8, true, "configd"},
      {25, 7, true, "config"},
      {26, 32, false, "<unknown>.26"},
      {26, 32, true, "<unknown>.26"},
      {0, 32, false, "<unknown>.0"},
      {-1, 32, true, "<unknown>.-1"},
      {26, 12, false, "<unknown>.2"},
      {7, 256, true, "fifteen-letters.7"},
      {2147483647, 32, false, "<unknown>.2147483647"},
  };
  for (const auto &[pid, size, with_pid, name] : cases) {
    std::string buffer(size + 8, '#');  // of which the last 8 may not be written
    EXPECT_EQ(pid_to_name(pid, buffer.data(), size, with_pid).text, name) << size;
    EXPECT_EQ(buffer[std::strlen(name)], '\0');
    EXPECT_EQ(buffer.substr(size), "########");
  }
  unsetenv("TARVEL_ROOT");
}

}  // namespace
