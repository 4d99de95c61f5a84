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
#include <ostream>
#include <sstream>
#include <string_view>
#include <utility>

namespace {

int check(int result, const char *what) {
  if (result < 0) throw std::system_error(errno, std::generic_category(), what);
  return result;
}

// The two ends of an output: what the program writes to, and what the test reads from or -1.
struct channel {
  int program;
  int test = -1;
};

void close_end(int &fd) {
  if (fd >= 0) close(fd);
  fd = -1;
}

channel make_pipe() {
  int ends[2];
  check(pipe2(ends, O_CLOEXEC), "pipe");
  return {ends[1], ends[0]};
}

channel make_terminal() {
  channel terminal{};
  termios raw{};
  cfmakeraw(&raw);  // line ends arrive as they were written
  check(openpty(&terminal.test, &terminal.program, nullptr, &raw, nullptr), "openpty");
  for (const int fd : {terminal.test, terminal.program}) fcntl(fd, F_SETFD, FD_CLOEXEC);
  return terminal;
}

channel make_stdout(const run_options &options) {
  if (options.terminal) return make_terminal();
  if (options.stdout_path.empty()) return make_pipe();
  return {check(open(options.stdout_path.c_str(), O_WRONLY | O_CLOEXEC), options.stdout_path.c_str())};
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
  if (options.prepare) options.prepare();
  setenv("TARVEL_ROOT", kernel.root().c_str(), 1);
  setenv("POSIXLY_CORRECT", "", 1);  // options behind operands are options none the less
  setenv("LC_ALL", "C", 1);
  for (const auto &[name, value] : options.environment) setenv(name.c_str(), value.c_str(), 1);

  const std::string name = options.program_name.empty() ? TARVELCTL_PROGRAM : options.program_name;
  std::vector<char *> argv{const_cast<char *>(name.c_str())};
  for (const std::string &word : line) argv.push_back(const_cast<char *>(word.c_str()));
  argv.push_back(nullptr);
  execv(TARVELCTL_PROGRAM, argv.data());
  _exit(127);
}

// Appends what there is to read. Closes the descriptor at its end.
void read_some(int &from, std::string &to) {
  char buffer[65536];
  const ssize_t got = read(from, buffer, sizeof buffer);
  if (got > 0) {
    to.append(buffer, static_cast<std::size_t>(got));
  } else if (got == 0 || errno != EINTR) {
    close_end(from);  // a terminal whose program has gone reports an error, not an end
  }
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
  const pid_t pid = check(fork(), "fork");
  if (pid == 0)
    become_tarvelctl(kernel, line, options, out.program, options.merged ? out.program : err.program);
  close_end(out.program);
  close_end(err.program);

  run_result result;
  while (out.test >= 0 || err.test >= 0) {
    pollfd ready[] = {{out.test, POLLIN, 0}, {err.test, POLLIN, 0}};
    poll(ready, 2, options.meanwhile ? 5 : -1);
    if (ready[0].revents) read_some(out.test, result.out);
    if (ready[1].revents) read_some(err.test, result.err);
    if (options.reader_leaves && !result.out.empty()) close_end(out.test);
    if (options.meanwhile) options.meanwhile({pid, result.out, result.err});
  }
  int status = 0;
  check(waitpid(pid, &status, 0), "waitpid");
  result.status = WIFSIGNALED(status) ? -WTERMSIG(status) : WEXITSTATUS(status);
  return result;
}

std::size_t count_of(const std::string &text, const std::string &part) {
  std::size_t count = 0;
  for (auto at = text.find(part); at != text.npos; at = text.find(part, at + part.size())) ++count;
  return count;
}

std::string hide_times(const std::string &text) {
  static constexpr std::string_view form = "dddd-dd-dd dd:dd:dd";
  const auto is_time = [&text](std::size_t at) {
    return std::equal(form.begin(), form.end(), text.begin() + static_cast<std::ptrdiff_t>(at),
                      [](char f, char c) { return f == 'd' ? c >= '0' && c <= '9' : c == f; });
  };
  std::string hidden = text;
  for (std::size_t at = text.size(); at-- > 0;) {
    if (at + form.size() <= text.size() && is_time(at)) hidden.replace(at, form.size(), "<time>");
  }
  return hidden;
}

std::function<void(const running &)> interrupt_after(std::size_t times, const std::string &text) {
  return [times, text, sent = false](const running &run) mutable {
    if (sent || count_of(run.out, text) + count_of(run.err, text) < times) return;
    kill(run.pid, SIGINT);
    sent = true;
  };
}
