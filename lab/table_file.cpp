#include "lab/table_file.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <cstdint>
#include <utility>

#include "lab/progress.h"

namespace lab {

namespace {

constexpr std::size_t flush_size = 256 * 1024;

// Hidden, and no other writer's: two simulations of one directory do not spoil each other's files.
std::string temporary_name(const std::string &name) {
  std::uint64_t number = 0;
  if (getentropy(&number, sizeof number) != 0) number = static_cast<std::uint64_t>(getpid());
  return "." + name + "." + std::to_string(number);
}

}  // namespace

table_file::table_file(own_directory folder, std::string name)
    : folder_(std::move(folder)),
      name_(std::move(name)),
      temporary_(temporary_name(name_)),
      fd_(openat(folder_.fd(), temporary_.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC,
                 0600)) {
  if (fd_ < 0) error_ = errno;
}

table_file::~table_file() {
  if (fd_ < 0) return;
  close(fd_);
  folder_.remove(temporary_);
}

void table_file::put(std::span<const std::byte> bytes) {
  size_ += bytes.size();
  buffer_.append(reinterpret_cast<const char *>(bytes.data()), bytes.size());
  if (buffer_.size() < flush_size) return;
  progress::tell<"writing %s: %llu MB">(name_, std::uint64_t{size_ >> 20});
  flush();
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

bool table_file::commit() {
  if (!folder_.is_open()) return false;
  flush();
  if (error_) return complain_about(folder_.path_of(name_), error_);
  const bool closed = close(fd_) == 0 || complain_about(folder_.path_of(name_), errno);
  fd_ = -1;
  if (closed && folder_.rename(temporary_, name_)) return true;
  folder_.remove(temporary_);
  return false;
}

}  // namespace lab
