// What changed between two moments. Records are written at the offsets where they lie.

#include "common/changes.h"

#include "tests/units/units.h"

namespace {

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

record channel(const char *id, std::uint32_t tx, std::uint32_t rx) {
  return record(48).put(0, id).put(32, tx, 4).put(36, rx, 4);
}

class changes : public kernel_files {
 protected:
  void put_table(std::string node, const std::string &content) const {
    std::ranges::replace(node, '.', '/');
    put("sys/" + node, content);
  }

  // What became of the records of a table, which is read at this time: what each is, of which part of which
  // record, its fate, what its counters counted, if anything, how many have no difference, and a rate.
  std::string next(const char *node, const std::string &content, std::int64_t at = 0) {
    put_table(node, content);
    const table_description *const wanted[] = {
        std::ranges::find(all_tables, std::string_view(node), &table_description::node)};
    moment now = read_moment(wanted);
    now.tables[0].monotonic = at;
    std::ostringstream text;
    kept.follow(now, [&](const changed_record &each) {
      constexpr const char *fates[] = {" unknown", " same", " appeared", " restarted", " ambiguous", " gone"};
      text << each.what->noun;
      if (each.above) text << " " << each.part << each.place << " of " << char(each.above->bytes[0]);
      text << fates[static_cast<std::size_t>(each.became)];
      for (const counter_change &counter : each.counters) {
        if (counter.difference != 0U) text << (counter.difference ? " +" : " -");
        if (counter.difference.value_or(0)) text << *counter.difference;
      }
      if (!each.counters.empty() && each.rate(each.counters[0]))
        text << " " << *each.rate(each.counters[0]) << "/s";
      text << ";";
      last.assign(reinterpret_cast<const char *>(each.bytes.data()), each.bytes.size());
    });
    return text.str();
  }
  std::string flows(const std::string &content, std::int64_t at = 0) { return next(flow_node, content, at); }

  earlier_moment kept;
  std::string last;  // record visited
};

TEST_F(changes, ACounterGoesOnOrHasRestarted) {
  constexpr std::uint64_t most = UINT64_MAX, half = std::uint64_t{1} << 63, far = std::uint64_t{1} << 48;
  using steps = std::vector<std::pair<std::uint64_t, std::uint64_t>>;
  for (const auto &[before, now] :
       steps{{0, 5}, {most, 4}, {half - 1, half}, {0, far - 1}, {most, far - 2}}) {
    kept = {};
    flows(flow(1, before, 1));
    EXPECT_EQ(flows(flow(1, now, 8)), "flow same +" + std::to_string(now - before) + " +7;");
  }
  for (const auto &[before, now] :
       steps{{0, far}, {most, far - 1}, {5, 4}, {half, 0}, {0, most}, {0, half}}) {
    kept = {};
    flows(flow(1, 1, before));
    EXPECT_EQ(flows(flow(1, 8, now)), "flow restarted - - - -;") << before << " " << now;
  }
}

TEST_F(changes, ARateNeedsAClockThatGoesOn) {
  flows(flow(1), 5 * second);
  EXPECT_EQ(flows(flow(1, 7), 7 * second), "flow same +7 3.5/s;");
  for (const std::int64_t at : {7 * second, second, INT64_MIN})
    EXPECT_EQ(flows(flow(1, 7), at), "flow same;");
  EXPECT_EQ(flows(flow(1, 7), INT64_MAX), "flow same 0/s;");
}

// The bytes that tell a record from others, and some that do not.
TEST_F(changes, ARecordIsKnownByWhatIdentifiesIt) {
  const auto with_family = [](unsigned family) { return flow(1).put(81, family, 1); };
  const auto space = [](unsigned length) {
    return record(64).put(0, "abcdefghijklmnop").put(16, length, 1).put(18, 1, 1);
  };
  using places = std::vector<unsigned>;
  const std::tuple<const char *, record, places, places> rows[] = {
      {flow_node,
       with_family(2),
       {0, 15, 16, 18, 19, 68, 71, 81, 82, 83, 84, 87, 110, 112, 115, 136},
       {20, 31, 32, 36, 72, 76, 80, 88, 103, 104, 108, 109, 116, 131, 132, 137, 140, 144, 168, 248}},
      {flow_node,
       with_family(30),
       {0, 16, 68, 81, 82, 83, 88, 103, 110, 116, 131, 136},
       {84, 104, 109, 112, 132}},
      {flow_node, with_family(7), {0, 16, 68, 81, 136}, {82, 84, 88, 110, 112, 116}},
      {flow_owner_node, record(128), {0, 16, 68, 72}, {32, 36, 76, 80}},
      {flow_route_node,
       record(256).put(101, 2, 1),
       {32, 76, 101, 104},
       {0, 48, 56, 60, 64, 73, 80, 132, 192}},
      {netns_node, space(4), {0, 3, 17, 32, 33, 34, 35}, {4, 15, 19, 36, 40, 48}},
      {netns_node, space(16), {0, 15, 17}, {19}},
      {netns_node, space(7), {17}, {0, 15}},
      {net_if_node, record(320), {0, 15}, {16, 264}},
      {userstack_node, record(2496), {0, 16, 32}, {36}}};
  for (const auto &[node, was, keys, others] : rows) {
    for (const bool is_key : {true, false}) {
      for (const unsigned at : is_key ? keys : others) {
        kept = {};
        record now = was;
        now[at] = static_cast<char>(now[at] ^ 1);
        next(node, was);
        EXPECT_EQ(next(node, now).find("appeared") != std::string::npos, is_key) << node << " " << at;
      }
    }
  }
}

TEST_F(changes, RecordsMaySwapPlacesAndThoseThatAreEqualHaveNoRate) {
  flows(flow(1, 10) + flow(2) + flow(3, 30) + flow(4) + flow(8) + flow(4, 5) + flow(5) + flow(5));
  EXPECT_EQ(
      flows(flow(3, 33) + flow(1, 11) + flow(6) + flow(2) + flow(2, 9) + flow(8) + flow(4, 7), second),
      "flow same +3 3/s;flow same +1 1/s;flow appeared - - - -;flow ambiguous - - - -;"
      "flow ambiguous - - - -;flow same 0/s;flow ambiguous - - - -;flow gone - - - -;flow gone - - - -;");
  const record left = flow(7, 500, UINT64_MAX).put(84, "\1\2\3\4");
  flows(flow(4) + flow(9).put(16, "bridge100").put(112, "\1\2") + record(left).put(36, "curl").put(72, 1));
  EXPECT_EQ(
      flows(flow(4, 9) + flow(6) + flow(6)),
      "flow same +9;flow ambiguous - - - -;flow ambiguous - - - -;flow gone - - - -;flow gone - - - -;");
  EXPECT_EQ(last, left);  // but for what neither identifies nor counts
}

TEST_F(changes, AllAreFoundWhereverTheirKeysFallAndAsFastWhereTheyAreEqual) {
  for (std::uint32_t pid = 1; pid < 200; pid += 2) {
    kept = {};
    flows(flow(pid) + flow(pid + 1));
    EXPECT_EQ(flows(flow(pid) + flow(pid + 1)), "flow same;flow same;");
  }
  // As many as would take minutes if each were compared with all.
  record equal(264 + 16'000'000);
  equal.put(256, 1'000'000, 4);
  for (const char *fate : {"unknown", "ambiguous"}) {
    EXPECT_TRUE(
        next(provider_list_node, equal).ends_with("instance instances999999 of "s + '\0' + " " + fate + ";"));
  }
}

TEST_F(changes, RingsAreKnownByChannelAndDirection) {
  const auto nexus = [](const char *id, std::uint32_t channels) {
    return record(24).put(0, id).put(16, channels, 4);
  };
  const auto ring = [](std::uint32_t id, std::uint64_t corrupted) {
    return record(184).put(0, id, 4).put(152, corrupted);
  };
  next(channel_list_node,
       nexus("A", 2) + channel("c", 1, 1) + ring(0, 10) + ring(0, 20) + channel("d", 0, 0));
  EXPECT_EQ(next(channel_list_node, nexus("B", 1) + channel("d", 0, 0) + nexus("A", 1) + channel("c", 1, 1) +
                                        ring(0, 11) + ring(0, 22) + nexus("C", 0)),
            "nexus appeared;channel channels0 of B appeared;nexus same;channel channels0 of A same;"
            "ring tx0 of c same +1;ring rx0 of c same +2;nexus appeared;channel channels0 of A gone;");
  EXPECT_EQ(last, channel("d", 0, 0));
}

TEST_F(changes, RegionsAreKnownByArenaAndSlotAndCountOnlyWithSegments) {
  const auto told = [&](std::size_t slot, std::uint64_t segments, std::uint64_t allocations) {
    const std::size_t at = 80 + slot * 208;
    record arena(2608);
    arena.put(0, "a").put(at + 64, "R").put(at + 104, segments).put(at + 192, allocations);
    const std::string all = next(arena_node, arena), rest = all.substr(all.find("regions1 "));
    return rest.substr(0, rest.find(';')) + rest.substr(rest.rfind("region regions1"));
  };
  told(1, 3, 100);
  EXPECT_EQ(told(1, 3, 107), "regions1 of a same +7region regions11 of a same - - -;");
  EXPECT_EQ(told(1, 0, 5), "regions1 of a same - - -region regions11 of a same - - -;");
  EXPECT_EQ(told(1, 3, 9), "regions1 of a same - - -region regions11 of a same - - -;");
  EXPECT_EQ(told(11, 3, 9), "regions1 of a appeared - - -region regions11 of a gone - - -;");
}

TEST_F(changes, ALevelAmongCountersMayFallAndTooManyEntriesAreNone) {
  const auto stack = [](std::uint64_t waiting, std::uint64_t next) {
    return record(2496).put(688 + 8 * 193, waiting).put(688 + 8 * 194, next);
  };
  next(userstack_node, stack(9, 4));
  EXPECT_EQ(next(userstack_node, stack(2, 5)), "userstack same +1;");
  EXPECT_TRUE(next(userstack_node, stack(2, 3)).starts_with("userstack restarted -"));
  for (const std::uint32_t count : {512U, 513U}) {
    const std::string told = next(flow_adv_node, record(40 + 20 * 513).put(36, count, 4));
    EXPECT_EQ(told.find("entry entries511") != told.npos, count == 512);
  }
}

TEST_F(changes, WhatIsNotReadIsNotGone) {
  flows(flow(1, 10) + flow(2), second);
  fs::remove_all(root + "/proc");
  kept.follow(read_moment(), [](const changed_record &) { ADD_FAILURE(); });
  EXPECT_EQ(flows(flow(1, 20).append("cut"), 6 * second), "flow same +10 2/s;");
  EXPECT_EQ(flows(flow(3) + flow(1, 20)), "flow unknown - - - -;flow same;");
  kept.keep(read_moment());
  EXPECT_EQ(flows(""), "flow gone - - - -;flow gone - - - -;");
  EXPECT_EQ(flows(flow(1)), "flow appeared - - - -;");
  EXPECT_EQ(next(ring_stat_enable_node, "12"), "ring_stat_enable unknown;");
  EXPECT_EQ(next(ring_stat_enable_node, "22"), "ring_stat_enable same;");
  EXPECT_GT(kept.size(), 50U);
}

TEST_F(changes, AMomentSaysWhatCouldNotBeReadAndWhen) {
  const capture said(diagnostics);
  const std::int64_t before = time(nullptr) * second;
  put_table(flow_node, flow(1));
  put_table(ring_stat_enable_node, "123");
  const moment now = read_moment();
  EXPECT_EQ(said.text() + now.host, "");
  EXPECT_EQ(now.tables.size(), std::size(all_tables));
  const auto *const flows = now.find(table_of(flow_node)), *const arenas = now.find(table_of(arena_node));
  EXPECT_EQ(flows->bytes().size(), 320U);
  EXPECT_EQ(now.find(table_of(ring_stat_enable_node))->bytes().size(), 1U);
  EXPECT_EQ(arenas->error, ENOENT);
  EXPECT_LT(flows->monotonic, arenas->monotonic);
  EXPECT_LE(before, flows->wall);
  const std::string longest(256, 'h');
  for (const auto &[host, told] :
       {std::pair{"a\33b\nc"s, "a\33b"s}, {"b\0c"s, "b"}, {longest, longest}, {longest + "h", ""}}) {
    put("sys/kernel/hostname", host);
    EXPECT_EQ(read_moment({}).host, told);
  }
  EXPECT_EQ(read_moment({}).find(table_of(flow_node)), nullptr);
}

}  // namespace
