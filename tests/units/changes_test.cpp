// What changed between two moments. Records are written at the offsets where they lie.

#include "common/changes.h"

#include <filesystem>

#include "tests/units/units.h"

namespace {

namespace fs = std::filesystem;

constexpr std::int64_t second = 1'000'000'000;

struct record : std::string {
  explicit record(std::size_t size) : std::string(size, '\0') {}
  record &put(std::size_t at, std::uint64_t number, std::size_t size = 8) {
    std::memcpy(data() + at, &number, size);
    return *this;
  }
  record &put(std::size_t at, std::string_view text) {
    replace(at, text.size(), text);
    return *this;
  }
};

record flow(std::uint32_t pid, std::uint64_t sent = 0, std::uint64_t packets_received = 0) {
  constexpr std::uint8_t ipv4 = 2;
  record made(320);
  return made.put(16, "en0").put(68, pid, 4).put(81, ipv4, 1).put(152, sent).put(224, packets_received);
}

record nexus(const char *id, std::uint32_t channels) {
  return record(24).put(0, id).put(16, channels, 4);
}
record channel(const char *id, std::uint32_t tx, std::uint32_t rx) {
  return record(48).put(0, id).put(32, tx, 4).put(36, rx, 4);
}
record ring(std::uint32_t id, std::uint64_t corrupted) {
  return record(184).put(0, id, 4).put(152, corrupted);
}
record region(std::size_t slot, const char *id, std::uint64_t segments, std::uint64_t allocations) {
  const std::size_t at = 80 + slot * 208;
  return record(2608).put(at + 64, id).put(at + 104, segments).put(at + 192, allocations);
}

class changes : public testing::Test {
 protected:
  changes() { setenv("TARVEL_ROOT", mkdtemp(root.data()), 1); }
  ~changes() override {
    unsetenv("TARVEL_ROOT");
    fs::remove_all(root);
  }

  void put(std::string node, const std::string &content) const {
    std::ranges::replace(node, '.', '/');
    const fs::path path = root + "/proc/sys/" + node;
    fs::create_directories(path.parent_path());
    std::ofstream(path) << content;
  }

  // What became of the records of a table, which is read at this time: what each is, of which part of which
  // record, its fate, what its counters counted, how many of them have no difference, and a rate.
  std::string next(const table_description &table, const std::string &content, std::int64_t at = 0) {
    put(table.node, content);
    const table_description *const wanted[] = {&table};
    moment now = read_moment(wanted);
    now.tables[0].monotonic = at;
    std::ostringstream text;
    kept.follow(now, [&](const changed_record &each) {
      constexpr const char *fates[] = {"unknown", "same", "appeared", "restarted", "ambiguous", "gone"};
      text << each.what->noun;
      if (each.above) text << " " << each.part << each.place << " of " << char(each.above->bytes[0]);
      text << " " << fates[static_cast<std::size_t>(each.became)];
      std::size_t without = 0;
      std::optional<double> rate;
      for (const counter_change &counter : each.counters) {
        without += !counter.difference;
        if (counter.difference.value_or(0)) {
          text << " " << counter.field->name << "+" << *counter.difference;
        }
        if (!rate) rate = each.rate(counter);
      }
      if (without) text << " -" << without;
      if (rate) text << " " << *rate << "/s";
      text << ";";
      last.assign(reinterpret_cast<const char *>(each.bytes.data()), each.bytes.size());
    });
    return text.str();
  }
  std::string flows(const std::string &content, std::int64_t at = 0) {
    return next(table_of(flow_node), content, at);
  }

  std::string root = "/tmp/tarvelctl-test-XXXXXX";
  earlier_moment kept;
  std::string last;  // record visited
};

TEST_F(changes, ACounterGoesOnOrHasRestarted) {
  constexpr std::uint64_t most = UINT64_MAX, half = std::uint64_t{1} << 63, bound = std::uint64_t{1} << 48;
  for (const auto &[before, now, told] : {std::tuple{0UL, 5UL, "same bytes+5 packets+7;"},
                                          {most, 4UL, "same bytes+5 packets+7;"},
                                          {half - 1, half, "same bytes+1 packets+7;"},
                                          {most, most, "same packets+7;"},
                                          {0UL, bound - 1, "same bytes+281474976710655 packets+7;"},
                                          {most, bound - 2, "same bytes+281474976710655 packets+7;"},
                                          {0UL, bound, "restarted -4;"},
                                          {most, bound - 1, "restarted -4;"},
                                          {5UL, 4UL, "restarted -4;"},
                                          {half, 0UL, "restarted -4;"},
                                          {0UL, most, "restarted -4;"}}) {
    kept = {};
    EXPECT_EQ(flows(flow(1, before, 1)), "flow unknown -4;");
    EXPECT_EQ(flows(flow(1, now, 8)), "flow "s + told) << before << " " << now;
  }
}

TEST_F(changes, ARateNeedsAClockThatGoesOn) {
  flows(flow(1), 5 * second);
  EXPECT_EQ(flows(flow(1, 7), 7 * second), "flow same bytes+7 3.5/s;");
  EXPECT_EQ(flows(flow(1, 8), 7 * second), "flow same bytes+1;");
  EXPECT_EQ(flows(flow(1, 9), second), "flow same bytes+1;");
  EXPECT_EQ(flows(flow(1, 10), INT64_MIN), "flow same bytes+1;");
  EXPECT_EQ(flows(flow(1, 10), INT64_MAX), "flow same 0/s;");
}

TEST_F(changes, AFlowIsKnownByNexusInterfaceOwnerProtocolAndEnds) {
  enum { v4 = 2, v6 = 30, neither = 7 };
  const auto with = [](int family) { return flow(1).put(81, static_cast<unsigned>(family), 1); };
  const std::vector<std::size_t> always{0, 15, 16, 18, 19, 68, 71, 81, 136};
  const std::pair<int, std::vector<std::size_t>> known_by[] = {
      {v4, {82, 83, 84, 87, 110, 112, 115}}, {v6, {82, 83, 88, 103, 110, 116, 131}}, {neither, {}}};
  for (const auto &[family, offsets] : known_by) {
    for (const std::size_t at :
         {0,  15, 16,  18,  19,  20,  31,  32,  36,  68,  71,  72,  76,  80,  81,  82,  83,  84,
          87, 88, 103, 104, 108, 109, 110, 112, 115, 116, 131, 132, 136, 137, 140, 144, 168, 248}) {
      kept = {};
      flows(with(family));
      std::string other = with(family);
      other[at] = static_cast<char>(other[at] ^ 1);
      const bool is_other = std::ranges::count(offsets, at) || std::ranges::count(always, at);
      EXPECT_EQ(flows(other), is_other ? "flow appeared -4;flow gone -4;" : "flow same;")
          << at << " " << family;
    }
  }
}

TEST_F(changes, WhatIsGoneHasItsKeyAndCountersLeft) {
  const record left = flow(1, 500, UINT64_MAX).put(84, "\1\2\3\4");
  flows(flow(3).put(16, "bridge100").put(112, "\1\2\3\4") + record(left).put(36, "curl").put(72, 1) +
        flow(2));
  EXPECT_EQ(flows(flow(2)), "flow same;flow gone -4;flow gone -4;");
  EXPECT_EQ(last, left);
}

TEST_F(changes, OfAnAddressCountAsManyBytesAsItIsLong) {
  const auto space = [](unsigned length, std::size_t other) {
    record made(64);
    made.put(0, "abcdefghijklmnop").put(16, length, 1).put(18, 1, 1).put(32, 80, 2).put(48, 9, 4);
    return made.put(other, "x");
  };
  for (const auto &[length, first_of_no_use] : {std::pair{4U, 4U}, {16U, 17U}, {7U, 0U}}) {
    for (const unsigned at : {0U, 3U, 4U, 15U}) {
      kept = {};
      next(table_of(netns_node), space(length, 20));
      const std::string told = next(table_of(netns_node), space(length, at));
      const bool is_other = at < first_of_no_use;
      EXPECT_EQ(told.starts_with(is_other ? "netns appeared;range" : "netns same;range"), true) << told;
      EXPECT_EQ(last, is_other ? record(32).put(0, 80, 2) : space(length, at).substr(32));
    }
  }
}

TEST_F(changes, ARangeIsKnownByBothItsPorts) {
  for (const std::size_t at : {32, 34, 36, 40, 48}) {
    kept = {};
    const record space = record(64).put(18, 1, 1);
    next(table_of(netns_node), space);
    const std::string told = next(table_of(netns_node), record(space).put(at, "x"));
    EXPECT_EQ(told.find("appeared") != told.npos, at < 36) << at;
  }
}

TEST_F(changes, RecordsMaySwapPlacesAndThoseThatAreEqualHaveNoRate) {
  flows(flow(1, 10) + flow(2, 20) + flow(3, 30) + flow(4) + flow(8) + flow(4, 5) + flow(5) + flow(5));
  EXPECT_EQ(
      flows(flow(3, 33) + flow(1, 11) + flow(6) + flow(2, 22) + flow(2, 99) + flow(8) + flow(4, 7), second),
      "flow same bytes+3 3/s;flow same bytes+1 1/s;flow appeared -4;flow ambiguous -4;flow ambiguous -4;"
      "flow same 0/s;flow ambiguous -4;flow gone -4;flow gone -4;");
  EXPECT_EQ(flows(flow(7) + flow(7) + flow(4, 9) + flow(2)),
            "flow ambiguous -4;flow ambiguous -4;flow same bytes+2;flow ambiguous -4;"
            "flow gone -4;flow gone -4;flow gone -4;flow gone -4;");
}

// However their keys fall into the places where they are looked up.
TEST_F(changes, TwoAreFoundWhoeverTheyAre) {
  for (std::uint32_t pid = 1; pid < 200; pid += 2) {
    kept = {};
    flows(flow(pid) + flow(pid + 1));
    EXPECT_EQ(flows(flow(pid) + flow(pid + 1)), "flow same;flow same;");
  }
}

// As many as would take minutes if each were compared with all.
TEST_F(changes, AMillionThatAreEqualTakeNoLonger) {
  const std::string table = record(264).put(256, 1'000'000, 4) + std::string(16'000'000, '\0');
  for (const char *fate : {"unknown", "ambiguous"}) {
    const std::string text = next(table_of(provider_list_node), table);
    EXPECT_TRUE(text.ends_with("instance instances999999 of "s + '\0' + " " + fate + ";"));
  }
}

TEST_F(changes, RingsAreKnownByChannelAndDirection) {
  const auto &channels = table_of(channel_list_node);
  next(channels, nexus("A", 2) + channel("c", 1, 1) + ring(0, 10) + ring(0, 20) + channel("d", 0, 1) +
                     ring(1, 5) + nexus("B", 0));
  EXPECT_EQ(
      next(channels, nexus("B", 1) + channel("d", 0, 1) + ring(1, 6) + nexus("A", 1) + channel("c", 1, 2) +
                         ring(0, 11) + ring(1, 0) + ring(0, 22) + nexus("C", 0)),
      "nexus same;channel channels0 of B appeared;ring rx0 of d appeared -9;nexus same;"
      "channel channels0 of A same;ring tx0 of c same corrupted+1;ring rx0 of c appeared -9;"
      "ring rx1 of c same corrupted+2;nexus appeared;channel channels0 of A gone;ring rx0 of d gone -9;");
  EXPECT_EQ(last, ring(1, 5));
}

TEST_F(changes, RegionsAreKnownByArenaAndSlotAndCountOnlyWithSegments) {
  const auto told = [&](std::size_t slot, std::uint64_t segments, std::uint64_t allocations, char noise) {
    record arena = region(slot, "R", segments, allocations).put(0, "a");
    arena[2] = noise;
    return next(table_of(arena_node), arena);
  };
  told(1, 3, 100, 'x');
  const std::string start = "arena same;region regions0 of a same -3;region regions1 of a same";
  EXPECT_TRUE(told(1, 3, 107, 'y').starts_with(start + " allocs+7;region regions2 of a same -3;"));
  EXPECT_TRUE(told(1, 0, 5, 'y').starts_with(start + " -3;"));
  EXPECT_TRUE(told(1, 3, 9, 'y').starts_with(start + " -3;"));
  const std::string moved = told(11, 3, 9, 'y');
  EXPECT_TRUE(moved.starts_with("arena same;region regions0 of a same -3;region regions1 of a appeared -3;"));
  EXPECT_TRUE(
      moved.ends_with("region regions11 of a appeared -3;region regions1 of a gone -3;"
                      "region regions11 of a gone -3;"));
}

TEST_F(changes, ALevelAmongCountersMayFallAndTooManyEntriesAreNone) {
  const auto &stacks = table_of(userstack_node);
  const auto stack = [](std::uint64_t waiting, std::uint64_t next) {
    return record(2496).put(688 + 8 * 193, waiting).put(688 + 8 * 194, next);
  };
  next(stacks, stack(9, 4));
  EXPECT_EQ(next(stacks, stack(2, 5)), "userstack same tcp+1;");
  EXPECT_EQ(next(stacks, stack(2, 3)), "userstack restarted -303;");
  const auto &advisories = table_of(flow_adv_node);
  for (const auto &[count, told] :
       {std::pair{512U, " entry entries511 of "s + '\0' + " unknown;"}, {513U, ""}}) {
    const std::string text = next(advisories, record(40 + 20 * 513).put(36, count, 4));
    EXPECT_EQ(text.find("entry") == text.npos, told.empty());
    kept = {};
  }
}

TEST_F(changes, WhatIsNotReadIsNotGone) {
  const auto &table = table_of(flow_node);
  const table_description *const wanted[] = {&table};
  const auto ignore = [](const changed_record &) { ADD_FAILURE(); };
  flows(flow(1, 10) + flow(2), second);
  fs::remove_all(root + "/proc");
  kept.follow(read_moment(wanted), ignore);
  EXPECT_EQ(flows(flow(1, 20).append("cut"), 6 * second), "flow same bytes+10 2/s;");
  EXPECT_EQ(flows(flow(3) + flow(1, 20)), "flow unknown -4;flow same;");
  kept.keep(read_moment());
  EXPECT_EQ(flows(""), "flow gone -4;flow gone -4;");
  EXPECT_EQ(flows(flow(1)), "flow appeared -4;");
  EXPECT_EQ(next(table_of(ring_stat_enable_node), "12"), "ring_stat_enable unknown;");
  EXPECT_EQ(next(table_of(ring_stat_enable_node), "22"), "ring_stat_enable same;");
  EXPECT_GT(kept.size(), 50U);
}

TEST_F(changes, AMomentSaysWhatCouldNotBeReadAndWhen) {
  const capture said(diagnostics);
  put(flow_node, flow(1));
  put(ring_stat_enable_node, "123");
  fs::create_directories(root + "/proc/sys/kern/tarvel/stats/arena");
  put("kernel.hostname", "a\33b\nc");
  const std::int64_t before = time(nullptr) * second;
  const moment now = read_moment();
  EXPECT_EQ(said.text(), "");
  EXPECT_EQ(now.tables.size(), std::size(all_tables));
  EXPECT_EQ(now.host, "a\33b");
  const auto *const flows = now.find(table_of(flow_node)), *const arenas = now.find(table_of(arena_node));
  EXPECT_EQ(flows->bytes().size(), 320U);
  EXPECT_EQ(now.find(table_of(ring_stat_enable_node))->bytes().size(), 1U);
  EXPECT_EQ(now.find(table_of(netns_node))->error, ENOENT);
  EXPECT_EQ(arenas->error, EISDIR);
  EXPECT_TRUE(flows->monotonic && flows->monotonic < arenas->monotonic && flows->wall >= before);
  for (const auto &[host, told] : {std::pair{""s, ""s},
                                   {"b\0c"s, "b"},
                                   {std::string(256, 'h'), std::string(256, 'h')},
                                   {std::string(257, 'h'), ""}}) {
    put("kernel.hostname", host);
    EXPECT_EQ(read_moment({}).host, told);
  }
  EXPECT_EQ(read_moment({}).find(table_of(flow_node)), nullptr);
}

}  // namespace
