// Bounds: a table is never read past its end, whatever it claims.

#include "common/record_walk.h"

#include <gtest/gtest.h>

#include <memory>

namespace {

// Claims what follows it, as kernel records do.
struct claim {
  std::uint32_t bytes;
  std::uint64_t trailing_size() const { return std::uint64_t{bytes} * 16; }
};

// A table of its own allocation, so that a sanitizer sees its end; it starts at an odd address.
class odd_table {
 public:
  odd_table(std::uint32_t claimed, std::size_t size) : size_(size), block_(new std::byte[size + 1]{}) {
    std::memcpy(block_.get() + 1, &claimed, std::min(size, sizeof claimed));
  }
  std::span<const std::byte> bytes() const { return {block_.get() + 1, size_}; }

 private:
  std::size_t size_;
  std::unique_ptr<std::byte[]> block_;
};

TEST(record_walk, TakesARecordAndWhatFollowsIt) {
  const odd_table table(2, 4 + 32 + 4);
  record_walk walk(table.bytes());
  claim record{};
  std::span<const std::byte> trailing;
  ASSERT_TRUE(walk.take(record, trailing));
  EXPECT_EQ(record.bytes, 2U);
  EXPECT_EQ(trailing.data(), table.bytes().data() + 4);
  EXPECT_EQ(trailing.size(), 32U);
  EXPECT_EQ(walk.remaining(), 4U);
  ASSERT_TRUE(walk.take(record, trailing));
  EXPECT_TRUE(trailing.empty());
  EXPECT_TRUE(walk.at_end());
  EXPECT_FALSE(walk.take(record));
}

TEST(record_walk, StaysWhereAStepDoesNotFit) {
  for (std::size_t size = 0; size < 4 + 32; ++size) {
    const odd_table table(2, size);
    record_walk walk(table.bytes());
    claim record{};
    std::span<const std::byte> trailing;
    EXPECT_FALSE(walk.take(record, trailing)) << size;
    EXPECT_EQ(walk.remaining(), size);
    EXPECT_EQ(walk.at_end(), size == 0);
  }
}

TEST(record_walk, ClaimsBeyond32BitsDoNotWrapAround) {
  for (const std::uint32_t count : {0x0FFFFFFFU, 0x10000000U, 0x10000001U, 0xFFFFFFFFU}) {
    const odd_table table(count, 64);
    record_walk walk(table.bytes());
    claim record{};
    std::span<const std::byte> trailing;
    EXPECT_FALSE(walk.take(record, trailing)) << count;
  }
}

TEST(record_walk, RecordAtReadsFromAnyAddress) {
  const odd_table table(0x01020304, 12);
  EXPECT_EQ(record_at<claim>(table.bytes(), 0).bytes, 0x01020304U);
  EXPECT_EQ(record_at<claim>(table.bytes(), 2).bytes, 0U);
}

}  // namespace
