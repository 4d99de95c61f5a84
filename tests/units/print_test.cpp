// Compile-time formats against the C library's printf.

#include "common/text/print.h"

#include <cfloat>
#include <cmath>

#include "common/text/text.h"
#include "tests/units/units.h"

namespace {

using format::guard;

// Watches the promise of its users to stay within the room that they asked for.
struct {
  char *room(std::size_t size) {
    fence = chars + size + format::slack;
    *fence = '\x55';
    return chars;
  }
  void commit(char *to, bool) {
    EXPECT_TRUE(to + format::slack <= fence && *fence == '\x55');
    end = to;
  }
  guard reader_guard() const { return against; }

  guard against;
  char *fence, *end;
  char chars[4096];
} sink;

// What a format gives, until the next call.
template <format::text F, class... Args>
std::string_view shown(guard against, const Args &...args) {
  sink.against = against;
  format::print_to<F>(sink, args...);
  return {sink.chars, sink.end};
}

// Compares what a format gives with what printf gives for the same format.
template <format::text F, class... Args>
void agree(const Args &...args) {
  char expected[1024];
  const int size = std::snprintf(expected, sizeof expected, F.chars, args...);
  EXPECT_EQ(shown<F>(guard::none, args...), std::string_view(expected, expected + size)) << F.chars;
}

// Compares each format for a value that `make` makes anew in every round; stops at the first disagreement.
template <format::text... F, class Make>
void agree_on_random(Make make) {
  for (int i = 0; i < ROUNDS && !testing::Test::HasFailure(); ++i) {
    const auto value = make();
    (agree<F>(value), ...);
  }
}

std::mt19937_64 random_bits(20260228);

// Numbers of all lengths.
template <class Number>
Number random_number() {
  const std::uint64_t magnitude = random_bits() >> random_bits() % 64;
  return static_cast<Number>(random_bits() >> 63 ? magnitude : 0 - magnitude);
}

// Any bits at all, sums of money, exact ties of the third decimal, rates.
double random_double() {
  const double kinds[] = {
      std::bit_cast<double>(random_bits()), static_cast<double>(random_number<long long>()) / 100,
      static_cast<double>(random_number<long long>() >> 13) / 8,
      std::ldexp(static_cast<double>(random_bits() >> 11), -static_cast<int>(random_bits() % 64))};
  return kinds[random_bits() % 4];
}

TEST(format, IntegersAgreeWithPrintf) {
  agree_on_random<"%d", "%4d", "%-11d", "%64d">(random_number<int>);
  agree_on_random<"%u", "%5u", "%-5u">(random_number<unsigned>);
  agree_on_random<"%lld", "%6lld", "%-40lld">(random_number<long long>);
  agree_on_random<"%llu", "%9llu", "%-12llu", "%12qu">(random_number<unsigned long long>);
  agree_on_random<"%x", "%02x", "%8x", "%-8x", "%o", "%04o">(random_number<unsigned>);
  agree_on_random<"%llx", "%016llx">(random_number<unsigned long long>);
}

TEST(format, CharactersAndTextsAgreeWithPrintf) {
  agree_on_random<"%c", "%4c", "%-4c">([] { return static_cast<char>(random_bits()); });
  std::string text;
  agree_on_random<"%s", "%8s", "%-12s", "%.31s", "%10.4s", "%-40.40s", "%-43.43s", "%.0s", "%-64s">([&] {
    text.assign(random_bits() % 60, '\0');
    for (char &letter : text) letter = static_cast<char>(1 + random_bits() % 255);
    return text.c_str();
  });
}

TEST(format, DoublesAgreeWithPrintf) {
  agree_on_random<"%.2f", "%7.2f", "%g", "%-12g", "%.3f">(random_double);
}

TEST(format, ExtremesAgreeWithPrintf) {
  EXPECT_EQ(shown<"">(guard::none), "");
  agree<"100%%\n\tPort[%2u] %-8s (fd %d)\t%%%c %02x">(7U, "en0", -1, '!', std::uint8_t{255});
  agree<"%d %d %u %lld %lld %llu">(INT_MIN, INT_MAX, UINT_MAX, LLONG_MIN, LLONG_MAX, ULLONG_MAX);
  for (const double value :
       {0.0, 0.125, 0.375, 0.994999, 0.995, 9.995, 1e-5, 1e-4, 999999.5, 1e6, 0x1p52 + 0.5, 0x1p53 - 1,
        0x1p53, DBL_MAX, DBL_MIN, DBL_TRUE_MIN, HUGE_VAL, std::nan("")}) {
    agree<"%.2f %g">(value, value);
    agree<"%.2f %g">(-value, -value);
  }
}

TEST(format, Utf8HidesControlsAndWhatIsNoCharacter) {
  const std::string_view whole =
      "\x20\x7e\xc2\xa0\u07ff\u0800\u2027\u202f\u2065\u206a\ud7ff\ue000\uffff\U00010000\U0010ffff";
  EXPECT_EQ((shown<"%s">(guard::utf8, foreign_text{whole})), whole);
  for (const char *hidden : {"\x1f\x7f", "\xc2\x80", "\xc2\x9f", "\u2028", "\u202e", "\u2066", "\u2069",
                             "\x80\xbf\xff", "\xc1\xbe", "\xe0\x9f\xbf", "\xf0\x8f\xbf\xbf", "\xed\xa0\x80",
                             "\xed\xbf\xbf", "\xf4\x90\x80\x80", "\xf8\x88\x80\x80\x80", "\xe2\x82"}) {
    EXPECT_EQ((shown<"%sz">(guard::utf8, foreign_text{hidden})), std::string(std::strlen(hidden), '?') + "z");
  }
  EXPECT_EQ((shown<"%s">(guard::utf8, foreign_text{"\xf0\x9f\x98\xc3\xa4\xe2(\xa1"})), "???\u00e4?(?");
  const foreign_text text{"\033[1m\u20ac"};
  EXPECT_EQ((shown<"%9s|%-9.6s|%.5s">(guard::utf8, text, text, text)), "  ?[1m\u20ac|?[1m??   |?[1m?");
}

}  // namespace
