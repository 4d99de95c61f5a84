// What finds and holds things in memory.

#include <algorithm>

#include "common/mib.h"
#include "common/tables/channel.h"
#include "common/tables/flow.h"
#include "common/tables/key_index.h"
#include "common/tables/provider.h"
#include "common/tables/table_walk.h"
#include "common/text/memory.h"
#include "tests/units/units.h"

namespace {

TEST(allocationDeathTest, OfNothingIsABlockAndOfTooMuchAMessage) {
  EXPECT_NE((std::unique_ptr<void, c_free>(xrealloc(xmalloc(0), 0))), nullptr);
  diagnostics.attach(STDERR_FILENO);
  EXPECT_EXIT(xmalloc(SIZE_MAX), testing::ExitedWithCode(255), "malloc failed");
}

TEST(description, NumbersAreReadAsTheyLie) {
  const auto table = std::as_bytes(std::span("\0\1\xff\xff\xff\xff\xff\xff\xff"));  // not aligned
  using enum field_type;
  for (const auto &[type, number] :
       {std::pair{u8, 1L}, {u16, 0xff01}, {net16, 0x1ff}, {u32, 0xffffff01}, {i32, -255}, {u64, -255}}) {
    EXPECT_EQ((number_at{1, type}.in(table)), number);
  }
}

TEST(description, ATextEndsWhereItIsCut) {
  std::string provider(264, '\0');
  provider.replace(64, 5, "utun0");
  const auto name = std::ranges::find(provider_rows, "name", &row::field);
  for (const char length : {'\4', '\11'}) {
    provider[128] = length;
    EXPECT_EQ(name->size_in(std::as_bytes(std::span(provider))), length == '\4' ? 4U : 5U);
  }
}

TEST(description, WhatIsPartOfAConditionalFieldDepends) {
  EXPECT_TRUE(std::ranges::find(route_rows, "sfr_gateway", &row::part)->depends());
}

TEST(description, NoNumberIsTakenForASmallerOne) {
  const field_condition is_30{{0, field_type::u8}, UINT64_MAX, std::uint64_t{1} << 30};
  EXPECT_FALSE(is_30.holds(std::as_bytes(std::span("^"))));  // 94
  std::string table(24 + 48, '\0');
  table[16] = 1;  // channel
  const auto is_whole = [&] {
    return walk_table(channel_header_description, std::as_bytes(std::span(table)), [](const auto &) {});
  };
  EXPECT_TRUE(is_whole());
  table[24 + 32 + 3] = '\x20';  // whose rings take a multiple of 2^32 bytes
  EXPECT_FALSE(is_whole());
}

TEST(key_index, FindsWhatWasAddedFirst) {
  constexpr unsigned count = 1000;
  key_index index;
  EXPECT_EQ(index.find(0U), key_index::none);
  for (const std::size_t room : {100U, 10U}) index.reserve(room);
  for (unsigned i = 0; i < 2 * count; ++i) EXPECT_EQ(index.add(i % count, i), i < count);
  for (unsigned i = 0; i <= count; ++i) EXPECT_EQ(index.find(i), i < count ? i : key_index::none);
}

TEST(object_type_name, IsOfTypesOnly) {
  EXPECT_EQ(object_type_name(object_type::nexus).view(), "nexus");
  EXPECT_EQ(object_type_name(object_type{5}).view(), "???");
}

}  // namespace
