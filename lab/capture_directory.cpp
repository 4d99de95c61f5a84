#include "lab/capture_directory.h"

#include <sys/stat.h>
#include <sys/utsname.h>
#include <time.h>

#include <algorithm>
#include <cerrno>

#include "common/captured.h"
#include "lab/table_file.h"
#include "platform/sysctl.h"

namespace lab {

namespace {

constexpr char unfinished[] = ".new";

// What the kernel in sight calls its machine; the name of this one where that kernel does not say.
std::string host_name() {
  utsname machine{};
  uname(&machine);
  char name[sizeof machine.nodename + 1];
  std::size_t length = sizeof name;
  std::string host = machine.nodename;
  if (sysctlbyname("kernel.hostname", name, &length, nullptr, 0) == 0) host.assign(name, length);
  if (host.ends_with('\n')) host.pop_back();
  std::ranges::replace(host, '\n', '?');
  return host;
}

}  // namespace

own_directory make_vacant(const std::string &path) {
  own_directory top = own_directory::make(path);
  bool vacant = true;
  const bool listed = top.for_each([&](const std::string & /*name*/) { return vacant = false; });
  if (!vacant) complain_about(path, ENOTEMPTY);
  if (!listed) return {};
  if (fchmod(top.fd(), 0700) == 0) return top;
  complain_about(path, errno);
  return {};
}

bool write_note(const own_directory &top, time_t taken, bool redacted) {
  tm utc;
  char time[32];
  strftime(time, sizeof time, "%Y-%m-%dT%H:%M:%SZ", gmtime_r(&taken, &utc));
  const std::string host = redacted ? capture_note::redacted_host : host_name();
  const std::string text = "format: " + std::string(capture_note::known_format) + "\ntime: " + time +
                           "\nhost: " + host + "\nredacted: " + (redacted ? "yes" : "no") + "\n";
  table_file file(top.enter("."), capture_note::file_name);
  file.put(std::as_bytes(std::span(text)));
  return file.commit();
}

own_directory moment_in_progress(const own_directory &top) {
  return top.make_below(moments_name).make_below(unfinished);
}

bool finish_moment(const own_directory &top, std::int64_t offset) {
  const own_directory moments = top.enter(moments_name);
  return moments.is_open() && moments.rename(unfinished, name_of_offset(offset));
}

void drop_moment(const own_directory &top) {
  top.enter(moments_name).remove(unfinished);
}

}  // namespace lab
