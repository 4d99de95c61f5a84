// json: tables as lines, of one moment or of many.

#include <poll.h>
#include <time.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <optional>

#include "common/captured.h"
#include "common/own_directory.h"
#include "common/tables/table_walk.h"
#include "common/text/output.h"
#include "export/command_line.h"
#include "export/json_text.h"
#include "export/line_plan.h"
#include "export/replaced_file.h"

namespace exporter {

namespace {

// "2026-11-23T16:19:21.042Z"
std::string time_text(std::int64_t nanoseconds) {
  constexpr std::int64_t second = 1'000'000'000, millisecond = 1'000'000;
  const time_t seconds = nanoseconds / second;
  tm parts{};
  gmtime_r(&seconds, &parts);
  char text[64];
  const std::size_t size = strftime(text, sizeof text, "%Y-%m-%dT%H:%M:%S", &parts);
  std::snprintf(text + size, sizeof text - size, ".%03dZ",
                static_cast<int>(nanoseconds % second / millisecond));
  return text;
}

// A kind of lines that is asked for, with all that stays the same from line to line.
struct line_kind {
  const kind *of;
  record_plan parent;
  record_plan plan;
};

class line_writer {
 public:
  explicit line_writer(const options &asked) : host_(asked.host) {
    for (const kind &each : all_kinds()) {
      if (!asked.kinds.empty() && std::ranges::find(asked.kinds, &each) == asked.kinds.end()) continue;
      kinds_.push_back({&each, {each.parent_keys, "", "", processes_}, {each.keys, "", "}\n", processes_}});
      if (tables_.empty() || tables_.back() != each.table) tables_.push_back(each.table);
    }
  }

  std::span<const table_description *const> tables() const { return tables_; }

  // Writes all lines of a moment. False, after a message for each table that is not all there.
  bool write(const moment &now) {
    processes_.clear();
    const bool is_known = host_ || !now.host.empty();
    const std::string host = is_known ? quoted(host_ ? host_ : std::string_view(now.host)) : "null";
    bool is_whole = now.tables.size() == tables_.size();
    for (const table_reading &reading : now.tables) {
      if (reading.error) {
        is_whole = complain_about(reading.what->node, reading.error);
      } else {
        is_whole &= write_table(reading, host);
      }
    }
    return is_whole;
  }

 private:
  bool write_table(const table_reading &reading, const std::string &host) const {
    bool is_whole = true;
    std::uint64_t left_out = 0;
    for (const line_kind &each : kinds_) {
      if (each.of->table != reading.what) continue;
      left_out = 0;
      const std::string head = R"({"schema":)" + std::to_string(schema_version) + R"(,"kind":)" +
                               quoted(each.of->name) + R"(,"time":)" + quoted(time_text(reading.wall)) +
                               R"(,"host":)" + host + ",";
      is_whole = write_kind(each, head, reading.bytes(), left_out);
    }
    if (left_out) {
      complain<"%s: %s: too many followers claimed by %llu records, which are left out\n">(
          program_name, reading.what->node, left_out);
    }
    if (!is_whole) complain_about(reading.what->node, "ends inside a record");
    return is_whole && !left_out;
  }

  // False where the table ends inside a record. Counts those that claim more than there can be.
  static bool write_kind(const line_kind &which, const std::string &head, record_bytes table,
                         std::uint64_t &left_out) {
    std::string whole_head = head;
    return walk_table(*which.of->table->record, table, [&](const found_record &found) {
      if (found.what == which.of->parent) whole_head = head + which.parent.text(found.bytes) + ",";
      if (found.what != which.of->record) return;
      for (const follower &behind : found.what->followers) {
        if (behind.count.in(found.bytes) > behind.most) {
          ++left_out;
          return;
        }
      }
      which.plan.put(report, whole_head, found.bytes, found.followers, true);
    });
  }

  const char *host_;
  process_texts processes_;
  std::vector<line_kind> kinds_;
  std::vector<const table_description *> tables_;
};

constexpr std::int64_t in_millisecond = 1'000'000;

std::int64_t monotonic_milliseconds() {
  timespec now{};
  clock_gettime(CLOCK_MONOTONIC, &now);
  return std::int64_t{now.tv_sec} * 1000 + now.tv_nsec / in_millisecond;
}

// Waits until the clock is at `due`, or the reader has gone: the next write then tells.
void wait_until(std::int64_t due) {
  for (std::int64_t left; (left = due - monotonic_milliseconds()) > 0;) {
    const timespec timeout{.tv_sec = left / 1000, .tv_nsec = left % 1000 * in_millisecond};
    pollfd reader{.fd = STDOUT_FILENO, .events = 0, .revents = 0};
    if (ppoll(&reader, 1, &timeout, nullptr) > 0) return;
  }
}

// Moments come at their times on the clock, so that none drifts; those for which there is no time are left
// out.
bool write_live(const options &asked, line_writer &writer) {
  bool is_whole = true;
  std::int64_t due = monotonic_milliseconds();
  for (std::uint64_t written = 0;;) {
    is_whole &= writer.write(read_moment(writer.tables()));
    report.flush();
    if (++written == asked.count || !asked.every) return is_whole;
    due += (1 + (monotonic_milliseconds() - due) / asked.every) * asked.every;
    wait_until(due);
  }
}

bool write_captured(const options &asked, line_writer &writer) {
  const std::optional<captured> found = look_into(asked.capture);
  if (!found) return false;
  bool is_whole = true;
  for (const captured_moment &each : found->moments) {
    is_whole &= writer.write(read_captured(*found, each, writer.tables()));
  }
  return is_whole;
}

}  // namespace

int write_lines(const options &asked) {
  if (!asked.file.empty() && !begin_replacement(asked.file)) return EXIT_FAILURE;
  line_writer writer(asked);
  const bool is_whole = asked.capture.empty() ? write_live(asked, writer) : write_captured(asked, writer);
  const bool is_in_place = asked.file.empty() || commit_replacement();
  return is_whole && is_in_place ? EXIT_SUCCESS : EXIT_FAILURE;
}

}  // namespace exporter
