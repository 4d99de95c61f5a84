#include "lab/root_directory.h"

#include <dirent.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>

#include "common/output.h"
#include "lab/programs.h"
#include "lab/table_file.h"
#include "lab/tables.h"

namespace lab {

namespace {

// Makes a directory and those above it. Returns 0 or an error number.
int make_directories(const std::string &path, mode_t mode) {
  if (mkdir(path.c_str(), mode) == 0 || errno == EEXIST) return 0;
  const std::size_t slash = path.rfind('/');
  if (errno != ENOENT || slash == 0 || slash == path.npos) return errno;
  if (const int error = make_directories(path.substr(0, slash), 0777)) return error;
  return mkdir(path.c_str(), mode) == 0 || errno == EEXIST ? 0 : errno;
}

// Of a name, which is not empty.
bool is_number(const char *text) {
  return text[std::strspn(text, "0123456789")] == '\0';
}

}  // namespace

bool complain_about(const std::string &path, int error) {
  complain<"tarvellab: %s: %s\n">(path, strerror(error));
  return false;
}

std::string root_directory::table_path(std::string_view node) const {
  std::string path = path_ + "/proc/sys/";
  for (const char c : node) path += c == '.' ? '/' : c;
  return path;
}

bool root_directory::prepare(unsigned mode) {
  if (const int error = make_directories(path_, mode)) return complain_about(path_, error);
  for (const table &row : tables) {
    const std::string path = table_path(row.node);
    const std::string folder = path.substr(0, path.rfind('/'));
    if (const int error = make_directories(folder, 0777)) return complain_about(folder, error);
  }
  return true;
}

bool root_directory::remove_processes() {
  const std::string processes = path_ + "/proc";
  DIR *listing = opendir(processes.c_str());
  if (!listing) return complain_about(processes, errno);
  while (const dirent *entry = readdir(listing)) {
    if (is_number(entry->d_name))
      remove_process(static_cast<std::int32_t>(std::strtol(entry->d_name, nullptr, 10)));
  }
  closedir(listing);
  return true;
}

bool root_directory::put_table(std::string_view node, std::span<const std::byte> bytes) {
  table_file file(table_path(node));
  file.put(bytes);
  if (const int error = file.commit()) return complain_about(table_path(node), error);
  return true;
}

bool root_directory::put_process(std::int32_t pid, std::string_view name) {
  const std::string folder = path_ + "/proc/" + std::to_string(pid);
  if (const int error = make_directories(folder, 0777)) return complain_about(folder, error);
  table_file file(folder + "/comm");
  file.put(std::as_bytes(std::span(name)));
  file.put('\n');
  if (const int error = file.commit()) return complain_about(folder + "/comm", error);
  return true;
}

void root_directory::remove_process(std::int32_t pid) {
  const std::string folder = path_ + "/proc/" + std::to_string(pid);
  unlink((folder + "/comm").c_str());
  rmdir(folder.c_str());
}

bool root_directory::publish(const world &state) {
  for (const std::uint32_t index : state.started) {
    const process &source = state.processes[index];
    if (!put_process(source.pid, programs[source.program].name)) return false;
  }
  for (const table &row : tables) {
    table_file file(table_path(row.node));
    row.write(state, file);
    if (const int error = file.commit()) return complain_about(table_path(row.node), error);
  }
  for (const std::int32_t pid : state.ended) remove_process(pid);
  return true;
}

}  // namespace lab
