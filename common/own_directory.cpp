#include "common/own_directory.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <string_view>

#include "common/text/output.h"
#include "common/text/text.h"

namespace {

constexpr int as_directory = O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC;
constexpr mode_t private_mode = 0700;

// Why the directory is not the caller's alone, or null.
const char *weakness_of(int fd) {
  struct stat status {};
  fstat(fd, &status);
  if (status.st_uid != geteuid()) return "belongs to another user";
  if (status.st_mode & (S_IWGRP | S_IWOTH)) return "others may write to it";
  return nullptr;
}

// Calls `visit` with each name in the directory, until that returns false. Returns whether it did, or -1.
int for_each_in(int directory, const std::function<bool(const std::string &)> &visit) {
  const int fd = openat(directory, ".", as_directory);
  DIR *const listing = fd < 0 ? nullptr : fdopendir(fd);
  if (!listing) return -1;
  bool goes_on = true;
  while (const dirent *entry = goes_on ? readdir(listing) : nullptr) {
    const std::string_view name = entry->d_name;
    goes_on = name == "." || name == ".." || visit(entry->d_name);
  }
  closedir(listing);
  return goes_on;
}

// Whosever it may be: what is removed is not followed anywhere.
void remove_in(int directory, const std::string &name) {
  if (unlinkat(directory, name.c_str(), 0) == 0) return;
  const int fd = openat(directory, name.c_str(), as_directory);
  if (fd < 0) return;
  for_each_in(fd, [fd](const std::string &each) {
    remove_in(fd, each);
    return true;
  });
  close(fd);
  unlinkat(directory, name.c_str(), AT_REMOVEDIR);
}

}  // namespace

const char *program_name = "?";

bool complain_about(const std::string &path, const char *reason) {
  complain<"%s: %s: %s\n">(program_name, foreign_text{path}, reason);
  return false;
}

bool complain_about(const std::string &path, int error) {
  return complain_about(path, strerror(error));
}

own_directory::own_directory(std::string path, int fd) : path_(std::move(path)), fd_(fd) {
  if (fd_ < 0) {
    complain_about(path_, errno);
  } else if (const char *weakness = weakness_of(fd_)) {
    complain_about(path_, weakness);
    close(std::exchange(fd_, -1));
  }
}

own_directory::~own_directory() {
  if (is_open()) close(fd_);
}

own_directory own_directory::open(const std::string &path) {
  return {path, ::open(path.c_str(), as_directory)};
}

own_directory own_directory::make(const std::string &path) {
  // Those above it, too, as far as they are missing; making the last one tells what went wrong.
  for (std::size_t slash = path.find('/', 1); slash != path.npos; slash = path.find('/', slash + 1)) {
    mkdir(path.substr(0, slash).c_str(), private_mode);
  }
  if (mkdir(path.c_str(), private_mode) != 0 && errno != EEXIST) return {path, -1};
  return open(path);
}

own_directory own_directory::enter(const std::string &name) const {
  if (!is_open()) return {};
  return {name == "." ? path_ : path_of(name), openat(fd_, name.c_str(), as_directory)};
}

own_directory own_directory::make_below(const std::string &name) const {
  const bool is_there = !is_open() || mkdirat(fd_, name.c_str(), private_mode) == 0 || errno == EEXIST;
  return is_there ? enter(name) : own_directory(path_of(name), -1);
}

bool own_directory::for_each(const std::function<bool(const std::string &name)> &visit) const {
  if (!is_open()) return false;
  const int visited = for_each_in(fd_, visit);
  return visited < 0 ? complain_about(path_, errno) : visited > 0;
}

bool own_directory::rename(const std::string &from, const std::string &to) const {
  return renameat(fd_, from.c_str(), fd_, to.c_str()) == 0 || complain_about(path_of(to), errno);
}

void own_directory::remove(const std::string &name) const {
  remove_in(fd_, name);
}
