// What answers for a linear search.

#include <gtest/gtest.h>

#include "common/uuid_index.h"

namespace {

uuid numbered(unsigned number) {
  uuid id{};
  std::memcpy(id.bytes, &number, sizeof number);
  return id;
}

TEST(uuid_index, FindsWhatWasAddedFirst) {
  constexpr unsigned count = 1000;
  uuid_index index;
  EXPECT_EQ(index.find(numbered(0)), uuid_index::none);
  for (unsigned i = 0; i < count; ++i) EXPECT_TRUE(index.add(numbered(i), i));
  for (unsigned i = 0; i < count; ++i) EXPECT_FALSE(index.add(numbered(i), i + 1));
  for (unsigned i = 0; i < count; ++i) EXPECT_EQ(index.find(numbered(i)), i);
  EXPECT_EQ(index.find(numbered(count)), uuid_index::none);
}

}  // namespace
