// Captures as moments, and what belongs together in a moment.

#include "common/joins.h"

#include <sys/resource.h>

#include "common/captured.h"
#include "common/own_directory.h"
#include "tests/units/units.h"

namespace {

constexpr const table_description *flows_only[] = {&all_tables[3]};

using captures = kernel_files;

TEST_F(captures, MomentsComeInOrderWithTheirOwnTimes) {
  put("sys/kern/tarvel/stats/flow", "0");
  put("../capture.txt", "format: 1\nhost: a\x1b\nhost: b\ntime: 2026-11-23T16:19:21Z\n");
  for (const std::string name : {"10.000", "99999999999.000", "2.000", "0.010", "02.000"}) {
    put("../moments/" + name + "/proc/sys/kern/tarvel/stats/flow", name);
  }
  const captured found = look_into(root + "/.").value();
  EXPECT_FALSE(shows_redacted_capture());
  std::string seen;
  for (const captured_moment &each : found.moments) {
    const moment read = read_captured(found, each, flows_only);
    const table_reading &flow = read.tables.at(0);
    EXPECT_EQ(read.host, "a\x1b");
    for (const std::byte byte : flow.bytes()) seen += static_cast<char>(byte);
    seen += " " + std::to_string(flow.monotonic) + " " + std::to_string(flow.wall) + "\n";
  }
  EXPECT_EQ(seen,
            "0 0 1795450761000000000\n"
            "0.010 10000000 1795450761010000000\n"
            "02.000 2000000000 1795450763000000000\n"
            "2.000 2000000000 1795450763000000000\n"
            "10.000 10000000000 1795450771000000000\n"
            "99999999999.000 9223372036854000000 9223372036854000000\n");
}

TEST_F(captures, OnlyATimeIsTakenForOne) {
  put("sys/kernel/hostname", "c\n");
  const captured no_capture = look_into(root).value();
  const moment now = read_captured(no_capture, no_capture.moments.at(0), flows_only);
  EXPECT_EQ(std::tuple(no_capture.is_capture, now.host, now.tables[0].error),
            std::tuple(false, "c"s, ENOENT));
  EXPECT_GT(now.tables[0].wall, 1'700'000'000'000'000'000);
  for (const std::string time :
       {"1970-01-01T00:00:00Z", "9999-12-31T23:59:59Z", "", "noon", "1969-12-31T23:59:59Z",
        "12026-11-23T16:19:21Z", "-026-11-23T16:19:21Z", "2026-13-23T16:19:21Z", "2026-02-29T16:19:21Z",
        "2026-11-23T24:19:21Z", "2026-11-23T16:60:21Z", "2026-11-23T16:19:60Z", "2026-11-23T16:19:2:Z",
        "2026-11-23T16:19:21 "}) {
    put("../capture.txt", "redacted: yes\nhost: b\nformat: 1\ntime: " + time);
    const captured found = look_into(root).value();
    const std::int64_t expected = time[0] == '9' ? 253402300799000 : time.starts_with("1970") ? 0 : -1;
    EXPECT_EQ(found.note.began.value_or(-1), expected) << time;
    EXPECT_EQ(read_captured(found, found.moments[0], {}).host, "redacted");
    EXPECT_TRUE(shows_redacted_capture());
  }
}

TEST_F(captures, DirectoriesSayWhatFails) {
  fs::create_directory(root + "/kept");
  const own_directory top = own_directory::open(root);
  const capture said(diagnostics);
  EXPECT_FALSE(own_directory::make("/proc/none").is_open() || top.make_below("a/b").is_open() ||
               top.rename("a", "b"));
  rlimit usual;
  getrlimit(RLIMIT_NOFILE, &usual);
  const rlimit none{0, usual.rlim_max};
  setrlimit(RLIMIT_NOFILE, &none);
  EXPECT_FALSE(top.for_each([](const std::string &) { return true; }));
  top.remove("kept");
  setrlimit(RLIMIT_NOFILE, &usual);
  EXPECT_TRUE(fs::exists(root + "/kept"));
  const std::string missing = ": No such file or directory\n?: " + root;
  EXPECT_EQ(said.text(),
            "?: /proc/none" + missing + "/a/b" + missing + "/b" + missing + ": Too many open files\n");
}

// A line is a record: its size, and what is at its offsets, a 'letter 16 times, a number=, or a :text.
std::string table(const std::string &text) {
  std::string made, line;
  for (std::istringstream lines(text); std::getline(lines, line);) {
    std::istringstream words(line);
    std::size_t size, at;
    words >> size;
    std::string record(size, '\0'), value;
    for (char kind; words >> at >> kind >> value; record.replace(at, value.size(), value)) {
      const int number = kind == '=' ? std::stoi(value) : 0;
      if (kind == '=') value.assign(reinterpret_cast<const char *>(&number), sizeof number);
      if (kind == '\'') value.resize(16, value[0]);
    }
    made += record;
  }
  return made;
}

// A byte of what was found, or "-".
std::string byte(record_bytes found, std::size_t at = 0) {
  return found.empty() ? "-" : std::string(1, static_cast<char>(found[at]));
}
std::string byte(const channel_ref &found) {
  return byte(record_bytes(found.entry, found.entry_size));
}

class joined : public kernel_files {
 protected:
  void put_table(const std::string &name, const std::string &bytes) { put("sys/kern/tarvel/" + name, bytes); }

  // What each of these flows has: its channel, owner, advisory, route and arena.
  std::string found(const std::string &lines) {
    taken = read_moment();
    in.emplace(taken);
    std::string seen;
    const std::string flows = table(lines);
    for (std::size_t i = 0; i < flows.size() / 320; ++i) {
      const auto flow = record_at<tv_stats_flow>(std::as_bytes(std::span(flows)), i);
      seen += byte(in->channel_of(flow)) + byte(in->owner_of(flow), 36) + byte(in->advisory_of(flow)) +
              byte(in->route_of(flow), 36) + byte(in->arena_of(flow)) + " ";
    }
    return seen;
  }

  moment taken;
  std::optional<joins> in;
};

TEST_F(joined, NexusesHaveProvidersAndInterfaces) {
  put_table("nexus_provider_list", table("296 64:switch 128=3 256=2 264'N 280'M\n"
                                         "296 64:b 128=99 256=2 264'N 280'O\n"
                                         "290 64:cut 128=3 256=2 264'P"));
  put_table("stats/net_if", table("320 0'I 16:en0\n319 0'M 16:en1"));
  put_table("stats/flow_switch", table("448 0'I 16:en2\n448 0'N 16:sixteen_bytes_.."));
  std::string seen = found("") + std::string(joins(moment()).interface_of({}));
  for (const char letter : "NMOPI"s) {
    uuid nexus;
    std::memset(nexus.bytes, letter, sizeof nexus.bytes);
    seen.append(in->provider_name_of(nexus)).append("/").append(in->interface_of(nexus));
    seen += byte(in->provider_of(nexus), 295) + " ";
  }
  EXPECT_EQ(seen, "swi/sixteen_bytes_..M swi/M b/O /- /en0- ");
}

TEST_F(joined, FlowsHaveWhatIsAtTheirPortAndTheirAdvisory) {
  put_table("nexus_channel_list", table("72 0'M 16=1 24'a 52=2\n24 0'O\n24 0'N 16=4\n232 0'b 28=1 36=1\n"
                                        "48 0'c 28=2\n48 0'd 28=2\n48 0'e 28=-1"));
  put_table("stats/flow_owner", table("128 0'M 36:m 72=1\n128 0'N 36:n 72=2\n128 0'N 36:o 72=-1"));
  put_table("stats/flow_adv", table("80 0'N 36=2 40'e 60'f\n10300 0'M 36=513\n10280 0'O 36=512 10260'g\n"
                                    "100 0'N 36=3 80'h"));
  EXPECT_EQ(found("320 0'N 76=2 144=1\n320 0'M 76=2\n320 0'M 76=1 144=512\n320 0'N 76=1 144=2\n"
                  "320 0'O 76=2 144=511\n320 0'O 76=2 144=512\n320 0'N 76=-1 144=-1"),
            "cnf-- a---- -m--- b---- --g-- ----- ----- ");
}

// The ports, and what of an address the family does not mean, may hold anything.
TEST_F(joined, FlowsHaveTheRouteBetweenTheirEnds) {
  put_table("stats/flow_route", table("256 32:en0 36:a 72:xxxx 76=1 100=512 104=2 108'x\n"
                                      "256 32:en0 36:b 76=2 100=512 104=1\n"
                                      "256 32:en0 36:c 76=3 80'1 100=7680 104=4 108'2\n"
                                      "256 32:en1 36:d 76=1 100=512 104=2\n"
                                      "256 32:en0 36:e 76=1 100=512 104=2\n"
                                      "256 32:en0 36:f 76=1 100=768 104=2"));
  EXPECT_EQ(found("320 16:en0 80=512 84=1 88'y 108:yyyy 112=2\n320 16:en0 80=512 84=2 112=1\n"
                  "320 16:en0 80=7680 88'1 116'2\n320 16:en1 80=512 84=1 112=2\n"
                  "320 16:en0 80=768 84=1 112=2\n320 16:en0 80=512 84=1 112=1\n320 16:en 80=512 84=1 112=2"),
            "---a- ---b- ---c- ---d- ----- ----- ----- ");
}

TEST_F(joined, ArenasBelongToPortsAndProcesses) {
  const std::string longest(60, 'l');
  put_table("nexus_provider_list",
            table("280 64:sw 128=2 256=1 264'N\n280 64:" + longest + " 128=60 256=1 264'L"));
  put_table("nexus_channel_list", table("24 0'N 16=5\n48 0'a 20=5 28=2\n48 0'b 20=6 28=3\n48 0'c 20=6 28=4\n"
                                        "48 0'd 20=7 28=5\n48 0'e 20=8 28=6"));
  put_table("stats/flow", table("320 0'N 68=5\n320 0'M 68=6\n320 0'O 68=5"));
  std::string arenas;
  for (const std::string &arena :
       {"0:sw.port2 64=2 352'R 2576=4"s, "0:SW 352'R 2576=5 2580=5 2584=6 2592=7"s,
        "0:sw.port2 352'R 2576=9"s, "0:sw.port2 352'R 2576=5"s, "0:TW 352'S 2576=7"s,
        "0:UW 352'S 2576=6 2580=8"s, "0:VW 352'S 2576=8"s, "0:" + longest + ".por 352'R 2576=5"}) {
    arenas +=
        table("2608 144'E 232=1000 240=100 392=1 440=10 448=1 " + arena);  // the first region has no segments
  }
  put_table("stats/arena", arenas);
  // By name and process; of one with several; alone, but not of the only channel; alone; without any.
  EXPECT_EQ(found("320 0'N 68=5 76=2\n320 0'N 68=9 76=2\n320 0'N 68=5 76=3\n320 0'N 68=6 76=3\n"
                  "320 0'N 68=8 76=6\n320 0'N 68=7 76=2\n320 0'N 68=7 76=5\n320 0'L 68=5 76=2\n"
                  "320 0'L 68=7 76=-1\n320 0'N 68=4 76=2"),
            "a---s a---s b---- b---- e---- a---- d---T ----- ----- a---- ");
  std::string seen;
  in->for_each_flow_of(5, [&](record_bytes each) { seen += byte(each); });
  in->for_each_channel_of(6, [&](const channel_ref &each) { seen += byte(each); });
  in->for_each_arena_of(5, [&](record_bytes each) { seen += byte(each); });
  for (const int pid : {5, 6, 7, 4}) {
    const joins::memory memory = in->memory_of(pid);
    seen += " " + std::to_string(memory.total) + "+" + std::to_string(memory.wired);
  }
  EXPECT_EQ(seen, "NObcSsl 10+1 20+2 10+1 10+1");
}

// As many searches as would take minutes if each of them looked at all that are equal.
TEST_F(joined, EqualRecordsCostNoMoreThanOthersAndMissingTablesHoldNothing) {
  std::string channels, flows, expected;
  for (int i = 0; i < 200'000; ++i) {
    channels += i ? "48 0'c 20=5 28=2\n" : "24 0'N 16=199999\n";
    flows += "320 0'N 68=5 76=2 80=512\n";
    expected += "c---- ";
  }
  put_table("nexus_channel_list", table(channels));
  EXPECT_TRUE(found(flows) == expected);
}

}  // namespace
