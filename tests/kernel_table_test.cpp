// Fetching a table from a kernel that fails, grows and shrinks on cue.

#include "common/kernel_table.h"

#include <gtest/gtest.h>

#include <cerrno>

#include "common/output.h"
#include "tests/support/capture.h"
#include "tests/support/fake_kernel.h"

namespace {

constexpr std::size_t too_much = SIZE_MAX / 2;  // no allocator has that

class sysctl_fetch_test : public testing::Test {
 protected:
  // Fetches with the kernel's answers in `script`, all of which must be asked for.
  int fetch(const std::vector<kernel_answer> &script, const void *new_value = nullptr,
            std::size_t new_length = 0) {
    the_kernel = {script, {}};
    capture captured(diagnostics);
    void *buffer = this;
    length = 0;
    const int status = sysctl_fetch("kern.tarvel.test", &buffer, &length, new_value, new_length);
    messages = captured.text();
    has_buffer = buffer != nullptr;
    data = has_buffer ? std::string(static_cast<char *>(buffer), length) : "";
    std::free(buffer);
    EXPECT_EQ(the_kernel.calls.size(), script.size());
    return status;
  }

  // The answers of a table that has grown `times` times between size query and read.
  static std::vector<kernel_answer> grows(int times) {
    std::vector<kernel_answer> script;
    for (int i = 0; i < times; ++i) script.insert(script.end(), {needs(4), fails(ENOMEM)});
    return script;
  }

  static std::vector<kernel_answer> joined(std::vector<kernel_answer> front,
                                           const std::vector<kernel_answer> &back) {
    front.insert(front.end(), back.begin(), back.end());
    return front;
  }

  std::string messages;
  std::string data;
  std::size_t length = 0;
  bool has_buffer = false;
};

const std::string no_len = "sysctl for len failed, Cannot allocate memory\n";
const std::string no_buf = "sysctl for buf failed, Cannot allocate memory\n";

TEST_F(sysctl_fetch_test, ReadsIntoABufferOfTheSizeAnswered) {
  EXPECT_EQ(fetch({needs(4), delivers("data")}), 0);
  EXPECT_EQ(data, "data");
  EXPECT_EQ(messages, "");
  ASSERT_EQ(the_kernel.calls.size(), 2U);
  EXPECT_EQ(the_kernel.calls[0].name, "kern.tarvel.test");
  EXPECT_FALSE(the_kernel.calls[0].has_buffer);
  EXPECT_EQ(the_kernel.calls[1].name, "kern.tarvel.test");
  EXPECT_TRUE(the_kernel.calls[1].has_buffer);
  EXPECT_EQ(the_kernel.calls[1].length, 4U);
}

TEST_F(sysctl_fetch_test, ShorterDeliveryIsUsedAsItIs) {
  EXPECT_EQ(fetch({needs(100), delivers("data")}), 0);
  EXPECT_EQ(data, "data");
}

TEST_F(sysctl_fetch_test, EmptyTableHasNoBuffer) {
  EXPECT_EQ(fetch({needs(0)}), 0);
  EXPECT_FALSE(has_buffer);
  EXPECT_EQ(length, 0U);
  EXPECT_EQ(messages, "");
}

TEST_F(sysctl_fetch_test, GrownTableIsAskedForAgainSilently) {
  EXPECT_EQ(fetch({needs(4), fails(ENOMEM), needs(8), delivers("all data")}), 0);
  EXPECT_EQ(data, "all data");
  EXPECT_EQ(messages, "");
  EXPECT_EQ(the_kernel.calls[3].length, 8U);
}

TEST_F(sysctl_fetch_test, TableThatEmptiesAfterGrowingHasNoBuffer) {
  EXPECT_EQ(fetch({needs(4), fails(ENOMEM), needs(0)}), 0);
  EXPECT_FALSE(has_buffer);
  EXPECT_EQ(length, 0U);
}

TEST_F(sysctl_fetch_test, TenFailuresForWantOfMemoryAreAbsorbed) {
  EXPECT_EQ(fetch(joined(grows(10), {needs(4), delivers("data")})), 0);
  EXPECT_EQ(data, "data");
  const std::vector<kernel_answer> no_size(10, fails(ENOMEM));
  EXPECT_EQ(fetch(joined(no_size, {needs(4), delivers("data")})), 0);
  EXPECT_EQ(data, "data");
  EXPECT_EQ(messages, "");
}

TEST_F(sysctl_fetch_test, EleventhFailureEndsTheFetchWithItsOwnMessage) {
  EXPECT_EQ(fetch(joined(grows(10), {needs(4), fails(ENOMEM)})), ENOMEM);
  EXPECT_EQ(messages, no_buf);
  EXPECT_FALSE(has_buffer);
  EXPECT_EQ(fetch(std::vector<kernel_answer>(11, fails(ENOMEM))), ENOMEM);
  EXPECT_EQ(messages, no_len);
  EXPECT_FALSE(has_buffer);
}

TEST_F(sysctl_fetch_test, FailuresOfBothCallsAreCountedTogether) {
  const std::vector<kernel_answer> no_size(5, fails(ENOMEM));
  EXPECT_EQ(fetch(joined(no_size, grows(6))), ENOMEM);
  EXPECT_EQ(messages, no_buf);
  EXPECT_EQ(fetch(joined(joined(grows(5), no_size), {fails(ENOMEM)})), ENOMEM);
  EXPECT_EQ(messages, no_len);
  EXPECT_EQ(fetch(joined(joined(grows(5), no_size), {needs(4), delivers("data")})), 0);
}

TEST_F(sysctl_fetch_test, OtherFailuresEndTheFetchAtOnce) {
  EXPECT_EQ(fetch({fails(ENOENT)}), ENOENT);
  EXPECT_EQ(messages, "sysctl for len failed, No such file or directory\n");
  EXPECT_FALSE(has_buffer);
  EXPECT_EQ(fetch({needs(4), fails(EACCES)}), EACCES);
  EXPECT_EQ(messages, "sysctl for buf failed, Permission denied\n");
  EXPECT_FALSE(has_buffer);
  EXPECT_EQ(fetch({needs(4), fails(ENOMEM), fails(EIO)}), EIO);
  EXPECT_EQ(messages, "sysctl for len failed, Input/output error\n");
}

TEST_F(sysctl_fetch_test, BufferThatCannotBeAllocatedIsReported) {
  EXPECT_EQ(fetch({needs(too_much)}), ENOMEM);
  EXPECT_EQ(messages, "sysctl malloc failed\n");
  EXPECT_FALSE(has_buffer);
}

TEST_F(sysctl_fetch_test, NewValueGoesToEveryCall) {
  const char value = 1;
  EXPECT_EQ(fetch({fails(ENOMEM), needs(4), fails(ENOMEM), needs(4), delivers("data")}, &value, sizeof value),
            0);
  for (const kernel_call &call : the_kernel.calls) {
    EXPECT_EQ(call.new_value, &value);
    EXPECT_EQ(call.new_length, sizeof value);
  }
}

TEST(kernel_table, HoldsTheLastSnapshotOnly) {
  const capture captured(diagnostics);
  kernel_table table;
  EXPECT_TRUE(table.empty());
  the_kernel = {{needs(4), delivers("data"), needs(9), delivers("more data"), fails(ENOENT), needs(0)}, {}};
  EXPECT_EQ(table.fetch("a"), 0);
  EXPECT_EQ(table.fetch("a"), 0);
  EXPECT_EQ(table.size(), 9U);
  EXPECT_EQ(std::memcmp(table.bytes().data(), "more data", 9), 0);
  EXPECT_EQ(table.fetch("a"), ENOENT);
  EXPECT_TRUE(table.empty());
  EXPECT_EQ(table.fetch("a"), 0);
  EXPECT_TRUE(table.bytes().empty());
}

template <class Allocation>
void ends_without_memory(Allocation allocate, const char *message) {
  const auto attempt = [&] {
    diagnostics.attach(STDERR_FILENO);
    volatile std::size_t size = too_much;
    allocate(size);
  };
  EXPECT_EXIT(attempt(), testing::ExitedWithCode(255), message);
}

TEST(allocation, FailureEndsTheProcessWithStatus255) {
  ends_without_memory([](std::size_t size) { xmalloc(size); }, "malloc failed$");
  ends_without_memory([](std::size_t size) { xrealloc(nullptr, size); }, "realloc failed$");
#if !defined(__SANITIZE_ADDRESS__)  // whose operator new does not ask the handler
  make_new_fail_fast();
  ends_without_memory([](std::size_t size) { operator delete(operator new(size)); }, "malloc failed$");
#endif
}

TEST(allocation, OfNothingIsABlock) {
  void *block = xmalloc(0);
  EXPECT_NE(block, nullptr);
  block = xrealloc(block, 0);
  EXPECT_NE(block, nullptr);
  std::free(block);
}

}  // namespace

#if defined(__SANITIZE_ADDRESS__)
// Lets an allocation fail as it does without the sanitizer.
extern "C" const char *__asan_default_options();
extern "C" const char *__asan_default_options() {
  return "allocator_may_return_null=1";
}
#endif
