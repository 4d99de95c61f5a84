// Walking tables by their descriptions, over bytes by hand.

#include "common/tables/table_walk.h"

#include <gtest/gtest.h>

#include <string>

#include "common/tables/tables.h"
#include "tests/support/bytes.h"

namespace {

record_bytes of(std::string_view table) {
  return std::as_bytes(std::span(table.data(), table.size()));
}

// What is visited: the noun of a record, with the bytes of its followers of either kind.
std::string visited(const record_description &what, const std::string &table) {
  std::string text;
  const bool is_whole = walk_table(what, of(table), [&](const found_record &found) {
    text.append(found.what->noun);
    for (const record_bytes &each : found.followers) text.append(1, ' ').append(std::to_string(each.size()));
    text.append(", ");
  });
  return text + (is_whole ? "whole" : "cut");
}

TEST(table_walk, EachRecordComesWithWhatFollowsIt) {
  const bytes two_instances = bytes(264 + 32).u32(256, 2);
  EXPECT_EQ(visited(provider_description, ""), "whole");
  EXPECT_EQ(visited(provider_description, two_instances), "provider 32 0, whole");
  const std::string channel = bytes(48 + 3 * 184).u32(32, 1).u32(36, 2);
  EXPECT_EQ(visited(channel_header_description, bytes(24).u32(16, 1) + channel + bytes(24)),
            "nexus 0 0, channel 184 368, nexus 0 0, whole");
}

TEST(table_walk, WhatIsCutIsNotVisited) {
  EXPECT_EQ(visited(netns_description, bytes(32 + 31).u8(18, 1)), "cut");
  EXPECT_EQ(visited(flow_description, bytes(320 + 319)), "flow 0 0, cut");
  const std::string group = bytes(24).u32(16, 2) + bytes(48);
  EXPECT_EQ(visited(channel_header_description, group), "nexus 0 0, channel 0 0, cut");
  EXPECT_EQ(visited(channel_header_description, group + bytes(48).u32(32, 0xffffffff).u32(36, 0xffffffff)),
            "nexus 0 0, channel 0 0, cut");
}

TEST(description, NumbersAreReadAsTheyLie) {
  const bytes ff = bytes(9).text(1, "\1\xff\xff\xff\xff\xff\xff\xff");  // not aligned
  const auto read = [&](field_type type) { return number_at{1, type}.in(of(ff)); };
  EXPECT_EQ(read(field_type::u8), 1);
  EXPECT_EQ(read(field_type::u16), 0xff01);
  EXPECT_EQ(read(field_type::net16), 0x01ff);
  EXPECT_EQ(read(field_type::u32), 0xffffff01);
  EXPECT_EQ(read(field_type::i32), -255);
  EXPECT_EQ(read(field_type::u64), -255);
}

TEST(description, AFieldHoldsWhereOthersSaySo) {
  const auto holds = [](const auto &rows, std::string_view part, std::string_view field,
                        const std::string &record) {
    for (const row &each : rows) {
      if (each.part == part && each.field == field) return each.holds(of(record));
    }
    ADD_FAILURE() << field;
    return false;
  };
  const bytes ipv4_route = bytes(256).u8(101, 2), with_gateway = bytes(256).u8(101, 2).u32(56, 0x20);
  EXPECT_TRUE(holds(route_rows, "sfr_local", "ipv4", ipv4_route));
  EXPECT_FALSE(holds(route_rows, "sfr_local", "ipv6", ipv4_route));
  EXPECT_FALSE(holds(route_rows, "sfr_gateway", "ipv4", ipv4_route));
  EXPECT_TRUE(holds(route_rows, "sfr_gateway", "ipv4", with_gateway));
  EXPECT_FALSE(holds(route_rows, "sfr_gateway", "ipv6", with_gateway));
  EXPECT_FALSE(holds(flow_rows, "sf_local", "port", bytes(320).u8(81, 94)));  // beyond what a mask can say
  EXPECT_TRUE(holds(region_rows, "", "mode", bytes(208).u64(104, 1ULL << 32)));
}

}  // namespace
