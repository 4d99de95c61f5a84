// Files that appear complete or not at all, so that one open of a table is one snapshot.

#ifndef TARVELCTL_LAB_TABLE_FILE_H
#define TARVELCTL_LAB_TABLE_FILE_H

#include <cstddef>
#include <ranges>
#include <span>
#include <string>
#include <type_traits>

#include "common/own_directory.h"

namespace lab {

// What is all in its own bytes: neither points to the rest nor is a view of it, as a span is.
template <class T>
concept plain_record = std::is_trivially_copyable_v<T> && !std::is_pointer_v<T> && !std::ranges::range<T>;
static_assert(plain_record<char> && !plain_record<std::span<const char>>);

// A file, for its owner only, that is written beside its place and moved there when it is complete. What was
// never committed leaves nothing behind.
class table_file {
 public:
  table_file(own_directory folder, std::string name);
  ~table_file();
  table_file(const table_file &) = delete;
  table_file &operator=(const table_file &) = delete;

  void put(std::span<const std::byte> bytes);

  template <plain_record Record>
  void put(const Record &record) {
    put(std::as_bytes(std::span(&record, 1)));
  }

  // The bytes put so far.
  std::size_t size() const { return size_; }

  // Moves the file to its place. False, with the place as it was, after a message about the first thing that
  // failed.
  bool commit();

 private:
  void flush();

  own_directory folder_;
  std::string name_;
  std::string temporary_;
  std::string buffer_;
  std::size_t size_ = 0;
  int fd_;
  int error_ = 0;
};

}  // namespace lab

#endif
