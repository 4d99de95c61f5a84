#include "tests/support/run.h"

#include <fcntl.h>
#include <poll.h>
#include <pty.h>
#include <signal.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <termios.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <memory>
#include <ostream>
#include <sstream>
#include <system_error>
#include <utility>

namespace {

void check(bool done, const char *what) {
  if (!done) throw std::system_error(errno, std::generic_category(), what);
}

// A descriptor, closed at the end.
class descriptor {
 public:
  descriptor() = default;
  explicit descriptor(int fd) : fd_(fd) {}
  descriptor(descriptor &&other) noexcept : fd_(std::exchange(other.fd_, -1)) {}
  descriptor &operator=(descriptor &&other) noexcept {
    std::swap(fd_, other.fd_);
    return *this;
  }
  ~descriptor() { reset(); }

  int get() const { return fd_; }
  void reset() {
    if (fd_ >= 0) close(fd_);
    fd_ = -1;
  }

 private:
  int fd_ = -1;
};

// The two ends of an output: what the program writes to and what the test reads from.
struct channel {
  descriptor program;
  descriptor test;
};

channel make_pipe() {
  int ends[2];
  check(pipe2(ends, O_CLOEXEC) == 0, "pipe");
  return {descriptor(ends[1]), descriptor(ends[0])};
}

channel make_terminal() {
  int test;
  int program;
  termios raw{};
  cfmakeraw(&raw);  // line ends arrive as they were written
  check(openpty(&test, &program, nullptr, &raw, nullptr) == 0, "openpty");
  fcntl(test, F_SETFD, FD_CLOEXEC);
  fcntl(program, F_SETFD, FD_CLOEXEC);
  return {descriptor(program), descriptor(test)};
}

channel make_stdout(const run_options &options) {
  if (options.terminal) return make_terminal();
  if (options.stdout_path.empty()) return make_pipe();
  const int file = open(options.stdout_path.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0666);
  check(file >= 0, options.stdout_path.c_str());
  return {descriptor(file), descriptor()};
}

[[noreturn]] void become_tarvelctl(const kernel_dir &kernel, const words &line, const run_options &options,
                                   int out, int err) {
  prctl(PR_SET_PDEATHSIG, SIGKILL);  // a test that ends early leaves nothing behind
  dup2(open("/dev/null", O_RDONLY | O_CLOEXEC), STDIN_FILENO);
  dup2(out, STDOUT_FILENO);
  dup2(err, STDERR_FILENO);
  for (const int fd : options.closed) close(fd);
  for (const int number : options.ignored) signal(number, SIG_IGN);
  if (!options.directory.empty() && chdir(options.directory.c_str()) != 0) _exit(126);
  setenv("TARVEL_ROOT", kernel.root().c_str(), 1);

  const std::string name = options.program_name.empty() ? TARVELCTL_PROGRAM : options.program_name;
  std::vector<char *> argv{const_cast<char *>(name.c_str())};
  for (const std::string &word : line) argv.push_back(const_cast<char *>(word.c_str()));
  argv.push_back(nullptr);
  execv(TARVELCTL_PROGRAM, argv.data());
  _exit(127);
}

// Appends what there is to read. Closes the descriptor at its end.
void read_some(descriptor &from, std::string &to) {
  char buffer[65536];
  const ssize_t got = read(from.get(), buffer, sizeof buffer);
  if (got > 0) {
    to.append(buffer, static_cast<std::size_t>(got));
  } else if (got == 0 || errno != EINTR) {
    from.reset();  // a terminal whose program has gone reports an error, not an end
  }
}

int wait_for_end(pid_t pid) {
  int status = 0;
  check(waitpid(pid, &status, 0) == pid, "waitpid");
  return WIFSIGNALED(status) ? -WTERMSIG(status) : WEXITSTATUS(status);
}

}  // namespace

words::words(const char *line) {
  std::istringstream in(line);
  for (std::string word; in >> word;) push_back(word);
}

run_result printed(std::string out) {
  return {std::move(out), "", 0};
}

run_result complained(std::string err, int status, std::string out) {
  return {std::move(out), std::move(err), status};
}

run_result inconsistent(const std::string &function, int line, const std::string &expression, std::string out,
                        const std::string &file) {
  return complained("Assertion failed: (" + expression + "), function " + function + ", file " + file +
                        ", line " + std::to_string(line) + ".\n",
                    -SIGABRT, std::move(out));
}

void PrintTo(const run_result &result, std::ostream *to) {
  *to << "status " << result.status << "\n--- standard output:\n"
      << result.out << "--- standard error:\n"
      << result.err << "---";
}

run_result run_tarvelctl(const kernel_dir &kernel, const words &line, const run_options &options) {
  channel out = make_stdout(options);
  channel err = make_pipe();
  const pid_t pid = fork();
  check(pid >= 0, "fork");
  const int err_fd = options.merged ? out.program.get() : err.program.get();
  if (pid == 0) become_tarvelctl(kernel, line, options, out.program.get(), err_fd);
  out.program.reset();
  err.program.reset();

  run_result result;
  while (out.test.get() >= 0 || err.test.get() >= 0) {
    pollfd ready[] = {{out.test.get(), POLLIN, 0}, {err.test.get(), POLLIN, 0}};
    poll(ready, 2, options.meanwhile ? 5 : -1);
    if (ready[0].revents) read_some(out.test, result.out);
    if (ready[1].revents) read_some(err.test, result.err);
    if (options.reader_leaves && !result.out.empty()) out.test.reset();
    if (options.meanwhile) options.meanwhile({pid, result.out, result.err});
  }
  result.status = wait_for_end(pid);
  return result;
}

std::size_t count_of(const std::string &text, const std::string &part) {
  std::size_t count = 0;
  for (auto at = text.find(part); at != text.npos; at = text.find(part, at + part.size())) ++count;
  return count;
}

std::string hide_times(std::string text) {
  constexpr std::string_view shape = "0000-00-00 00:00:00";
  const auto fits = [](char expected, char found) {
    return expected == '0' ? found >= '0' && found <= '9' : found == expected;
  };
  for (;;) {
    const auto at = std::search(text.begin(), text.end(), shape.begin(), shape.end(),
                                [&](char found, char expected) { return fits(expected, found); });
    if (at == text.end()) return text;
    text.replace(at, at + shape.size(), "<time>");
  }
}

std::function<void(const running &)> interrupt_after(std::size_t times, const std::string &text) {
  return [times, text, sent = false](const running &run) mutable {
    if (sent || count_of(run.out, text) + count_of(run.err, text) < times) return;
    kill(run.pid, SIGINT);
    sent = true;
  };
}
