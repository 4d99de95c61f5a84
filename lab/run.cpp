// run: a command on a kernel of its own, or on a captured one.
//
// What moves the kernel is a child in a process group of its own, so that what a terminal sends to the group
// of the command leaves it alone. It ends with this process, however that ends.

#include <signal.h>
#include <sys/prctl.h>
#include <sys/resource.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <optional>
#include <span>
#include <string_view>
#include <system_error>

#include "common/captured.h"
#include "common/own_directory.h"
#include "common/text/output.h"
#include "common/text/text.h"
#include "lab/clock.h"
#include "lab/command_line.h"
#include "lab/simulation.h"

namespace lab {

namespace {

constexpr int not_found = 127;
constexpr int not_executable = 126;

// A new directory for temporary files, removed with all that is in it.
class temporary_directory {
 public:
  temporary_directory() {
    const char *parent = secure_getenv("TMPDIR");
    std::error_code error;
    path_ =
        std::filesystem::absolute(parent && *parent ? parent : "/tmp", error).string() + "/tarvellab-XXXXXX";
    if (!mkdtemp(path_.data())) {
      complain_about(path_, errno);
      path_.clear();
    } else {
      opened_ = own_directory::open(path_);
    }
  }
  ~temporary_directory() { remove(); }
  temporary_directory(const temporary_directory &) = delete;
  temporary_directory &operator=(const temporary_directory &) = delete;

  // Of what is in it nothing is left, whatever its path leads to by now.
  void remove() const {
    if (!opened_.is_open()) return;
    opened_.for_each([&](const std::string &name) {
      opened_.remove(name);
      return true;
    });
    rmdir(path_.c_str());
  }

  // None where it could not be made.
  const own_directory &opened() const { return opened_; }

 private:
  std::string path_;
  own_directory opened_;
};

// A child process that keeps the kernel in a temporary directory moving. Ends with its owner.
class mover {
 public:
  mover() = default;
  ~mover() {
    if (pid_ <= 0) return;
    kill(pid_, SIGKILL);
    waitpid(pid_, nullptr, 0);
  }
  mover(const mover &) = delete;
  mover &operator=(const mover &) = delete;

  // `move` is to go on until a signal in the set that it is given, which is blocked, arrives. False, with a
  // message, where there can be no child.
  template <class Move>
  bool start(const temporary_directory &directory, Move move) {
    const pid_t owner = getpid();
    pid_ = fork();
    if (pid_ < 0) return complain_about("fork", errno);  // GCOVR_EXCL_BR_LINE: forks do not fail at will
    if (pid_ > 0) return true;
    setpgid(0, 0);
    prctl(PR_SET_PDEATHSIG, SIGTERM);
    if (getppid() == owner) move(set_of({SIGTERM}));  // GCOVR_EXCL_BR_LINE: who is gone already is rare
    // The owner stops its child in a harder way: here it is gone, and its directory left behind.
    if (getppid() != owner) directory.remove();
    _exit(EXIT_SUCCESS);
  }

 private:
  pid_t pid_ = -1;
};

// Makes a world in the directory and keeps it moving.
bool start_simulation(const options &asked, const temporary_directory &directory, mover &kernel) {
  simulation moving(asked, directory.opened().enter("."));
  return moving.start() && kernel.start(directory, [&](const sigset_t &stop) { moving.keep_moving(stop); });
}

// The link to the moment that is shown: a reader follows one to the root, and none below it.
constexpr char shown[] = "moment";

// Puts a moment of a capture into the place of the one before, all of it at once: the files stay where they
// are.
bool show(const std::string &moment, const own_directory &directory) {
  constexpr char next[] = ".moment";
  if (symlinkat(moment.c_str(), directory.fd(), next) != 0)
    return complain_about(directory.path_of(next), errno);
  return directory.rename(next, shown);
}

// Shows the first moment and then the others, at the pace at which they were taken. All come a little earlier
// after the first than they did, a quarter of the first interval: a watch that starts with the command and
// has their interval reads each once, in the quarters that are left, though it comes later from read to read.
bool start_replay(std::span<const captured_moment> moments, const temporary_directory &directory,
                  mover &kernel) {
  if (!show(moments[0].root, directory.opened())) return false;
  const std::int64_t began = monotonic_milliseconds() - moments[1].offset / 4;
  return kernel.start(directory, [&](const sigset_t &stop) {
    for (const captured_moment &later : moments.subspan(1)) {
      if (stopped_before(began + later.offset, stop) || !show(later.root, directory.opened())) return;
    }
    complain<"tarvellab: the last moment is shown\n">();
    int signal;
    sigwait(&stop, &signal);
  });
}

// Where a program of this name stands beside this one; empty where none does or, after a message, where this
// one cannot tell its own place.
std::string beside_this_program(const char *name) {
  constexpr const char *own = "/proc/self/exe";
  std::error_code error;
  std::filesystem::path self = std::filesystem::read_symlink(own, error);
  if (error) {
    complain_about(own, error.value());
    return {};
  }
  const std::string path = self.replace_filename(name).string();
  return access(path.c_str(), X_OK) == 0 ? path : std::string();
}

// In the child: becomes the command.
[[noreturn]] void become(char **command, const std::string &root) {
  setenv("TARVEL_ROOT", root.c_str(), 1);
  if (std::string_view(command[0]) == "tarvelctl") {
    const std::string neighbour = beside_this_program(command[0]);
    if (!neighbour.empty()) execv(neighbour.c_str(), command);
  }
  execvp(command[0], command);
  const int error = errno;
  complain_about(command[0], error);
  _exit(error == ENOENT ? not_found : not_executable);
}

// Waits for the command's end and passes signals on meanwhile. Returns its wait status.
int attend(pid_t command, const sigset_t &signals) {
  for (;;) {
    siginfo_t info;
    const int signal = sigwaitinfo(&signals, &info);
    if (signal == SIGCHLD) {
      int status;
      if (waitpid(command, &status, WNOHANG) == command) return status;
    } else if (signal > 0 && info.si_code != SI_KERNEL) {
      kill(command, signal);  // the terminal's own signals have reached the command already
    }
  }
}

// The exit status for a wait status; where a signal ended the command, the same one ends this process, when
// all that was made is removed again.
int end_like(int status) {
  if (!WIFSIGNALED(status)) return WEXITSTATUS(status);
  const int signal = WTERMSIG(status);
  const rlimit no_core{};
  setrlimit(RLIMIT_CORE, &no_core);  // the command's own core is the one that tells
  ::signal(signal, SIG_DFL);
  const sigset_t set = set_of({signal});
  sigprocmask(SIG_UNBLOCK, &set, nullptr);
  raise(signal);
  return 128 + signal;
}

// Runs the command on `root` and returns its wait status.
int run_command(char **command, const std::string &root, const sigset_t &signals, const sigset_t &before) {
  const pid_t child = fork();
  if (child < 0) {  // GCOVR_EXCL_BR_LINE: forks do not fail at will
    complain_about("fork", errno);
    return W_EXITCODE(EXIT_FAILURE, 0);
  }
  if (child == 0) {
    sigprocmask(SIG_SETMASK, &before, nullptr);
    become(command, root);
  }
  return attend(child, signals);
}

// A signal that came before there was a command to pass it on to, or 0.
int early_signal(const sigset_t &signals) {
  const timespec now{};
  for (;;) {
    const int signal = sigtimedwait(&signals, nullptr, &now);
    if (signal != SIGCHLD) return std::max(signal, 0);
  }
}

// Says whose capture this is, if it is one.
void announce(const captured &found) {
  const auto said = [](std::string_view value) { return foreign_text{value.empty() ? "unknown" : value}; };
  if (!found.is_capture) return;
  complain<"tarvellab: this is %s at %s\n">(said(found.note.host), said(found.note.time));
}

}  // namespace

int run(const options &asked) {
  const sigset_t signals = set_of({SIGINT, SIGTERM, SIGHUP, SIGQUIT, SIGCHLD});
  sigset_t before;
  sigprocmask(SIG_BLOCK, &signals, &before);
  hold_file_size_signal();
  signal(SIGCHLD, SIG_DFL);  // a caller that ignores it would take the command's status with it

  std::optional<captured> found;
  if (!asked.directory.empty()) {
    found = look_into(asked.directory);
    if (!found) return EXIT_FAILURE;
    announce(*found);
    if (found->moments.size() == 1) {
      return end_like(run_command(asked.command, found->moments[0].root, signals, before));
    }
  }
  int status;
  {
    const temporary_directory directory;
    if (!directory.opened().is_open()) return EXIT_FAILURE;
    mover kernel;
    const bool started =
        found ? start_replay(found->moments, directory, kernel) : start_simulation(asked, directory, kernel);
    if (!started) return EXIT_FAILURE;
    const std::string root = found ? directory.opened().path_of(shown) : directory.opened().path();
    const int early = early_signal(signals);
    status = early ? W_EXITCODE(0, early) : run_command(asked.command, root, signals, before);
  }
  return end_like(status);
}

}  // namespace lab
