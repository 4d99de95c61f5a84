// Walking tables by their descriptions, and what else finds and holds things in memory.

#include "common/tables/tables.h"
#include "common/mib.h"
#include "common/tables/key_index.h"
#include "common/tables/table_walk.h"
#include "tests/units/units.h"

namespace {

TEST(allocation, EndsTheProcessOrIsABlockAlsoOfNothing) {
  EXPECT_EXIT((diagnostics.attach(STDERR_FILENO), xmalloc(SIZE_MAX / 2)), testing::ExitedWithCode(255),
              "malloc failed$");
  EXPECT_NE((std::unique_ptr<void, c_free>(xrealloc(xmalloc(0), 0))), nullptr);
}

// So many zeros, with bytes in some places.
std::string record(std::size_t size,
                   std::initializer_list<std::pair<std::size_t, std::string_view>> values = {}) {
  std::string bytes(size, '\0');
  for (const auto &[at, value] : values) bytes.replace(at, value.size(), value);
  return bytes;
}
constexpr auto bytes_of = [](std::string_view text) { return std::as_bytes(std::span(text)); };

// The noun of each record, with the size of its followers of either kind.
std::string visited(const record_description &what, const std::string &bytes) {
  std::string text;
  const bool is_whole = walk_table(what, bytes_of(bytes), [&](const found_record &found) {
    text += found.what->noun;
    for (const record_bytes &each : found.followers) text += " " + std::to_string(each.size());
    text += ", ";
  });
  return text + (is_whole ? "whole" : "cut");
}

TEST(table_walk, VisitsEachWholeRecordWithWhatFollowsIt) {
  const std::string nexus = record(24), channel = record(48), rings = "\xff\xff\xff\xff\xff\xff\xff\xff";
  const std::string two = record(24, {{16, "\2"}}) + channel;
  EXPECT_EQ(visited(provider_description, ""), "whole");
  EXPECT_EQ(visited(provider_description, record(264 + 32, {{256, "\2"}})), "provider 32 0, whole");
  EXPECT_EQ(visited(channel_header_description, two + record(48 + 3 * 184, {{32, "\1"}, {36, "\2"}}) + nexus),
            "nexus 0 0, channel 0 0, channel 184 368, nexus 0 0, whole");
  EXPECT_EQ(visited(channel_header_description, two), "nexus 0 0, channel 0 0, cut");
  EXPECT_EQ(visited(channel_header_description, two + record(48, {{32, rings}})),
            "nexus 0 0, channel 0 0, cut");
  EXPECT_EQ(visited(netns_description, record(32 + 31, {{18, "\1"}})), "cut");
  EXPECT_EQ(visited(flow_description, record(320 + 319)), "flow 0 0, cut");
}

TEST(description, NumbersAreReadAsTheyLie) {
  const std::string ff = "\0\1\xff\xff\xff\xff\xff\xff\xff"s;  // not aligned
  using enum field_type;
  for (const auto &[type, number] :
       {std::pair{u8, 1L}, {u16, 0xff01}, {net16, 0x1ff}, {u32, 0xffffff01}, {i32, -255}, {u64, -255}}) {
    EXPECT_EQ((number_at{1, type}.in(bytes_of(ff))), number);
  }
}

TEST(description, AFieldHoldsWhereOthersSaySo) {
  const auto holds = [](const auto &rows, std::string_view part, const char *field,
                        const std::string &record) {
    const auto is_said = [&](const row &each) { return each.part == part && each.field == field; };
    return std::ranges::find_if(rows, is_said)->holds(bytes_of(record));
  };
  const std::string route = record(256, {{101, "\2"}}), with_gateway = record(256, {{56, " "}, {101, "\2"}});
  EXPECT_TRUE(holds(route_rows, "sfr_local", "ipv4", route));
  EXPECT_FALSE(holds(route_rows, "sfr_local", "ipv6", route));
  EXPECT_FALSE(holds(route_rows, "sfr_gateway", "ipv4", route));
  EXPECT_TRUE(holds(route_rows, "sfr_gateway", "ipv4", with_gateway));
  EXPECT_FALSE(holds(route_rows, "sfr_gateway", "ipv6", with_gateway));
  EXPECT_FALSE(holds(flow_rows, "sf_local", "port", record(320, {{81, "^"}})));  // more than a mask can say
  EXPECT_TRUE(holds(region_rows, "", "mode", record(208, {{108, "\1"}})));
}

TEST(key_index, FindsWhatWasAddedFirst) {
  constexpr unsigned count = 1000;
  key_index index;
  EXPECT_EQ(index.find(0U), key_index::none);
  for (const std::size_t room : {100U, 10U}) index.reserve(room);
  for (unsigned i = 0; i < count; ++i) EXPECT_TRUE(index.add(i, i));
  for (unsigned i = 0; i < count; ++i) EXPECT_FALSE(index.add(i, i + 1));
  for (unsigned i = 0; i <= count; ++i) EXPECT_EQ(index.find(i), i < count ? i : key_index::none);
}

TEST(object_type_name, NamesTypesOnly) {
  EXPECT_EQ(object_type_name(object_type::flow).view(), "flow");
  EXPECT_EQ(object_type_name(object_type{5}).view(), "???");
}

}  // namespace
