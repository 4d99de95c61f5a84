#include "export/replaced_file.h"

#include <fcntl.h>
#include <signal.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <climits>
#include <cstdlib>
#include <filesystem>
#include <string_view>

#include "common/own_directory.h"
#include "common/text/output.h"

namespace exporter {

namespace {

std::string place;               // where the file belongs
char unfinished[PATH_MAX] = "";  // what has to go where the process ends now, for a signal handler

void remove_unfinished() {
  if (*unfinished) unlink(unfinished);
}

void end_without_file(int number) {
  remove_unfinished();
  signal(number, SIG_DFL);
  raise(number);
}

void remove_at_any_end() {
  std::atexit(remove_unfinished);
  struct sigaction action {};
  action.sa_handler = end_without_file;
  for (const int number : {SIGINT, SIGTERM, SIGHUP, SIGPIPE}) sigaction(number, &action, nullptr);
  signal(SIGXFSZ, SIG_IGN);  // what a limit stops is then a write that fails
}

// Makes the new file. Its descriptor, or -1 with the reason in errno.
int make_beside(const std::string &path) {
  constexpr std::string_view name = ".tarvelexport.XXXXXX";
  const std::string made = path.substr(0, path.rfind('/') + 1).append(name);
  if (made.size() >= sizeof unfinished) {
    errno = ENAMETOOLONG;
    return -1;
  }
  made.copy(unfinished, sizeof unfinished);
  const int fd = mkostemp(unfinished, O_CLOEXEC);
  if (fd < 0) {
    *unfinished = '\0';
    return -1;
  }
  const mode_t mask = umask(0);
  umask(mask);
  fchmod(fd, 0666 & ~mask);
  return fd;
}

}  // namespace

bool begin_replacement(const std::string &path) {
  std::error_code unknown;
  place = std::filesystem::canonical(path, unknown);  // a link stays one
  if (unknown) place = path;
  struct stat status {};
  if (stat(place.c_str(), &status) == 0 && !S_ISREG(status.st_mode))
    return complain_about(path, "no plain file");
  remove_at_any_end();
  const int fd = make_beside(place);
  if (fd < 0) return complain_about(path, errno);
  report.redirect(fd);
  return true;
}

bool commit_replacement() {
  report.flush();
  // What a loss of power leaves is whole, too.
  if (fsync(STDOUT_FILENO) != 0 && errno != EINVAL) return complain_about(place, errno);
  report.close();
  if (rename(unfinished, place.c_str()) != 0) return complain_about(place, errno);
  *unfinished = '\0';
  return true;
}

}  // namespace exporter
