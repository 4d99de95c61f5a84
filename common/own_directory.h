// Directories that are the caller's alone.
//
// Whoever may write to a directory can put a link, a pipe or a file of their own where a program is about
// to read or write. So from the directory that a command names down, everything is reached through
// directories that are held open, one name at a time: no link is followed, and a directory that belongs to
// someone else, or that others may write to, is refused. How the named one is reached is its caller's choice.

#ifndef TARVELCTL_COMMON_OWN_DIRECTORY_H
#define TARVELCTL_COMMON_OWN_DIRECTORY_H

#include <functional>
#include <string>
#include <utility>

// The program that messages name; its main() says so before anything else. Not tarvelctl, which has messages
// of its own.
extern const char *program_name;

// Says on standard error what is wrong with `path`: "PROGRAM: PATH: REASON". Returns false.
bool complain_about(const std::string &path, const char *reason);
bool complain_about(const std::string &path, int error);

// An open directory, or none: what fails says so on standard error, and nothing more comes of none.
class own_directory {
 public:
  own_directory() = default;
  own_directory(own_directory &&other) noexcept
      : path_(std::move(other.path_)), fd_(std::exchange(other.fd_, -1)) {}
  own_directory &operator=(own_directory &&other) noexcept {
    std::swap(path_, other.path_);
    std::swap(fd_, other.fd_);
    return *this;
  }
  ~own_directory();

  // The one that a command names, which must be there or is made, with those above it. A link is followed
  // only where a "/" ends the name.
  static own_directory open(const std::string &path);
  static own_directory make(const std::string &path);

  // One below it. A new one is for its owner only.
  own_directory enter(const std::string &name) const;
  own_directory make_below(const std::string &name) const;

  bool is_open() const { return fd_ >= 0; }
  int fd() const { return fd_; }
  const std::string &path() const { return path_; }
  std::string path_of(const std::string &name) const { return path_ + "/" + name; }

  // Calls `visit` with each name in it, until that returns false. Returns whether all were visited.
  bool for_each(const std::function<bool(const std::string &name)> &visit) const;

  // Moves what is in it to another name, in place of what may be there.
  bool rename(const std::string &from, const std::string &to) const;

  // Removes what has this name, and all below it, as far as that is possible. Says nothing.
  void remove(const std::string &name) const;

 private:
  own_directory(std::string path, int fd);

  std::string path_;
  int fd_ = -1;
};

#endif
