// What answers for a linear search.

#include <gtest/gtest.h>

#include "common/channel_snapshot.h"
#include "common/tables/key_index.h"
#include "tests/support/kernel_dir.h"

namespace {

TEST(key_index, FindsWhatWasAddedFirst) {
  constexpr unsigned count = 1000;
  key_index index;
  EXPECT_EQ(index.find(0U), key_index::none);
  index.reserve(100);
  index.reserve(10);  // there is room
  for (unsigned i = 0; i < count; ++i) EXPECT_TRUE(index.add(i, i));
  for (unsigned i = 0; i < count; ++i) EXPECT_FALSE(index.add(i, i + 1));
  for (unsigned i = 0; i < count; ++i) EXPECT_EQ(index.find(i), i);
  EXPECT_EQ(index.find(count), key_index::none);
}

// As many searches as would take minutes if each of them looked at every nexus.
TEST(channel_snapshot, NexusesWithoutChannelsAreLookedAtOnce) {
  constexpr std::uint32_t count = 1'000'000;
  kernel_dir kernel;
  kernel.table(channel_list_node, std::string(24 * count, '\0'));
  setenv("TARVEL_ROOT", kernel.root().c_str(), 1);
  channel_snapshot snapshot;
  EXPECT_TRUE(channel_snapshot_fetch(snapshot));
  unsetenv("TARVEL_ROOT");
  ASSERT_EQ(snapshot.ref_count(), count);
  for (std::uint32_t i = 0; i < count; ++i) ASSERT_EQ(channel_snapshot_find(snapshot, {}), nullptr);
}

}  // namespace
