// A kernel made of files, for the time of a test.

#ifndef TARVELCTL_TESTS_SUPPORT_KERNEL_DIR_H
#define TARVELCTL_TESTS_SUPPORT_KERNEL_DIR_H

#include <stdlib.h>
#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <string>
#include <string_view>
#include <system_error>

// The bytes of a file; empty where there is none.
inline std::string contents_of(const std::filesystem::path &file) {
  std::ifstream in(file, std::ios::binary);
  return {std::istreambuf_iterator<char>(in), {}};
}

// Replaces or creates a file, and the folders on the way to it.
inline void write_file(const std::filesystem::path &file, std::string_view contents) {
  std::filesystem::create_directories(file.parent_path());
  std::ofstream out(file, std::ios::binary | std::ios::trunc);
  out.write(contents.data(), static_cast<std::streamsize>(contents.size())).flush();
  if (!out) throw std::system_error(errno, std::generic_category(), file);
}

// A fresh directory to hand to the tool as TARVEL_ROOT; removed with everything in it at the end.
class kernel_dir {
 public:
  kernel_dir() {
    std::string path = std::filesystem::temp_directory_path() / "tarvelctl-test-XXXXXX";
    if (!mkdtemp(path.data())) throw std::system_error(errno, std::generic_category(), path);
    chmod(path.c_str(), 0755);  // tests that give up their rights look into it, too
    root_ = path;
  }
  ~kernel_dir() {
    std::error_code ignored;
    std::filesystem::remove_all(root_, ignored);
  }
  kernel_dir(const kernel_dir &) = delete;
  kernel_dir &operator=(const kernel_dir &) = delete;

  // Publishes a kernel variable; whoever reads along gets its old contents or the new ones.
  kernel_dir &table(std::string_view name, std::string_view contents) {
    write_file(file("unpublished"), contents);
    std::filesystem::create_directories(table_path(name).parent_path());
    std::filesystem::rename(file("unpublished"), table_path(name));
    return *this;
  }

  // Gives process `pid` a name. `comm` is the whole content of its file, line end included.
  kernel_dir &process(int pid, std::string_view comm) {
    write_file(root_ / "proc" / std::to_string(pid) / "comm", comm);
    return *this;
  }

  // Where the kernel keeps the variable `name`.
  std::filesystem::path table_path(std::string_view name) const {
    std::string path(name);
    std::replace(path.begin(), path.end(), '.', '/');
    return root_ / "proc/sys" / path;
  }

  // A path in this directory, away from the kernel's files, for a test's own use.
  std::filesystem::path file(std::string_view name) const { return root_ / name; }

  const std::filesystem::path &root() const { return root_; }

 private:
  std::filesystem::path root_;
};

#endif
