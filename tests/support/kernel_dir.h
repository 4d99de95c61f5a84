// A kernel made of files, for the time of a test.

#ifndef TARVELCTL_TESTS_SUPPORT_KERNEL_DIR_H
#define TARVELCTL_TESTS_SUPPORT_KERNEL_DIR_H

#include <filesystem>
#include <string>
#include <string_view>

// A fresh directory to hand to the tool as TARVEL_ROOT; removed with everything in it at the end.
class kernel_dir {
 public:
  kernel_dir();
  ~kernel_dir();
  kernel_dir(const kernel_dir &) = delete;
  kernel_dir &operator=(const kernel_dir &) = delete;

  // Publishes a kernel variable such as "kern.tarvel.stats.flow", also in place of its former contents:
  // whoever reads along gets the one or the other.
  kernel_dir &table(std::string_view name, std::string_view contents);

  // Gives process `pid` a name. `comm` is the whole content of its file, line end included.
  kernel_dir &process(int pid, std::string_view comm);

  // Where the kernel keeps the variable `name`.
  std::filesystem::path table_path(std::string_view name) const;

  // A path in this directory, away from the kernel's files, for a test's own use.
  std::filesystem::path file(std::string_view name) const { return root_ / name; }

  const std::filesystem::path &root() const { return root_; }

 private:
  std::filesystem::path root_;
};

// The bytes of a file; empty where there is none.
std::string contents_of(const std::filesystem::path &file);

// Replaces or creates a file, and the folders on the way to it.
void write_file(const std::filesystem::path &file, std::string_view contents);

#endif
