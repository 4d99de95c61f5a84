// What answers for a linear search.

#include <gtest/gtest.h>

#include "common/key_index.h"

namespace {

TEST(key_index, FindsWhatWasAddedFirst) {
  constexpr unsigned count = 1000;
  key_index index;
  EXPECT_EQ(index.find(0U), key_index::none);
  for (unsigned i = 0; i < count; ++i) EXPECT_TRUE(index.add(i, i));
  for (unsigned i = 0; i < count; ++i) EXPECT_FALSE(index.add(i, i + 1));
  for (unsigned i = 0; i < count; ++i) EXPECT_EQ(index.find(i), i);
  EXPECT_EQ(index.find(count), key_index::none);
}

}  // namespace
