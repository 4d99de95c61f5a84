// Printing by printf formats that are read when the program is compiled.
//
//   print<"\tPort[%2u] %-22s (fd %d)\t">(port, name, fd);
//
// gives the bytes of printf for the same format. The number and types of the arguments are checked by the
// compiler; what is left for run time is one check for room and straight-line appends into a buffer. No
// locale is consulted, and nothing allocated but for a row that is longer than the buffer.
//
// Conversions: %d (signed), %u %x %o (unsigned), %c (char), %s (text), %f %g (double) and %%. Flags "-" and
// "0", width and precision as numbers. 64-bit integers need "ll" or "q", all others must not have it, as in
// C.
//
// Texts are whatever converts to std::string_view, format::small_text, any type with a member `printable()`
// that returns one or a format::text_view, and any that appends itself (format::appendable). Texts marked
// foreign come from outside the program (the kernel, a process, a name service): where the reader is a
// terminal, each byte that it might obey (common/text/guard.h) shows as "?", so that a process name cannot
// drive the terminal. This is judged when a text has been cut to its column, and changes no width.

#ifndef TARVELCTL_COMMON_TEXT_PRINT_H
#define TARVELCTL_COMMON_TEXT_PRINT_H

#include <algorithm>
#include <array>
#include <bit>
#include <charconv>
#include <concepts>
#include <cstdint>
#include <cstring>
#include <string_view>
#include <type_traits>
#include <utility>

#include "common/text/format_text.h"
#include "common/text/guard.h"

namespace format {

// A text to print. `data` need not be terminated.
struct text_view {
  const char *data;
  std::size_t size;
  bool foreign;
};

// A short text made for printing, with its storage.
template <std::size_t Capacity>
struct small_text {
  char chars[Capacity];
  std::size_t size = 0;
  bool foreign = false;

  small_text() = default;

  // A constant, terminated.
  template <std::size_t N>
  requires(N <= Capacity) consteval small_text(const char (&text)[N]) : chars{}, size(N - 1) {
    std::copy_n(text, N, chars);
  }

  constexpr std::string_view view() const { return {chars, size}; }

  // Sets the size to where appending to `chars` ended.
  void end_at(const char *end) { size = static_cast<std::size_t>(end - chars); }
};

// A name in a constant table: what is known to be short is copied without asking how long it is.
using name_text = small_text<16>;

// A constant name at the left of a column that is `Width` wide, padded when the program is compiled.
template <std::size_t Width, std::size_t Capacity>
struct column_text {
  static constexpr std::size_t text_size = Capacity;
  char chars[Capacity];
  std::size_t size;
  std::size_t name_size;

  template <std::size_t N>
  requires(N <= Capacity) consteval column_text(const char (&name)[N])
      : chars{}, size(std::max(N - 1, Width)), name_size(N - 1) {
    std::fill_n(std::copy_n(name, name_size, chars), size - name_size, ' ');
  }

  constexpr std::string_view name() const { return {chars, name_size}; }

  char *append_to(char *to) const {
    std::memcpy(to, chars, Capacity);  // a constant size needs no call
    return to + size;
  }
};

// What writes its text where it belongs: appends at most `text_size` bytes and returns the end. Its
// conversion has neither width nor precision.
template <class T>
concept appendable = requires(const T &value, char *to) {
  { value.append_to(to) } -> std::same_as<char *>;
  T::text_size;
};

// Bytes that any step may write past what it appends; every sink's room() leaves as many.
inline constexpr std::size_t slack = 64;

// Appends at most `Most` blanks. All of them are written, whatever the count: a constant size needs no call.
template <std::size_t Most>
char *put_blanks(char *to, std::size_t count) {
  static_assert(Most <= slack);
  std::memset(to, ' ', Most);
  return to + count;
}

inline unsigned decimal_digits(std::uint64_t value) {
  static constexpr auto powers = [] {
    std::array<std::uint64_t, 20> table{};
    std::uint64_t power = 1;
    for (auto &entry : table) {
      entry = power;
      power *= 10;
    }
    return table;
  }();
  value |= 1;
  const unsigned guess = static_cast<unsigned>(std::bit_width(value)) * 1233 >> 12;
  return guess + (value >= powers[guess]);
}

// The eight decimal digits of a number below 10^8, zeros in front included, one a byte, the first one lowest.
// The number is split in halves, in quarters, in digits, each time in all parts of the word at once: how many
// digits there are decides no branch.
inline std::uint64_t eight_digits(std::uint32_t value) {
  const std::uint64_t halves = value / 10000 | std::uint64_t{value % 10000} << 32;
  const std::uint64_t upper_quarters = (halves * 10486 >> 20) & 0x7f'0000'007f;  // by 100
  const std::uint64_t quarters = upper_quarters | (halves - 100 * upper_quarters) << 16;
  const std::uint64_t upper_digits = (quarters * 103 >> 10) & 0xf'000f'000f'000f;  // by 10
  return upper_digits | (quarters - 10 * upper_digits) << 8;
}

// Writes exactly `digits` decimal digits of `value`, and up to 7 bytes behind them.
inline char *put_digits(char *to, std::uint64_t value, unsigned digits) noexcept {
  static_assert(std::endian::native == std::endian::little);
  constexpr std::uint64_t zeros = 0x3030'3030'3030'3030;
  constexpr std::uint64_t limit = 100'000'000;
  if (digits > 8) {
    to = put_digits(to, value / limit, digits - 8);
    value %= limit;
    digits = 8;
  }
  const std::uint64_t text = (eight_digits(static_cast<std::uint32_t>(value)) | zeros) >> (8 * (8 - digits));
  std::memcpy(to, &text, sizeof text);
  return to + digits;
}

// Longest text of a double in the conversions above: "%f" of the largest one, with six decimals.
inline constexpr std::size_t double_size = 320;

// As "%.2f". Multiplied by 100, a double below 2^53 is a 60-bit integer shifted right: the digits, and which
// way to round, come from integer arithmetic. Ties are exact in binary and go to the even digit.
inline char *put_hundredths(char *to, double value) {
  const auto bits = std::bit_cast<std::uint64_t>(value);
  const auto exponent = static_cast<unsigned>(bits >> 52 & 0x7ff);
  constexpr unsigned integral = 1075;  // from this exponent on a double has no fraction bits
  if (exponent >= integral) {
    return std::to_chars(to, to + double_size, value, std::chars_format::fixed, 2).ptr;
  }
  const std::uint64_t mantissa = (bits & 0xfffffffffffff) | (exponent ? std::uint64_t{1} << 52 : 0);
  const unsigned shift = integral - std::max(exponent, 1U);
  std::uint64_t hundredths = 0;
  if (shift < 64) {
    const std::uint64_t scaled = mantissa * 100;
    const std::uint64_t half = std::uint64_t{1} << (shift - 1);
    const std::uint64_t rest = scaled & (2 * half - 1);
    hundredths = scaled >> shift;
    hundredths += rest > half || (rest == half && (hundredths & 1));
  }
  if (bits >> 63) *to++ = '-';
  const std::uint64_t whole = hundredths / 100;
  to = put_digits(to, whole, decimal_digits(whole));
  *to++ = '.';
  return put_digits(to, hundredths % 100, 2);
}

// What a conversion shows of a text.
template <piece P>
std::size_t shown_size(std::size_t size) {
  if constexpr (P.precision == no_precision) return size;
  return std::min(P.precision, size);
}

// The bytes that `piece` may need for an argument, beside its literal text.
template <piece P, class T>
std::size_t bound(const T &argument) {
  if constexpr (P.kind == 's' && std::same_as<T, text_view>) {
    return std::max(P.width, shown_size<P>(argument.size));
  } else if constexpr (appendable<T>) {
    return T::text_size;
  } else if constexpr (P.kind == 's') {
    return std::max(P.width, shown_size<P>(sizeof argument.chars));
  } else {
    return std::max(P.width, std::floating_point<T> ? double_size : 24);
  }
}

// Appends `size` bytes of a text of which `Readable` bytes may be read, or only `size` where that is 0.
template <std::size_t Readable>
char *put_bytes(char *to, const char *text, std::size_t size) {
  if constexpr (Readable > 0 && Readable <= slack) {
    std::memcpy(to, text, Readable);  // a constant size needs no call
  } else {
    if (size) std::memcpy(to, text, size);  // an empty text may have no address
  }
  return to + size;
}

template <piece P, std::size_t Readable = 0>
char *put_padded(char *to, const char *text, std::size_t size) {
  if constexpr (P.width == 0) return put_bytes<Readable>(to, text, size);
  const std::size_t padding = P.width > size ? P.width - size : 0;
  if constexpr (P.left) return put_blanks<P.width>(put_bytes<Readable>(to, text, size), padding);
  return put_bytes<Readable>(put_blanks<P.width>(to, padding), text, size);
}

template <piece P, std::size_t Readable = 0>
char *put_text(char *to, text_view text, guard against) {
  const std::size_t size = shown_size<P>(text.size);
  char *const end = put_padded<P, Readable>(to, text.data, size);
  if (text.foreign && against != guard::none) {
    const std::size_t padding = P.width > size ? P.width - size : 0;
    hide_controls({P.left ? to : to + padding, size}, against);
  }
  return end;
}

template <piece P>
char *put_decimal(char *to, std::uint64_t magnitude, bool negative) {
  const unsigned digits = decimal_digits(magnitude);
  const std::size_t size = digits + negative;
  if constexpr (P.width == 0) {
    if (negative) *to++ = '-';
    return put_digits(to, magnitude, digits);
  }
  const std::size_t padding = P.width > size ? P.width - size : 0;
  if (!P.left) to = put_blanks<P.width>(to, padding);
  if (negative) *to++ = '-';
  to = put_digits(to, magnitude, digits);
  return P.left ? put_blanks<P.width>(to, padding) : to;
}

template <piece P, std::unsigned_integral T>
char *put_power_of_two(char *to, T value) {
  char digits[24];
  const char *end = std::to_chars(digits, digits + sizeof digits, value, P.kind == 'x' ? 16 : 8).ptr;
  const auto size = static_cast<std::size_t>(end - digits);
  if (P.zero && P.width > size) {
    std::memset(to, '0', P.width - size);
    to += P.width - size;
    std::memcpy(to, digits, size);
    return to + size;
  }
  return put_padded<P>(to, digits, size);
}

template <piece P>
char *put_double(char *to, double value) {
  constexpr int precision = P.precision == no_precision ? 6 : static_cast<int>(P.precision);
  char digits[double_size];
  const char *end;
  if constexpr (P.kind == 'f' && precision == 2) {
    end = put_hundredths(digits, value);
  } else {
    constexpr auto style = P.kind == 'f' ? std::chars_format::fixed : std::chars_format::general;
    end = std::to_chars(digits, digits + sizeof digits, value, style, precision).ptr;
  }
  return put_padded<P>(to, digits, static_cast<std::size_t>(end - digits));
}

// Appends one argument for a reader who is guarded against foreign texts.
template <piece P, class T>
char *put(char *to, const T &argument, guard against) {
  if constexpr (P.kind == 's') {
    if constexpr (std::same_as<T, text_view>) {
      return put_text<P>(to, argument, against);
    } else if constexpr (appendable<T>) {
      return argument.append_to(to);
    } else {
      return put_text<P, sizeof argument.chars>(to, {argument.chars, argument.size, argument.foreign},
                                                against);
    }
  } else if constexpr (P.kind == 'c') {
    return put_padded<P>(to, &argument, 1);
  } else if constexpr (P.kind == 'f' || P.kind == 'g') {
    return put_double<P>(to, argument);
  } else if constexpr (P.kind == 'd') {
    const auto value = static_cast<std::int64_t>(argument);
    const auto magnitude = static_cast<std::uint64_t>(value);
    return put_decimal<P>(to, value < 0 ? 0 - magnitude : magnitude, value < 0);
  } else if constexpr (P.kind == 'u') {
    return put_decimal<P>(to, argument, false);
  } else {
    return put_power_of_two<P>(to, argument);
  }
}

// The form in which an argument is handed to put(): what appends itself as it is, numbers copied, so that no
// text can be taken to overwrite them, other texts as views or small texts.
template <class T>
decltype(auto) prepare(const T &argument) {
  if constexpr (std::is_arithmetic_v<T>) {
    return T{argument};
  } else if constexpr (appendable<T>) {
    return argument;
  } else if constexpr (requires { argument.printable(); }) {
    return argument.printable();
  } else if constexpr (requires { argument.chars; }) {
    return argument;  // a small text
  } else {
    const std::string_view text = argument;
    return text_view{text.data(), text.size(), false};
  }
}

template <piece P, class T>
consteval bool accepts() {
  constexpr bool integer_width = P.wide ? sizeof(T) == 8 : sizeof(T) <= 4;
  switch (P.kind) {
    case 'd':
      return std::signed_integral<T> && integer_width && !P.zero && P.precision == no_precision;
    case 'u':
      return std::unsigned_integral<T> && integer_width && !P.zero && P.precision == no_precision;
    case 'x':
    case 'o':
      return std::unsigned_integral<T> && integer_width && P.precision == no_precision;
    case 'c':
      return std::same_as<T, char>;
    case 'f':
    case 'g':
      return std::floating_point<T> && !P.zero && (P.precision == no_precision || P.precision <= 6);
    default:
      if (appendable<T> && (P.width || P.precision != no_precision)) return false;
      return !std::is_arithmetic_v<T> && !P.zero;
  }
}

template <text F>
inline constexpr auto parsed = parse(F);

template <text F, std::size_t... I, class Sink, class... Args>
void emit(std::index_sequence<I...>, Sink &sink, const Args &...args) {
  constexpr const auto &format = parsed<F>;
  constexpr auto literal = [](char *to, const piece &piece) {
    std::memcpy(to, parsed<F>.literals.data() + piece.literal, piece.literal_size);
    return to + piece.literal_size;
  };
  static_assert((accepts<format.pieces[I], Args>() && ...), "an argument does not fit its conversion");
  char *to = sink.room((format.literals_size + ... + bound<format.pieces[I]>(args)));
  [[maybe_unused]] const guard against = sink.reader_guard();
  ((to = literal(to, format.pieces[I]), to = put<format.pieces[I]>(to, args, against)), ...);
  to = literal(to, format.pieces[sizeof...(I)]);
  constexpr bool ends_line = sizeof(F.chars) > 1 && F.chars[sizeof(F.chars) - 2] == '\n';
  sink.commit(to, ends_line);
}

// Prints to a sink, an object with
//   char *room(std::size_t n)        returns where to append; n + slack bytes may be written there
//   void commit(char *end, bool)     takes what was appended up to `end`; true when a line ends there
//   guard reader_guard() const       what foreign texts must hide
template <text F, class Sink, class... Args>
void print_to(Sink &sink, const Args &...args) {
  static_assert(parsed<F>.conversions == sizeof...(Args), "as many arguments as conversions");
  emit<F>(std::index_sequence_for<Args...>{}, sink, prepare(args)...);
}

// A sink for a text of its own, on the stack.
template <std::size_t Size>
struct scratch {
  char chars[Size + slack];
  char *end = chars;

  char *room(std::size_t) { return chars; }
  void commit(char *to, bool) { end = to; }
  guard reader_guard() const { return guard::none; }
};

template <text F>
consteval bool texts_are_bounded() {
  return std::all_of(parsed<F>.pieces.begin(), parsed<F>.pieces.end(), [](const piece &p) {
    return p.width <= double_size && (p.kind != 's' || p.precision < 64);
  });
}

template <class T>
bool is_foreign(const T &argument) {
  if constexpr (requires { argument.foreign; }) return argument.foreign;
  return false;
}

// A text of at most `Capacity` - 1 bytes; what does not fit is cut. Texts in it have a precision. It is
// foreign if one of them is.
template <text F, std::size_t Capacity, class... Args>
small_text<Capacity> text_of(const Args &...args) {
  static_assert(texts_are_bounded<F>(), "%s needs a precision here");
  scratch<sizeof(F.chars) + sizeof...(Args) * double_size> all;
  print_to<F>(all, args...);
  small_text<Capacity> result;
  result.size = std::min(static_cast<std::size_t>(all.end - all.chars), Capacity - 1);
  std::memcpy(result.chars, all.chars, result.size);
  result.foreign = (0 | ... | is_foreign(prepare(args))) != 0;
  return result;
}

}  // namespace format

#endif
