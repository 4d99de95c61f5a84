#include "lab/root_directory.h"

#include <fcntl.h>
#include <unistd.h>

#include <charconv>

#include "lab/programs.h"
#include "lab/tables.h"

namespace lab {

namespace {

using step = own_directory (own_directory::*)(const std::string &) const;

constexpr char processes_name[] = "proc";

// The folder of a table's file, proc/sys/kern/tarvel/stats for kern.tarvel.stats.flow; `go` enters or makes
// each on the way.
own_directory folder_of(std::string_view node, const own_directory &top, step go) {
  own_directory folder = ((top.*go)(processes_name).*go)("sys");
  for (std::size_t dot; (dot = node.find('.')) != node.npos; node.remove_prefix(dot + 1)) {
    folder = (folder.*go)(std::string(node.substr(0, dot)));
  }
  return folder;
}

// Whether this is how a process id is written: what only begins like one may be out of its range.
bool is_pid(const std::string &name) {
  std::int32_t pid = 0;
  std::from_chars(name.data(), name.data() + name.size(), pid);
  return pid > 0 && std::to_string(pid) == name;
}

bool remove_name(const own_directory &processes, const std::string &pid) {
  const own_directory process = processes.enter(pid);
  if (!process.is_open()) return false;
  unlinkat(process.fd(), "comm", 0);
  unlinkat(processes.fd(), pid.c_str(), AT_REMOVEDIR);
  return true;
}

}  // namespace

bool root_directory::prepare() {
  for (const table &row : tables) {
    if (!folder_of(row.what->node, top_, &own_directory::make_below).is_open()) return false;
  }
  return true;
}

bool root_directory::remove_processes() {
  const own_directory processes = top_.enter(processes_name);
  return processes.for_each(
      [&](const std::string &name) { return !is_pid(name) || remove_name(processes, name); });
}

table_file root_directory::new_table(std::string_view node) const {
  const std::string_view name = node.substr(node.rfind('.') + 1);
  return {folder_of(node, top_, &own_directory::enter), std::string(name)};
}

bool root_directory::put_process(std::int32_t pid, std::string_view name) {
  table_file file(top_.enter(processes_name).make_below(std::to_string(pid)), "comm");
  file.put(std::as_bytes(std::span(name)));
  file.put('\n');
  return file.commit();
}

bool root_directory::put_host(std::string_view name) {
  const own_directory system = top_.enter(processes_name).enter("sys");
  if (name.empty()) {
    system.remove("kernel");
    return true;
  }
  table_file file(system.make_below("kernel"), "hostname");
  file.put(std::as_bytes(std::span(name.substr(0, 64))));  // as long as hosts have them
  file.put('\n');
  return file.commit();
}

bool root_directory::publish(world &state) {
  for (const std::uint32_t index : state.started) {
    const process &source = state.processes[index];
    if (!put_process(source.pid, programs[source.program].name)) return false;
  }
  for (const table &row : tables) {
    table_file file = new_table(row.what->node);
    row.write(state, file);
    if (!file.commit()) return false;
  }
  for (const std::int32_t pid : state.ended) {
    if (!remove_name(top_.enter(processes_name), std::to_string(pid))) return false;
  }
  state.started.clear();
  state.ended.clear();
  return true;
}

}  // namespace lab
