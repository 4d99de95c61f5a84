// Fetching a table from a kernel that fails, grows and shrinks on cue.

#include "common/tables/kernel_table.h"

#include <fcntl.h>
#include <gtest/gtest.h>

#include <cerrno>
#include <cstring>

#include "common/text/output.h"
#include "platform/sysctl.h"
#include "tarvelctl/command.h"
#include "tests/support/capture.h"
#include "tests/support/fake_kernel.h"

extern "C" int sysctlbyname(const char *name, void *old_value, std::size_t *old_length, const void *new_value,
                            std::size_t new_length) {
  const std::size_t turn = the_kernel.calls.size();
  the_kernel.calls.push_back({name, old_value != nullptr, *old_length, new_value, new_length});
  EXPECT_LT(turn, the_kernel.script.size());
  const kernel_answer answer = turn < the_kernel.script.size() ? the_kernel.script[turn] : fails(ENOSYS);
  if (answer.error) {
    errno = answer.error;
    return -1;
  }
  if (old_value) {
    EXPECT_LE(answer.data.size(), *old_length);
    std::memcpy(old_value, answer.data.data(), answer.data.size());
  }
  *old_length = answer.size;
  return 0;
}

namespace {

using script = std::vector<kernel_answer>;

constexpr std::size_t too_much = SIZE_MAX / 2;  // no allocator has that

// The answers of all parts, one after the other.
script joined(std::initializer_list<script> parts) {
  script all;
  for (const script &part : parts) all.insert(all.end(), part.begin(), part.end());
  return all;
}

// The answers of a table that grows `times` times between size query and read, or that has no size as often.
script grows(int times) {
  script all;
  for (int i = 0; i < times; ++i) all = joined({all, {needs(4), fails(ENOMEM)}});
  return all;
}
script no_size(std::size_t times) {
  return script(times, fails(ENOMEM));
}

// What a fetch leaves behind.
struct outcome {
  int status = 0;
  std::string messages{}, data{};
  bool has_buffer = !data.empty();

  bool operator==(const outcome &) const = default;
};

void PrintTo(const outcome &result, std::ostream *to) {
  *to << result.status << " '" << result.messages << "' '" << result.data << "' " << result.has_buffer;
}

// Fetches with the kernel's answers in `answers`, all of which must be asked for.
outcome fetch(const script &answers, const void *new_value = nullptr, std::size_t new_length = 0) {
  the_kernel = {answers, {}};
  capture captured(diagnostics);
  void *buffer = &captured;
  std::size_t length = 7;
  const int status = sysctl_fetch("kern.tarvel.test", &buffer, &length, new_value, new_length);
  const std::string data = buffer ? std::string(static_cast<char *>(buffer), length) : "";
  std::free(buffer);
  EXPECT_TRUE(buffer || status || length == 0);
  EXPECT_EQ(the_kernel.calls.size(), answers.size());
  return {status, captured.text(), data, buffer != nullptr};
}

const outcome fetched{.data = "data"};
const outcome nothing{};
const outcome no_len{ENOMEM, "sysctl for len failed, Cannot allocate memory\n"};
const outcome no_buf{ENOMEM, "sysctl for buf failed, Cannot allocate memory\n"};

TEST(sysctl_fetch_test, ReadsWhatThereIsIntoABufferOfTheSizeAnswered) {
  const script enough = {needs(4), delivers("data")};
  EXPECT_EQ(fetch(enough), fetched);
  EXPECT_EQ(the_kernel.calls[0], (kernel_call{"kern.tarvel.test", false, 7, nullptr, 0}));
  EXPECT_EQ(the_kernel.calls[1], (kernel_call{"kern.tarvel.test", true, 4, nullptr, 0}));
  EXPECT_EQ(fetch({needs(100), delivers("data")}), fetched);
  EXPECT_EQ(fetch({needs(0)}), nothing);
  EXPECT_EQ(fetch({needs(2), fails(ENOMEM), needs(4), delivers("data")}), fetched);
  EXPECT_EQ(the_kernel.calls[3].length, 4U);
  EXPECT_EQ(fetch({needs(4), fails(ENOMEM), needs(0)}), nothing);
}

TEST(sysctl_fetch_test, TheEleventhFailureForWantOfMemoryEndsIt) {
  const script enough = {needs(4), delivers("data")};
  EXPECT_EQ(fetch(joined({grows(10), enough})), fetched);
  EXPECT_EQ(fetch(joined({no_size(10), enough})), fetched);
  EXPECT_EQ(fetch(joined({grows(5), no_size(5), enough})), fetched);
  EXPECT_EQ(fetch(grows(11)), no_buf);
  EXPECT_EQ(fetch(no_size(11)), no_len);
  EXPECT_EQ(fetch(joined({no_size(5), grows(6)})), no_buf);
  EXPECT_EQ(fetch(joined({grows(5), no_size(6)})), no_len);
}

TEST(sysctl_fetch_test, OtherFailuresEndItAtOnce) {
  EXPECT_EQ(fetch({fails(ENOENT)}), (outcome{ENOENT, "sysctl for len failed, No such file or directory\n"}));
  EXPECT_EQ(fetch({needs(4), fails(EACCES)}),
            (outcome{EACCES, "sysctl for buf failed, Permission denied\n"}));
  EXPECT_EQ(fetch({needs(4), fails(ENOMEM), fails(EIO)}),
            (outcome{EIO, "sysctl for len failed, Input/output error\n"}));
  EXPECT_EQ(fetch({needs(too_much)}), (outcome{ENOMEM, "sysctl malloc failed\n"}));
}

TEST(sysctl_fetch_test, NewValueGoesToEveryCall) {
  const char value = 1;
  fetch({fails(ENOMEM), needs(4), fails(ENOMEM), needs(4), delivers("data")}, &value, 1);
  for (const kernel_call &call : the_kernel.calls)
    EXPECT_EQ(std::pair(call.new_value, call.new_length),
              std::pair(static_cast<const void *>(&value), std::size_t{1}));
}

TEST(kernel_table, HoldsTheLastSnapshotOnly) {
  const capture captured(diagnostics);
  kernel_table table;
  EXPECT_TRUE(table.empty());
  the_kernel = {{needs(4), delivers("data"), needs(9), delivers("more data"), needs(4), fails(EIO), needs(0)},
                {}};
  EXPECT_EQ(table.fetch("a"), 0);
  EXPECT_EQ(table.fetch("a"), 0);
  EXPECT_EQ(table.size(), 9U);
  EXPECT_EQ(std::memcmp(table.bytes().data(), "more data", 9), 0);
  EXPECT_EQ(table.fetch("a"), EIO);
  EXPECT_TRUE(table.empty());
  EXPECT_EQ(table.fetch("a"), 0);
  EXPECT_TRUE(table.bytes().empty());
}

TEST(netns, OfAllGoesOnWatchingWhereThereWasNoMemory) {
  the_kernel = {joined({no_size(11), {fails(EIO)}}), {}};
  char words[][12] = {"tarvelctl", "netns", "-a", "-w", "1"};
  char *line[] = {words[0], words[1], words[2], words[3], words[4]};
  EXPECT_EXIT(run_command_line(5, line), testing::ExitedWithCode(0),
              "^" + no_len.messages + "sysctl for len failed, Input/output error\n$");
}

template <class Allocation>
void ends_without_memory(Allocation allocate, const char *message) {
  const auto attempt = [&] {
    diagnostics.attach(STDERR_FILENO);
    report.attach(open("/dev/full", O_WRONLY));
    print<"lost\n">();
    volatile std::size_t size = too_much;
    allocate(size);
  };
  const std::string lost = "write error: No space left on device\n";
  EXPECT_EXIT(attempt(), testing::ExitedWithCode(255), lost + message);
}

TEST(allocation, OfNothingIsABlockToo) {
  void *const resized = xrealloc(xmalloc(0), 0);
  EXPECT_NE(resized, nullptr);
  std::free(resized);
}

TEST(allocation, FailureEndsTheProcessWithStatus255WhateverBecomesOfTheReport) {
  ends_without_memory([](std::size_t size) { xmalloc(size); }, "malloc failed$");
  ends_without_memory([](std::size_t size) { xrealloc(nullptr, size); }, "realloc failed$");
#if !defined(__SANITIZE_ADDRESS__)  // whose operator new does not ask the handler
  make_new_fail_fast();
  ends_without_memory([](std::size_t size) { operator delete(operator new(size)); }, "malloc failed$");
#endif
}

}  // namespace

#if defined(__SANITIZE_ADDRESS__)
// Lets an allocation fail as it does without the sanitizer.
extern "C" const char *__asan_default_options();
extern "C" const char *__asan_default_options() {
  return "allocator_may_return_null=1";
}
#endif
