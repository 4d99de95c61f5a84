#include "common/text/output.h"

#include <fcntl.h>
#include <limits.h>
#include <poll.h>
#include <signal.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <time.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <cstring>

#include "platform/descriptor.h"

namespace {

char report_storage[output::buffer_size];
char diagnostics_storage[4 * 1024];

// Holds SIGINT back for its lifetime.
class interrupt_hold {
 public:
  interrupt_hold() {
    sigset_t interrupt;
    sigemptyset(&interrupt);
    sigaddset(&interrupt, SIGINT);
    sigprocmask(SIG_BLOCK, &interrupt, &before_);
  }
  ~interrupt_hold() { sigprocmask(SIG_SETMASK, &before_, nullptr); }
  interrupt_hold(const interrupt_hold &) = delete;
  interrupt_hold &operator=(const interrupt_hold &) = delete;

  // Lets in what has been held back so far.
  void pause() const {
    sigset_t held;
    sigprocmask(SIG_SETMASK, &before_, &held);
    sigprocmask(SIG_SETMASK, &held, nullptr);
  }

  // The signals that were held back before.
  const sigset_t &before() const { return before_; }

 private:
  sigset_t before_;
};

// Waits until `fd` takes bytes, or for `timeout`, with the signals of `held` held back meanwhile. A signal
// that is let through runs its handler here.
bool wait_for_room(int fd, const timespec *timeout, const sigset_t *held) {
  pollfd room{.fd = fd, .events = POLLOUT, .revents = 0};
  return ppoll(&room, 1, timeout, held) > 0;
}

constexpr std::int64_t nanoseconds = 1'000'000'000;

std::int64_t monotonic_time() {
  timespec now;
  clock_gettime(CLOCK_MONOTONIC, &now);
  return now.tv_sec * nanoseconds + now.tv_nsec;
}

timespec time_until(std::int64_t deadline) {
  const std::int64_t left = std::max<std::int64_t>(deadline - monotonic_time(), 0);
  return {.tv_sec = left / nanoseconds, .tv_nsec = left % nanoseconds};
}

// The signal's own end where a reader has gone, also when the caller had it ignored or held back.
void end_by_broken_pipe() {
  signal(SIGPIPE, SIG_DFL);
  sigset_t broken_pipe;
  sigemptyset(&broken_pipe);
  sigaddset(&broken_pipe, SIGPIPE);
  sigprocmask(SIG_UNBLOCK, &broken_pipe, nullptr);
  raise(SIGPIPE);
}

// Where the reader has gone, this ends the process.
void say_failure(int error) {
  if (error == EPIPE) end_by_broken_pipe();
  complain<"write error: %s\n">(strerror(error));
}

}  // namespace

constinit output report{report_storage, output::failure::fatal};
constinit output diagnostics{diagnostics_storage, output::failure::ignored};

void output::redirect(int fd) {
  dup2(fd, fd_);
  ::close(fd);
  attach(fd_);
}

void output::attach(int fd) {
  fd_ = fd;
  struct stat status {};
  fstat(fd, &status);
  const bool has_terminal = S_ISCHR(status.st_mode) && isatty(fd);
  guard_ = has_terminal ? format::terminal_guard() : format::guard::none;
  is_pipe_ = S_ISFIFO(status.st_mode);
  is_socket_ = S_ISSOCK(status.st_mode);
  may_block_ = (has_terminal || is_pipe_) && !platform::make_writes_nonblocking(fd);
}

void output::close() {
  flush();
  if (fd_ < 0) return;
  const int fd = fd_;
  fd_ = -1;
  if (::close(fd) < 0 && errno != EINTR) fail(errno);
}

// What the next write of `bytes` may carry of them.
std::string_view output::next_piece(std::string_view bytes) const {
  if (!is_pipe_ || bytes.size() <= PIPE_BUF) return bytes;
  const std::size_t last = bytes.rfind('\n', PIPE_BUF - 1);
  return bytes.substr(0, last == bytes.npos ? PIPE_BUF : last + 1);
}

// One write. A socket cannot be opened anew, but told not to wait each time.
ssize_t output::write_once(std::string_view bytes) const {
  return is_socket_ ? send(fd_, bytes.data(), bytes.size(), MSG_DONTWAIT)
                    : write(fd_, bytes.data(), bytes.size());
}

// Writes as write_once(), waiting for room where writing cannot be told not to wait. A terminal may wait
// also when it has some room. Then SIGINT has to come through, and what it cuts off is dropped: how much was
// written is not known.
ssize_t output::write_piece(std::string_view bytes, const sigset_t &unheld) {
  if (may_block_) wait_for_room(fd_, nullptr, &unheld);
  if (!may_block_ || !is_terminal()) return write_once(bytes);
  write_is_open_ = true;
  sigset_t held;
  sigprocmask(SIG_SETMASK, &unheld, &held);
  const ssize_t written = write_once(bytes);
  const int error = errno;
  sigprocmask(SIG_SETMASK, &held, nullptr);
  errno = error;
  write_is_open_ = false;
  return written;
}

// Writes the bytes up to `upto`, lines_end_ or end_, and moves what follows to the buffer's front.
// After an error_ the buffer is empty.
void output::write_out(const char *upto) {
  const interrupt_hold hold;
  while (begin_ < upto && !error_) {
    const ssize_t written = write_piece(next_piece({begin_, upto}), hold.before());
    if (written > 0) {
      begin_ += written;
    } else if (written == 0) {
      error_ = EIO;
    } else if (errno == EAGAIN) {
      wait_for_room(fd_, nullptr, &hold.before());
      hold.pause();  // where there is room at once, waiting lets no signal in
    } else if (errno != EINTR) {
      error_ = errno;
    }
  }
  if (error_) begin_ = end_;
  const auto rest = static_cast<std::size_t>(end_ - begin_);
  std::memmove(storage_, begin_, rest);
  begin_ = storage_;
  end_ = storage_ + rest;
  lines_end_.store(storage_, std::memory_order_release);
}

void output::drain(const char *upto) {
  write_out(upto);
  if (error_) fail(error_);
}

void output::flush_at_last() {
  write_out(end_);
  if (error_) say_failure(error_);
}

// Makes room for a row that goes on after the whole lines are out, if need be in a larger buffer.
void output::make_room(std::size_t size) {
  drain(lines_end_.load(std::memory_order_relaxed));
  if (size <= static_cast<std::size_t>(limit_ - end_)) return;
  const auto row = static_cast<std::size_t>(end_ - begin_);
  const std::size_t capacity = 2 * (row + size);
  std::unique_ptr<char[]> larger(new char[capacity + format::slack]);
  std::memcpy(larger.get(), begin_, row);
  const interrupt_hold hold;
  grown_ = std::move(larger);
  storage_ = begin_ = grown_.get();
  end_ = storage_ + row;
  limit_ = storage_ + capacity;
  lines_end_.store(storage_, std::memory_order_release);
}

void output::fail(int error) {
  if (on_failure_ == failure::ignored) {
    error_ = 0;
    return;
  }
  say_failure(error);
  std::exit(exit_status::output_failed);
}

// Writes all that a tenth of a second allows. Returns 0 or the error number of a write.
int output::write_within_limit(std::string_view bytes) const noexcept {
  const std::int64_t deadline = monotonic_time() + nanoseconds / 10;
  bool wait = may_block_;
  while (!bytes.empty()) {
    const timespec left = time_until(deadline);
    if (wait && !wait_for_room(fd_, &left, nullptr)) return 0;
    const ssize_t written = write_once(next_piece(bytes));
    if (written > 0) {
      bytes.remove_prefix(static_cast<std::size_t>(written));
    } else if (written < 0 && errno == EAGAIN) {
      if (monotonic_time() > deadline) return 0;  // it says that it has room, but takes nothing
      wait = true;
    } else if (written == 0 || errno != EINTR) {
      return written == 0 ? EIO : errno;
    }
  }
  return 0;
}

int output::abandon() const noexcept {
  signal(SIGPIPE, SIG_IGN);  // who interrupts is told nothing of a reader that has gone
  if (write_is_open_) return 0;
  // A flush that is interrupted may be beyond the last whole line.
  const char *const upto = std::max(begin_, lines_end_.load(std::memory_order_acquire));
  const int error = error_ ? error_ : write_within_limit({begin_, upto});
  return error == EPIPE ? 0 : error;
}

namespace {

// Opens standard descriptors that are closed in a way that makes their use fail.
void take_standard_descriptors() {
  for (int fd = STDIN_FILENO; fd <= STDERR_FILENO; ++fd) {
    if (fcntl(fd, F_GETFD) < 0) open("/dev/null", O_RDONLY | O_CLOEXEC);
  }
}

// Where no descriptor is free, the standard one has to do.
void attach_duplicate(output &to, int fd) {
  const int own = fcntl(fd, F_DUPFD_CLOEXEC, STDERR_FILENO + 1);
  to.attach(own < 0 ? fd : own);
}

}  // namespace

void attach_standard_outputs() {
  take_standard_descriptors();
  report.attach(STDOUT_FILENO);
  // The C library writes to standard error too, and would lose what a full pipe does not take at once.
  attach_duplicate(diagnostics, STDERR_FILENO);
}

void attach_own_outputs() {
  take_standard_descriptors();
  attach_duplicate(report, STDOUT_FILENO);
  attach_duplicate(diagnostics, STDERR_FILENO);
}
