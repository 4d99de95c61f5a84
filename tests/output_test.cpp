// The buffered output: whole rows, whatever their length and whoever reads them.

#include "common/output.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <limits.h>

#include <thread>

#include "tests/support/capture.h"

namespace {

class output_test : public testing::Test {
 protected:
  char storage[output::buffer_size];
  output out{storage, output::failure::fatal};
};

TEST_F(output_test, RowsArriveInOrder) {
  capture captured(out);
  std::string expected;
  for (int i = 0; i < 20'000; ++i) {
    format::print_to<"row %d\n">(out, i);
    expected += "row " + std::to_string(i) + "\n";
  }
  EXPECT_EQ(captured.text(), expected);
}

TEST_F(output_test, RowsLongerThanTheBufferArriveWhole) {
  capture captured(out);
  const std::string part(1000, 'x');
  std::string expected;
  for (int row = 0; row < 5; ++row) {
    for (int i = 0; i < 100 * row; ++i) {
      format::print_to<"%s">(out, part);
      expected += part;
    }
    format::print_to<"\n">(out);
    expected += "\n";
  }
  const std::string huge(300'000, 'y');
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

TEST_F(output_test, AbandonedOutputEndsWithItsLastWholeLine) {
  capture captured(out);
  format::print_to<"one\n">(out);
  format::print_to<"two\n">(out);
  format::print_to<"thr">(out);
  EXPECT_EQ(out.abandon(), 0);
  EXPECT_EQ(captured.written(), "one\ntwo\n");
  EXPECT_EQ(out.abandon(), 0);
  EXPECT_EQ(captured.written(), "one\ntwo\n");
}

TEST_F(output_test, AbandonedOutputSaysWhyItCouldNotBeWritten) {
  out.attach(open("/dev/full", O_WRONLY | O_CLOEXEC));
  format::print_to<"lost\n">(out);
  EXPECT_EQ(out.abandon(), ENOSPC);
}

TEST_F(output_test, RedirectionLeavesBehindWhatWasPrintedBefore) {
  capture captured(out);
  format::print_to<"before\n">(out);
  const int file = memfd_create("file", MFD_CLOEXEC);
  const int reader = dup(file);
  const std::string before = captured.text();
  out.redirect(file);
  format::print_to<"after\n">(out);
  out.flush();
  char buffer[64];
  const ssize_t size = pread(reader, buffer, sizeof buffer, 0);
  close(reader);
  EXPECT_EQ(before, "before\n");
  EXPECT_EQ(std::string(buffer, static_cast<std::size_t>(size)), "after\n");
}

TEST_F(output_test, KnowsATerminal) {
  {
    capture captured(out);
    EXPECT_FALSE(out.is_terminal());
  }
  capture_terminal terminal(out);
  EXPECT_TRUE(out.is_terminal());
  out.redirect(open("/dev/null", O_WRONLY | O_CLOEXEC));
  EXPECT_FALSE(out.is_terminal());
}

TEST(complain, LetsTheReportGoFirst) {
  capture captured(report);
  const capture unused(diagnostics);
  print<"row\n">();
  EXPECT_EQ(captured.written(), "");
  complain<"trouble\n">();
  EXPECT_EQ(captured.written(), "row\n");
}

}  // namespace
