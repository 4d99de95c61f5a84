// Compile-time formats against the C library's printf.

#include "common/print.h"

#include <gtest/gtest.h>

#include <cinttypes>
#include <cmath>
#include <cstdio>
#include <limits>
#include <random>
#include <string>

#include "common/text.h"

namespace {

#if defined(__SANITIZE_ADDRESS__)
constexpr int rounds = 20'000;
#else
constexpr int rounds = 1'000'000;
#endif

// A sink that watches the promise of its users to stay within the room they asked for.
class watched_sink {
 public:
  explicit watched_sink(bool is_terminal = false) : is_terminal_(is_terminal) {}

  char *room(std::size_t size) {
    fence_ = buffer_ + size + format::slack;
    EXPECT_LE(fence_, buffer_ + sizeof buffer_ - 1);
    *fence_ = fence;
    return buffer_;
  }
  void commit(char *end, bool ends_line) {
    EXPECT_LE(end + format::slack, fence_);
    EXPECT_EQ(*fence_, fence);
    end_ = end;
    ends_line_ = ends_line;
  }
  bool is_terminal() const { return is_terminal_; }

  std::string_view text() const { return {buffer_, static_cast<std::size_t>(end_ - buffer_)}; }
  bool ends_line() const { return ends_line_; }

 private:
  static constexpr char fence = '\x55';

  bool is_terminal_;
  bool ends_line_ = false;
  char *fence_ = nullptr;
  char *end_ = nullptr;
  char buffer_[4096];
};

template <format::text F, class... Args>
std::string shown(const Args &...args) {
  watched_sink sink;
  format::print_to<F>(sink, args...);
  return std::string(sink.text());
}

// Compares what a format gives with what printf gives for the same format.
template <format::text F, class... Args>
void agree(const Args &...args) {
  char expected[1024];
  const int size = std::snprintf(expected, sizeof expected, F.chars, args...);
  watched_sink sink;
  format::print_to<F>(sink, args...);
  if (sink.text() == std::string_view(expected, static_cast<std::size_t>(size))) return;
  ADD_FAILURE() << F.chars << " gives '" << sink.text() << "', not '" << expected << "'";
}

// Compares each format for a value that `make` makes anew in every round; stops at the first disagreement.
template <format::text... F, class Make>
void agree_on_random(Make make) {
  for (int i = 0; i < rounds && !testing::Test::HasFailure(); ++i) {
    const auto value = make();
    (agree<F>(value), ...);
  }
}

std::mt19937_64 random_bits(20260228);

// Numbers of all lengths.
std::uint64_t random_magnitude() {
  return random_bits() >> random_bits() % 64;
}

std::uint32_t random_u32() {
  return static_cast<std::uint32_t>(random_bits() >> (32 + random_bits() % 32));
}
std::int32_t random_i32() {
  return static_cast<std::int32_t>(random_bits() >> 63 ? random_u32() : -random_u32());
}
unsigned long long random_u64() {
  return random_magnitude();
}
long long random_i64() {
  const std::uint64_t magnitude = random_magnitude();
  return static_cast<long long>(random_bits() >> 63 ? magnitude : 0 - magnitude);
}

// By turns: any bits at all, sums of money, exact ties of the third decimal, rates.
double random_double() {
  switch (random_bits() % 4) {
    case 0:
      return std::bit_cast<double>(random_bits());
    case 1:
      return static_cast<double>(random_i64()) / 100;
    case 2:
      return static_cast<double>(random_i64() >> 13) / 8;
    default:
      return std::ldexp(static_cast<double>(random_bits() >> 11), -static_cast<int>(random_bits() % 64));
  }
}

std::string random_text() {
  std::string text(random_bits() % 20, '\0');
  for (char &letter : text) letter = static_cast<char>(1 + random_bits() % 255);
  return text;
}

TEST(format, SignedIntegersAgreeWithPrintf) {
  agree_on_random<"%d", "%3d", "%4d", "%10d", "%-11d">(random_i32);
}

TEST(format, UnsignedIntegersAgreeWithPrintf) {
  agree_on_random<"%u", "%2u", "%5u", "%6u", "%-3u", "%-5u">(random_u32);
}

TEST(format, LongUnsignedIntegersAgreeWithPrintf) {
  agree_on_random<"%llu", "%9llu", "%-10llu", "%-12llu", "%4qu", "%12qu">(random_u64);
}

TEST(format, LongSignedIntegersAgreeWithPrintf) {
  agree_on_random<"%lld", "%6lld", "%-40lld">(random_i64);
}

TEST(format, HexadecimalAndOctalAgreeWithPrintf) {
  agree_on_random<"%x", "%02x", "%8x", "%-8x", "%o", "%04o">(random_u32);
  agree_on_random<"%llx", "%016llx">(random_u64);
}

TEST(format, BytesAgreeWithPrintf) {
  for (int byte = 0; byte < 256; ++byte) {
    agree<"%02x:%u">(static_cast<std::uint8_t>(byte), static_cast<std::uint8_t>(byte));
    agree<"%c|%3c|%-3c">(static_cast<char>(byte), static_cast<char>(byte), static_cast<char>(byte));
  }
}

TEST(format, CharactersAgreeWithPrintf) {
  agree_on_random<"%c", "%4c", "%-4c">([] { return static_cast<char>(random_bits()); });
}

TEST(format, TextsAgreeWithPrintf) {
  std::string text;
  agree_on_random<"%s", "%8s", "%15s", "%-3s", "%-12s", "%.15s", "%10.4s", "%-10.4s", "%.0s", "%-43s">([&] {
    text = random_text();
    return text.c_str();
  });
}

TEST(format, DoublesWithTwoDecimalsAgreeWithPrintf) {
  agree_on_random<"%.2f", "%5.2f", "%7.2f">(random_double);
}

TEST(format, DoublesInOtherFormsAgreeWithPrintf) {
  agree_on_random<"%g", "%-12g", "%.3f">(random_double);
}

TEST(format, ExtremeIntegersAgreeWithPrintf) {
  agree<"%d %d %u">(INT32_MIN, INT32_MAX, UINT32_MAX);
  agree<"%lld %lld %llu">(std::numeric_limits<long long>::min(), std::numeric_limits<long long>::max(),
                          std::numeric_limits<unsigned long long>::max());
  unsigned long long power = 1;
  for (int digits = 1; digits <= 20; ++digits, power *= 10) {
    agree<"%llu %llu %llu %lld">(power - 1, power, power + 1, -static_cast<long long>(power));
  }
}

TEST(format, SpecialDoublesAgreeWithPrintf) {
  using limits = std::numeric_limits<double>;
  for (const double value : {0.0,
                             0.125,
                             0.375,
                             2.675,
                             1.005,
                             0.005,
                             0.015,
                             0.995,
                             0.994999,
                             9.995,
                             99.995,
                             1e-3,
                             1e15 + 0.125,
                             0x1p52,
                             0x1p52 + 0.5,
                             0x1p53 - 1,
                             0x1p53,
                             0x1p53 + 2,
                             0x1p63,
                             1e22,
                             1e300,
                             limits::max(),
                             limits::min(),
                             limits::denorm_min(),
                             limits::epsilon(),
                             1e5,
                             999999.5,
                             1e6,
                             1e-4,
                             0.00001,
                             limits::infinity(),
                             limits::quiet_NaN()}) {
    agree<"%.2f %5.2f %7.2f %g">(value, value, value, value);
    agree<"%.2f %5.2f %7.2f %g">(-value, -value, -value, -value);
  }
}

TEST(format, LiteralsSurroundConversions) {
  EXPECT_EQ((shown<"">()), "");
  EXPECT_EQ((shown<"100%%\n">()), "100%\n");
  EXPECT_EQ((shown<"\tPort[%2u] %-8s (fd %d)\t%%%c">(7U, "en0", -1, '!')), "\tPort[ 7] en0      (fd -1)\t%!");
}

TEST(format, OnlyALineEndAtTheEndEndsALine) {
  const auto ends_line = []<format::text F>() {
    watched_sink sink;
    format::print_to<F>(sink);
    return sink.ends_line();
  };
  EXPECT_TRUE(ends_line.operator()<"a\n">());
  EXPECT_TRUE(ends_line.operator()<"\n">());
  EXPECT_FALSE(ends_line.operator()<"a\nb">());
  EXPECT_FALSE(ends_line.operator()<"">());
}

std::string shown_on_terminal(const std::string &text) {
  watched_sink sink(true);
  format::print_to<"%12s|%-12s|%.2s">(sink, foreign_text{text}, foreign_text{text}, foreign_text{text});
  return std::string(sink.text());
}

TEST(format, ForeignControlCharactersAreHiddenFromTerminalsOnly) {
  EXPECT_EQ(shown_on_terminal("\033[1m\x7f"), "       ?[1m?|?[1m?       |?[");
  EXPECT_EQ((shown<"%s">(foreign_text{"\033[1m\x7f"})), "\033[1m\x7f");
  for (unsigned code = 0; code < 256; ++code) {
    const bool control = code < 0x20 || code == 0x7f || (code >= 0x80 && code < 0xa0);
    const std::string text(1, static_cast<char>(code));
    EXPECT_EQ(shown_on_terminal(text).back(), control ? '?' : text[0]) << code;
  }
}

TEST(format, OwnTextsKeepTheirControlCharacters) {
  watched_sink terminal(true);
  format::print_to<"%s">(terminal, "\033[36mcyan\033[0m");
  EXPECT_EQ(terminal.text(), "\033[36mcyan\033[0m");
}

}  // namespace
