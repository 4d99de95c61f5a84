// Captures as moments, and what belongs together in a moment.

#include "common/joins.h"

#include <filesystem>

#include "common/captured.h"
#include "tests/units/units.h"

namespace {

namespace fs = std::filesystem;

constexpr std::uint32_t many = 200'000;

template <class Number>
std::string raw(Number number) {
  return {reinterpret_cast<const char *>(&number), sizeof number};
}
std::string id(char letter) {
  return std::string(16, letter);
}
uuid id_of(char letter) {
  uuid made;
  std::memset(made.bytes, letter, sizeof made.bytes);
  return made;
}

// A record of this size with these bytes at these offsets.
std::string record(std::size_t size, std::initializer_list<std::pair<std::size_t, std::string>> fields) {
  std::string made(size, '\0');
  for (const auto &[at, bytes] : fields) made.replace(at, bytes.size(), bytes);
  return made;
}

// A directory that stands for a machine.
struct directory {
  directory() { EXPECT_TRUE(mkdtemp(root.data())); }
  ~directory() {
    unsetenv("TARVEL_ROOT");
    fs::remove_all(root);
  }
  void put(const std::string &path, const std::string &text) const {
    fs::create_directories(fs::path(root + "/" + path).parent_path());
    std::ofstream(root + "/" + path) << text;
  }
  void put_table(const std::string &name, const std::string &bytes) const {
    put("proc/sys/kern/tarvel/" + name, bytes);
  }
  moment read() const {
    setenv("TARVEL_ROOT", root.c_str(), 1);
    return read_moment();
  }
  std::string root = "/tmp/tarvelctl-test-XXXXXX";
};

constexpr const table_description *flows_only[] = {&all_tables[3]};

TEST(captured, MomentsComeInOrderWithTheirOwnTimes) {
  const directory place;
  place.put("capture.txt", "format: 1\nhost: a\x1b\nhost: b\ntime: 2026-11-23T16:19:21Z\n");
  place.put_table("stats/flow", "0");
  for (const std::string offset : {"10.000", "99999999999.000", "2.000", "0.010", "02.000"}) {
    place.put("moments/" + offset + "/proc/sys/kern/tarvel/stats/flow", offset);
  }
  const captured found = look_into(place.root + "/.").value();
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

TEST(captured, NoTimeIsGuessed) {
  const directory place;
  place.put_table("stats/flow", "");
  for (const std::string time :
       {"", "noon", "1970-01-01T00:00:00Z", "9999-12-31T23:59:59Z", "1969-12-31T23:59:59Z",
        "12026-11-23T16:19:21Z", "-026-11-23T16:19:21Z", "2026-13-23T16:19:21Z", "2026-02-29T16:19:21Z",
        "2026-11-23T24:19:21Z", "2026-11-23T16:60:21Z", "2026-11-23T16:19:60Z", "2026-11-23T16:19:2:Z",
        "2026-11-23T16:19:21 "}) {
    place.put("capture.txt", "redacted: yes\nhost: b\nformat: 1\ntime: " + time);
    const captured found = look_into(place.root).value();
    const std::int64_t expected = time[0] == '9' ? 253402300799000 : time.starts_with("1970") ? 0 : -1;
    EXPECT_EQ(found.note.began.value_or(-1), expected) << time;
    EXPECT_EQ(read_captured(found, found.moments[0], {}).host, "redacted");
  }
}

TEST(captured, AKernelHasOneMomentWhichIsNow) {
  const directory place;
  place.put("proc/sys/kernel/hostname", "c\n");
  const captured found = look_into(place.root).value();
  const moment read = read_captured(found, found.moments.at(0), flows_only);
  EXPECT_EQ(std::tuple(found.is_capture, found.moments.size(), read.host, read.tables[0].error),
            std::tuple(false, 1U, "c"s, ENOENT));
  EXPECT_GT(read.tables[0].wall, 1'700'000'000'000'000'000);
}

std::string flow_at(char nexus, std::uint32_t port, std::int32_t pid = 0, std::uint32_t advisory = no_index) {
  return record(320, {{0, id(nexus)}, {68, raw(pid)}, {76, raw(port)}, {144, raw(advisory)}});
}
tv_stats_flow flow(const std::string &bytes) {
  return record_at<tv_stats_flow>(std::as_bytes(std::span(bytes)), 0);
}
std::string provider(const std::string &name, std::uint32_t length, const std::string &instances) {
  const auto count = static_cast<std::uint32_t>(instances.size() / 16);
  return record(264, {{64, name}, {128, raw(length)}, {256, raw(count)}}) + instances;
}
std::string group(char nexus, std::initializer_list<std::string> channels) {
  std::string made = record(24, {{0, id(nexus)}, {16, raw(static_cast<std::uint32_t>(channels.size()))}});
  for (const std::string &channel : channels) made += channel;
  return made;
}
std::string channel(char name, std::int32_t pid, std::uint32_t port, std::uint32_t rings = 0) {
  return record(48 + rings * 184, {{0, id(name)}, {20, raw(pid)}, {28, raw(port)}, {36, raw(rings)}});
}
std::string arena(const std::string &name, std::int32_t type, const std::string &pids, char region = 'R') {
  return record(2608, {{0, name},
                       {64, raw(type)},
                       {80 + 64, id('E')},  // without segments
                       {80 + 152, raw(std::uint64_t{1000})},
                       {288 + 64, id(region)},
                       {288 + 104, raw(std::uint64_t{1})},
                       {288 + 152, raw(std::uint64_t{20})},
                       {288 + 160, raw(std::uint64_t{3})},
                       {2576, pids}});
}

// The first byte of what was found, or "-".
std::string first(record_bytes found, std::size_t at = 0) {
  return found.empty() ? "-" : std::string(1, static_cast<char>(found[at]));
}
std::string first(const channel_ref &found) {
  return found.entry ? first({found.entry, found.entry_size}) : "-";
}

TEST(joins, NexusesHaveProvidersAndInterfaces) {
  const directory kernel;
  kernel.put_table("nexus_provider_list", provider("switch", 3, id('N') + id('M')) +
                                              provider("b", 99, id('N') + id('O')) +
                                              provider("cut", 3, id('P') + id('P')).substr(0, 290));
  kernel.put_table("stats/net_if", record(320, {{0, id('I')}, {16, "en0"}}) + record(319, {{0, id('M')}}));
  kernel.put_table("stats/flow_switch", record(448, {{0, id('I')}, {16, "en1"}}) +
                                            record(448, {{0, id('N')}, {16, "sixteen bytes .."}}));
  const moment taken = kernel.read();
  joins join(taken);
  std::string seen;
  for (const char nexus : "NMOPI"s) {
    (seen += join.provider_name_of(id_of(nexus))).append("/").append(join.interface_of(id_of(nexus))) += ' ';
  }
  EXPECT_EQ(seen, "swi/sixteen bytes .. swi/ b/ / /en0 ");
  EXPECT_EQ(join.provider_of(id_of('M')).size(), 264U + 32);
}

TEST(joins, FlowsHaveWhatIsAtTheirPort) {
  const directory kernel;
  kernel.put_table("nexus_channel_list", group('M', {channel('a', 5, 2)}) + group('O', {}) +
                                             group('N', {channel('b', 5, 1, 1), channel('c', 6, 2),
                                                         channel('d', 6, 2), channel('e', 6, no_index)}));
  const auto owner = [](char nexus, std::uint32_t port, char name) {
    return record(128, {{0, id(nexus)}, {36, {name}}, {72, raw(port)}});
  };
  kernel.put_table("stats/flow_owner", owner('M', 1, 'm') + owner('N', 2, 'n') + owner('N', no_index, 'o'));
  const auto advisories = [](char nexus, std::uint32_t count) {
    std::string made = record(40, {{0, id(nexus)}, {36, raw(count)}});
    for (std::uint32_t i = 0; i < count; ++i) made += record(20, {{0, id(static_cast<char>('a' + i % 26))}});
    return made;
  };
  kernel.put_table("stats/flow_adv",
                   advisories('N', 2) + advisories('M', 513) + advisories('N', 3) + advisories('O', 512));
  const moment taken = kernel.read();
  joins join(taken);
  std::string seen;
  for (const std::string &each : {flow_at('N', 2, 0, 1), flow_at('M', 2, 0, 0), flow_at('M', 1, 0, 513),
                                  flow_at('N', 1, 0, 2), flow_at('O', 2, 0, 511), flow_at('N', no_index)}) {
    seen += first(join.channel_of(flow(each))) + first(join.owner_of(flow(each)), 36) +
            first(join.advisory_of(flow(each))) + " ";
  }
  EXPECT_EQ(seen, "cnb a-- -m- b-- --r --- ");
  EXPECT_EQ(join.channel_of(flow(flow_at('N', 1))).rings().size(), 184U);
}

TEST(joins, RoutesHaveInterfaceAndBothAddressesOfAFlow) {
  const auto ends = [](char family, char local, char remote, const std::string &noise) {
    // IPv4 at 4, IPv6 at 8 of each; the other one, and the ports, may hold anything.
    const std::size_t at = family == 2 ? 4 : 8, size = family == 2 ? 4 : 16;
    const std::string half = record(28, {{2, noise}, {family == 2 ? 8 : 4, noise}});
    std::string made = half + half;
    for (const std::size_t end : {0, 28}) made[end + 1] = family;
    made.replace(at, size, std::string(size, local)).replace(28 + at, size, std::string(size, remote));
    return made;
  };
  const auto route = [&](char name, const std::string &interface, const std::string &addresses) {
    return record(256, {{32, interface + '\0' + name}, {48, {name}}, {72, addresses}, {73, {name}}});
  };
  const auto flow_to = [&](const std::string &interface, const std::string &addresses) {
    return flow(record(320, {{16, interface}, {80, addresses}, {109, "\x63"}}));
  };
  const directory kernel;
  kernel.put_table("stats/flow_route",
                   route('a', "en0", ends(2, 1, 2, "x")) + route('b', "en0", ends(2, 2, 1, "x")) +
                       route('c', "en0", ends(30, 1, 2, "x")) + route('d', "en1", ends(2, 1, 2, "x")) +
                       route('e', "en0", ends(2, 1, 2, "z")) + route('f', "en0", ends(3, 1, 2, "x")));
  const moment taken = kernel.read();
  joins join(taken);
  std::string seen;
  for (const auto &each : {flow_to("en0", ends(2, 1, 2, "y")), flow_to("en0", ends(2, 2, 1, "y")),
                           flow_to("en0", ends(30, 1, 2, "y")), flow_to("en1", ends(2, 1, 2, "y")),
                           flow_to("en0", ends(3, 1, 2, "x")), flow_to("en0", ends(2, 1, 1, "y")),
                           flow_to("en", ends(2, 1, 2, "y"))}) {
    seen += first(join.route_of(each), 48);
  }
  EXPECT_EQ(seen, "abcd---");
}

TEST(joins, ArenasBelongToPortsAndProcesses) {
  const std::string long_name(60, 'l');
  const auto pids = [](std::initializer_list<std::int32_t> all) {
    std::string made;
    for (const std::int32_t pid : all) made += raw(pid);
    return made;
  };
  const directory kernel;
  kernel.put_table("nexus_provider_list", provider("sw", 2, id('N')) + provider(long_name, 60, id('L')));
  kernel.put_table("nexus_channel_list",
                   group('N', {channel('a', 5, 2), channel('b', 6, 3), channel('c', 6, 4), channel('d', 7, 5),
                               channel('e', 8, 6)}));
  kernel.put_table("stats/flow", flow_at('N', 2, 5) + flow_at('N', 3, 6) + flow_at('M', 3, 5));
  kernel.put_table("stats/arena",
                   arena("sw.port2", 2, pids({5})) + arena("sw.port2", 0, pids({9, 9})) +
                       arena("Xw.port2", 0, pids({5, 5, 6, 0, 7})) + arena("sw.port2", 0, pids({5})) +
                       arena("arena1", 0, pids({6, 8}), 'S') + arena("Arena2", 0, pids({7}), 'T') +
                       arena("Brena3", 0, pids({8})) + arena(long_name + ".por", 0, pids({5}), 'U'));
  const moment taken = kernel.read();
  joins join(taken);
  std::string seen;
  // By name and process; by name only; of two; alone, but of another channel; alone; of two.
  for (const std::string &each :
       {flow_at('N', 2, 5), flow_at('N', 2, 9), flow_at('N', 3, 6), flow_at('N', 2, 7), flow_at('N', 5, 7),
        flow_at('N', 6, 8), flow_at('L', 2, 5), flow_at('M', no_index, 7), flow_at('N', 2, 4)}) {
    seen += first(join.arena_of(flow(each)));
  }
  EXPECT_EQ(seen, "ss--A----");
  std::string owned;
  join.for_each_flow_of(5, [&](record_bytes found) { owned += first(found); });
  join.for_each_channel_of(6, [&](const channel_ref &found) { owned += first(found); });
  join.for_each_arena_of(5, [&](record_bytes found) { owned += first(found); });
  join.for_each_flow_of(9, [&](record_bytes) { owned += "none"; });
  EXPECT_EQ(owned, "NMbcsXsl");
  for (const auto &[pid, regions] : {std::pair{5, 2U}, {6, 2U}, {7, 1U}, {4, 0U}}) {
    const joins::memory memory = join.memory_of(pid);
    EXPECT_EQ(std::pair(memory.total, memory.wired), std::pair(regions * 20UL, regions * 3UL));
  }
}

TEST(joins, NothingIsFoundInMissingTables) {
  const moment taken;
  joins join(taken);
  const tv_stats_flow lost = flow(flow_at('N', 2, 5, 0).replace(81, 1, "\2"));
  EXPECT_TRUE(join.provider_name_of(id_of('N')).empty() && join.interface_of(id_of('N')).empty());
  EXPECT_EQ(first(join.channel_of(lost)) + first(join.owner_of(lost)) + first(join.advisory_of(lost)) +
                first(join.route_of(lost)) + first(join.arena_of(lost)),
            "-----");
}

// As many searches as would take minutes if each of them looked at all that are equal.
TEST(joins, EqualRecordsCostNoMoreThanOthers) {
  const directory kernel;
  std::string channels = record(24, {{0, id('N')}, {16, raw(many)}}), flows, instances;
  for (std::uint32_t i = 0; i < many; ++i) {
    channels += channel('c', 5, 2);
    flows += flow_at('N', 2, 5);
    instances += id('N');
  }
  kernel.put_table("nexus_provider_list", provider("sw", 2, instances));
  kernel.put_table("nexus_channel_list", channels);
  kernel.put_table("stats/flow", flows);
  const moment taken = kernel.read();
  joins join(taken);
  std::size_t found = 0;
  join.for_each_flow_of(5, [&](record_bytes bytes) {
    const auto each = record_at<tv_stats_flow>(bytes, 0);
    found += join.channel_of(each).entry && !join.provider_of(each.sf_nx_uuid).empty() &&
             join.arena_of(each).empty();
  });
  EXPECT_EQ(found, many);
}

}  // namespace
