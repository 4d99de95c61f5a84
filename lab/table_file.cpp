#include "lab/table_file.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <utility>

namespace lab {

namespace {

constexpr std::size_t flush_size = 256 * 1024;

// Hidden, and no other writer's: two simulations of one directory do not spoil each other's files.
std::string temporary_path(const std::string &path) {
  const std::size_t name = path.rfind('/') + 1;
  return path.substr(0, name) + "." + path.substr(name) + "." + std::to_string(getpid());
}

}  // namespace

table_file::table_file(std::string path)
    : path_(std::move(path)),
      temporary_(temporary_path(path_)),
      fd_(open(temporary_.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_NOFOLLOW | O_CLOEXEC, 0666)) {
  if (fd_ < 0) error_ = errno;
}

table_file::~table_file() {
  if (fd_ < 0) return;
  close(fd_);
  unlink(temporary_.c_str());
}

void table_file::put(std::span<const std::byte> bytes) {
  buffer_.append(reinterpret_cast<const char *>(bytes.data()), bytes.size());
  if (buffer_.size() >= flush_size) flush();
}

void table_file::flush() {
  for (std::size_t done = 0; done < buffer_.size() && !error_;) {
    const ssize_t written = write(fd_, buffer_.data() + done, buffer_.size() - done);
    if (written > 0) {
      done += static_cast<std::size_t>(written);
    } else if (written == 0 || errno != EINTR) {
      error_ = written == 0 ? EIO : errno;
    }
  }
  buffer_.clear();
}

int table_file::commit() {
  flush();
  if (error_) return error_;
  const bool closed = close(fd_) == 0;
  fd_ = -1;
  if (closed && std::rename(temporary_.c_str(), path_.c_str()) == 0) return 0;
  const int error = errno;
  unlink(temporary_.c_str());
  return error;
}

}  // namespace lab
