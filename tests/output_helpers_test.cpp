// The small pieces of output that several commands share.

#include "common/output_helpers.h"

#include <gtest/gtest.h>
#include <stdlib.h>

#include "common/output.h"
#include "tests/support/capture.h"
#include "tests/support/kernel_dir.h"

namespace {

std::string usage_of(const option *options, const std::uint32_t *flags) {
  capture captured(diagnostics);
  print_options_usage(options, flags);
  return captured.text();
}

TEST(print_options_usage, BracketsWhatMayBeLeftOut) {
  const option options[] = {{"plain", no_argument, nullptr, 'p'},
                            {"value", required_argument, nullptr, 'v'},
                            {"maybe", optional_argument, nullptr, 'm'},
                            {}};
  const std::uint32_t required[] = {0, 0, 0};
  EXPECT_EQ(usage_of(options, required),
            "\t--plain, -p\n"
            "\t--value, -v <value>\n"
            "\t--maybe, -m [ <maybe> ]\n");
  const std::uint32_t optional[] = {1, 3, 0xFFFFFFFF};
  EXPECT_EQ(usage_of(options, optional),
            "\t[--plain, -p ]\n"
            "\t[--value, -v <value> ]\n"
            "\t[--maybe, -m [ <maybe> ] ]\n");
  const std::uint32_t other_bits[] = {2, 1, 0};
  EXPECT_EQ(usage_of(options, other_bits),
            "\t--plain, -p\n"
            "\t[--value, -v <value> ]\n"
            "\t--maybe, -m [ <maybe> ]\n");
}

TEST(print_options_usage, PrintsNothingForNoOptions) {
  const option none[] = {{}};
  const std::uint32_t flags[] = {1};
  EXPECT_EQ(usage_of(none, flags), "");
}

std::string flags_of(const char *label, std::uint32_t value, const char *bit_names) {
  capture captured(report);
  print_flags(label, value, bit_names);
  return captured.text();
}

constexpr char advisory[] = "\20\1VALID\2CONTROLLED";
constexpr char region[] = "\20\1NOREDIRECT\2MMAPOK\3READONLY\4PERSISTENT\5MONOLITHIC\6NOCACHE\40MIRRORED";

TEST(print_flags, NamesTheSetBits) {
  EXPECT_EQ(flags_of("flags", 3, advisory), "flags=3<VALID,CONTROLLED>");
  EXPECT_EQ(flags_of("flags", 2, advisory), "flags=2<CONTROLLED>");
  EXPECT_EQ(flags_of(" flags", 0, advisory), " flags=0<>");
}

TEST(print_flags, ShowsBitsWithoutNameInTheValueOnly) {
  EXPECT_EQ(flags_of("flags", 0xABCDEF04, advisory), "flags=abcdef04<>");
  EXPECT_EQ(flags_of("flags", 1, "\20"), "flags=1<>");
}

TEST(print_flags, WithoutLabelShowsNamesOnly) {
  EXPECT_EQ(flags_of(nullptr, 0, region), "<>");
  EXPECT_EQ(flags_of(nullptr, 0x22, region), "<MMAPOK,NOCACHE>");
}

TEST(print_flags, Bit32IsTheHighestBit) {
  EXPECT_EQ(flags_of(nullptr, 0x80000000, region), "<MIRRORED>");
  EXPECT_EQ(flags_of(nullptr, 0x7FFFFFC0, region), "<>");
}

TEST(print_flags, Base8IsOctalAndAllOthersHexadecimal) {
  EXPECT_EQ(flags_of("mode", 8, "\10\4EIGHT"), "mode=10<EIGHT>");
  EXPECT_EQ(flags_of("mode", 10, "\12\4EIGHT"), "mode=a<EIGHT>");
}

TEST(print_flags, KeepsTheOrderOfTheNames) {
  EXPECT_EQ(flags_of("f", 7, "\20\3third\1first\2second"), "f=7<third,first,second>");
}

TEST(highlight, ColoursOnTerminalsOnly) {
  const char text[] = "defunct";
  {
    capture file(report);
    EXPECT_EQ(highlight(text, colour::red), text);
  }
  capture_terminal terminal(report);
  EXPECT_STREQ(highlight(text, colour::red), "\033[31mdefunct\033[0m");
  EXPECT_STREQ(highlight(text, colour::cyan), "\033[36mdefunct\033[0m");
}

TEST(highlight, CutsLongTexts) {
  capture_terminal terminal(report);
  const std::string text(1100, 'x');
  EXPECT_EQ(highlight(text.c_str(), colour::red), "\033[31m" + text.substr(0, 1023 - 5));
}

class pid_to_name_test : public testing::Test {
 protected:
  pid_to_name_test() {
    kernel.process(25, "configd\n").process(7, "fifteen-letters\n");
    setenv("TARVEL_ROOT", kernel.root().c_str(), 1);
  }
  ~pid_to_name_test() override { unsetenv("TARVEL_ROOT"); }

  // The name in a buffer of `size` bytes, where nothing may be written behind it.
  static std::string name(int pid, std::size_t size, bool with_pid) {
    std::string buffer(size + 8, '#');
    const foreign_text result = pid_to_name(pid, buffer.data(), size, with_pid);
    EXPECT_EQ(result.text.data(), buffer.data());
    EXPECT_EQ(buffer[result.text.size()], '\0');
    EXPECT_EQ(buffer.substr(size), "########");
    return std::string(result.text);
  }

  kernel_dir kernel;
};

TEST_F(pid_to_name_test, GivesTheNameAndOnRequestTheId) {
  EXPECT_EQ(name(25, 32, false), "configd");
  EXPECT_EQ(name(25, 256, true), "configd.25");
  EXPECT_EQ(name(7, 32, false), "fifteen-letters");
  EXPECT_EQ(name(7, 256, true), "fifteen-letters.7");
}

TEST_F(pid_to_name_test, CutsToTheBuffer) {
  EXPECT_EQ(name(25, 8, false), "configd");
  EXPECT_EQ(name(25, 7, false), "config");
  EXPECT_EQ(name(25, 1, false), "");
  EXPECT_EQ(name(25, 10, true), "configd.2");
  EXPECT_EQ(name(25, 9, true), "configd.");
}

TEST_F(pid_to_name_test, LeavesTheIdOutWhereTheNameFillsTheBuffer) {
  EXPECT_EQ(name(25, 8, true), "configd");
  EXPECT_EQ(name(25, 7, true), "config");
}

TEST_F(pid_to_name_test, UnknownProcessesShowTheirIdInAnyCase) {
  EXPECT_EQ(name(26, 32, false), "<unknown>.26");
  EXPECT_EQ(name(26, 32, true), "<unknown>.26");
  EXPECT_EQ(name(0, 32, false), "<unknown>.0");
  EXPECT_EQ(name(-1, 32, true), "<unknown>.-1");
  EXPECT_EQ(name(26, 12, false), "<unknown>.2");
  EXPECT_EQ(name(2147483647, 32, false), "<unknown>.2147483647");
}

}  // namespace
