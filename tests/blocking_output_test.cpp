// Outputs that cannot be told not to wait: a pipe or a terminal whose reader is slow makes their writes wait.

#include <gtest/gtest.h>
#include <limits.h>
#include <poll.h>
#include <pty.h>
#include <signal.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <termios.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <deque>
#include <string>

#include "common/text/output.h"
#include "platform/descriptor.h"

namespace platform {

bool make_writes_nonblocking(int /*fd*/) {
  return false;
}

}  // namespace platform

namespace {

std::deque<int> write_errors;  // of the writes that come next, 0 where one writes nothing

}  // namespace

extern "C" ssize_t write(int fd, const void *data, std::size_t size) {
  if (write_errors.empty()) return syscall(SYS_write, fd, data, size);
  errno = write_errors.front();
  write_errors.pop_front();
  return errno ? -1 : 0;
}

namespace {

char storage[output::buffer_size];
output out{storage, output::failure::fatal};

// The program's end of a pipe or a terminal, and the test's.
struct device {
  explicit device(bool is_terminal) {
    termios raw{};
    cfmakeraw(&raw);  // line ends arrive as they were written
    int ends[2] = {-1, -1};
    if (is_terminal ? openpty(&ends[0], &ends[1], nullptr, &raw, nullptr) : pipe(ends)) return;
    reader = ends[0];
    program = ends[1];
  }
  ~device() {
    close(reader);
    close(program);
  }

  // All that arrives up to `size` bytes, or until nothing comes for `patience` milliseconds.
  std::string received(std::size_t size, int patience) const {
    std::string all;
    pollfd ready{reader, POLLIN, 0};
    while (all.size() < size && poll(&ready, 1, patience) > 0) {
      char buffer[4096];
      const ssize_t got = read(reader, buffer, sizeof buffer);
      if (got <= 0) break;
      all.append(buffer, static_cast<std::size_t>(got));
    }
    return all;
  }

  int reader = -1, program = -1;
};

// Rows as long as any pipe takes at once, and longer ones.
std::string make_rows() {
  std::string rows;
  for (std::size_t i = 0; i < 5000; ++i) {
    rows += std::to_string(i) + std::string(i % 1000 == 999 ? 3 * PIPE_BUF : i % 173, 'x') + "\n";
  }
  return rows;
}
const std::string all_rows = make_rows();

// A process that prints all rows, and ends as the tool does where it is interrupted.
pid_t start_printing(int fd) {
  const pid_t pid = fork();
  if (pid != 0) return pid;
  signal(SIGINT, [](int) { _exit(out.abandon()); });
  out.attach(fd);
  for (std::size_t from = 0, end; from < all_rows.size(); from = end + 1) {
    end = all_rows.find('\n', from);
    format::print_to<"%s\n">(out, std::string_view(all_rows).substr(from, end - from));
  }
  out.close();
  out.close();  // what is closed stays closed
  _exit(0);
}

int status_of(pid_t pid) {
  int status = -1;
  waitpid(pid, &status, 0);
  return status;
}

TEST(blocking_output, EverythingArrives) {
  for (const bool is_terminal : {false, true}) {
    const device to(is_terminal);
    const pid_t pid = start_printing(to.program);
    EXPECT_TRUE(to.received(all_rows.size(), 10'000) == all_rows) << is_terminal;
    EXPECT_EQ(status_of(pid), 0);
  }
}

TEST(blocking_output, InterruptNeedNotWaitForAReaderThatHasStopped) {
  for (const bool is_terminal : {false, true}) {
    const device to(is_terminal);
    const pid_t pid = start_printing(to.program);
    const std::string seen = to.received(1, 10'000);
    usleep(100'000);  // by now it waits
    const auto start = std::chrono::steady_clock::now();
    kill(pid, SIGINT);
    EXPECT_EQ(status_of(pid), 0);
    EXPECT_LT(std::chrono::steady_clock::now() - start, std::chrono::seconds(2));
    const std::string rows = seen + to.received(all_rows.size(), 0);
    EXPECT_LT(rows.size(), all_rows.size());
    EXPECT_TRUE(all_rows.starts_with(rows)) << rows;
    EXPECT_TRUE(is_terminal || rows.back() == '\n') << rows;
  }
}

TEST(blocking_output, AbandonedOutputGoesOnUntilAnErrorThatStays) {
  const struct {
    std::deque<int> errors;
    int result;
    bool arrives;
  } cases[] = {{{}, 0, true},
               {{EINTR, EAGAIN, EINTR}, 0, true},
               {{0}, EIO, false},
               {{EPIPE}, 0, false},
               {{EINTR, ENOSPC}, ENOSPC, false}};
  for (const auto &[errors, result, arrives] : cases) {
    const device to(false);
    char own_storage[output::buffer_size];
    output own{own_storage, output::failure::ignored};
    own.attach(to.program);
    format::print_to<"row\n">(own);
    write_errors = errors;
    EXPECT_EQ(own.abandon(), result);
    EXPECT_EQ(to.received(4, 0), arrives ? "row\n" : "");
    EXPECT_TRUE(write_errors.empty());
  }
}

}  // namespace
