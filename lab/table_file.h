// Files that appear complete or not at all, so that one open of a table is one snapshot.

#ifndef TARVELCTL_LAB_TABLE_FILE_H
#define TARVELCTL_LAB_TABLE_FILE_H

#include <cstddef>
#include <span>
#include <string>
#include <type_traits>

namespace lab {

// A file that is written beside its place and moved there when it is complete. What was never committed
// leaves nothing behind.
class table_file {
 public:
  explicit table_file(std::string path);
  ~table_file();
  table_file(const table_file &) = delete;
  table_file &operator=(const table_file &) = delete;

  void put(std::span<const std::byte> bytes);

  template <class Record>
  void put(const Record &record) {
    static_assert(std::is_trivially_copyable_v<Record>);
    put(std::as_bytes(std::span(&record, 1)));
  }

  // Moves the file to its place. Returns 0, or the error number of the first thing that failed, after which
  // the place is as it was.
  int commit();

 private:
  void flush();

  std::string path_;
  std::string temporary_;
  std::string buffer_;
  int fd_;
  int error_ = 0;
};

}  // namespace lab

#endif
