#include "common/moment.h"

#include <time.h>

#include <string_view>

#include "platform/sysctl.h"

namespace {

constexpr char host_node[] = "kernel.hostname";

std::int64_t now_by(clockid_t clock) {
  timespec now{};
  clock_gettime(clock, &now);
  return std::int64_t{now.tv_sec} * 1'000'000'000 + now.tv_nsec;
}

// Where it is longer than any kernel's, there is none.
std::string host_name() {
  char text[256];
  std::size_t length = sizeof text;
  if (sysctlbyname(host_node, text, &length, nullptr, 0) != 0) return {};
  const std::string_view whole(text, length);
  return std::string(whole.substr(0, whole.find_first_of(std::string_view("\0\n", 2))));
}

table_reading read_table(const table_description &table) {
  table_reading made{.what = &table};
  made.error = made.content.fetch_quietly(table.node);
  made.monotonic = now_by(CLOCK_MONOTONIC);
  made.wall = now_by(CLOCK_REALTIME);
  return made;
}

}  // namespace

const table_reading *moment::find(const table_description &table) const {
  const auto found = std::ranges::find(tables, &table, &table_reading::what);
  return found == tables.end() ? nullptr : &*found;
}

moment read_moment(std::span<const table_description *const> wanted) {
  moment made{.tables = {}, .host = host_name()};
  for (const table_description *table : wanted) made.tables.push_back(read_table(*table));
  return made;
}

moment read_moment() {
  std::vector<const table_description *> every;
  for (const table_description &table : all_tables) every.push_back(&table);
  return read_moment(every);
}
