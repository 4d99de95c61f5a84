#include "tests/support/kernel_dir.h"

#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <fstream>
#include <iterator>
#include <system_error>

namespace fs = std::filesystem;

kernel_dir::kernel_dir() {
  std::string path = fs::temp_directory_path() / "tarvelctl-test-XXXXXX";
  if (!mkdtemp(path.data())) throw std::system_error(errno, std::generic_category(), path);
  chmod(path.c_str(), 0755);  // tests that give up their rights look into it, too
  root_ = path;
}

kernel_dir::~kernel_dir() {
  std::error_code ignored;
  fs::remove_all(root_, ignored);
}

fs::path kernel_dir::table_path(std::string_view name) const {
  std::string path(name);
  std::replace(path.begin(), path.end(), '.', '/');
  return root_ / "proc/sys" / path;
}

kernel_dir &kernel_dir::table(std::string_view name, std::string_view contents) {
  const fs::path unpublished = file("unpublished");
  write_file(unpublished, contents);
  fs::create_directories(table_path(name).parent_path());
  fs::rename(unpublished, table_path(name));
  return *this;
}

kernel_dir &kernel_dir::process(int pid, std::string_view comm) {
  write_file(root_ / "proc" / std::to_string(pid) / "comm", comm);
  return *this;
}

std::string contents_of(const fs::path &file) {
  std::ifstream in(file, std::ios::binary);
  return {std::istreambuf_iterator<char>(in), {}};
}

void write_file(const fs::path &file, std::string_view contents) {
  fs::create_directories(file.parent_path());
  std::ofstream out(file, std::ios::binary | std::ios::trunc);
  out.write(contents.data(), static_cast<std::streamsize>(contents.size())).flush();
  if (!out) throw std::system_error(errno, std::generic_category(), file);
}
