// Formats that are read at compile time, against snprintf: the input is a format's number and its value.

#include <cmath>
#include <cstdio>
#include <cstring>

#include "common/text/print.h"
#include "tests/fuzz/harness.h"

namespace {

struct plain_sink {
  char *room(std::size_t size) {
    text.resize(size + format::slack);
    return text.data();
  }
  void commit(const char *end, bool /*ends_line*/) {
    text.resize(static_cast<std::size_t>(end - text.data()));
  }
  format::guard reader_guard() const { return format::guard::none; }

  std::string text;
};

template <format::text F, class Value>
void agree(const Value &value) {
  char expected[1024];
  const int size = std::snprintf(expected, sizeof expected, F.chars, value);
  static plain_sink sink;
  format::print_to<F>(sink, value);
  fuzz::expect(sink.text == std::string_view(expected, static_cast<std::size_t>(size)), F.chars, sink.text);
}

// Compares the format with this number, counted round, for a value of the front of the input.
template <class Value, format::text... F>
void agree_on(fuzz::bytes input) {
  Value value{};
  std::memcpy(&value, input.data() + 1, std::min(input.size() - 1, sizeof value));
  constexpr void (*checks[])(const Value &) = {agree<F, Value>...};
  checks[input[0] / 8 % std::size(checks)](value);
}

template <format::text... F>
void agree_on_text(fuzz::bytes input) {
  const std::string value(reinterpret_cast<const char *>(input.data() + 1), input.size() - 1);
  constexpr void (*checks[])(const char *const &) = {agree<F, const char *>...};
  checks[input[0] / 8 % std::size(checks)](value.c_str());
}

// What is left of a text is plain, each byte of it is the text's own or hidden, and a plain text stays whole.
void guard(fuzz::bytes input) {
  const auto reader = input[0] / 8 % 2 ? format::guard::utf8 : format::guard::bytes;
  const std::string text(reinterpret_cast<const char *>(input.data() + 1), input.size() - 1);
  std::string shown = text;
  format::hide_controls(shown, reader);
  const bool is_own = std::equal(text.begin(), text.end(), shown.begin(),
                                 [](char own, char seen) { return seen == own || seen == '?'; });
  fuzz::expect(is_own && fuzz::is_plain(shown, reader), "a text is not guarded", shown);
  fuzz::expect(shown == text || !fuzz::is_plain(text, reader), "a plain text is hidden", text);
}

constexpr void (*kinds[])(fuzz::bytes) = {
    agree_on<int, "%d", "%3d", "%4d", "%10d", "%-11d", "|%d|\n">,
    agree_on<unsigned, "%u", "%2u", "%5u", "%-5u", "%x", "%02x", "%8x", "%-8x", "%o", "%04o", "%6u">,
    agree_on<long long, "%lld", "%6lld", "%-40lld">,
    agree_on<unsigned long long, "%llu", "%9llu", "%-10llu", "%-12llu", "%4qu", "%12qu", "%llx", "%016llx">,
    agree_on<double, "%.2f", "%5.2f", "%7.2f", "%g", "%.3f", "%f", "%-12g">,
    agree_on<char, "%c", "%4c", "%-4c">,
    agree_on_text<"%s", "%8s", "%15s", "%-3s", "%-12s", "%.15s", "%10.4s", "%-10.4s", "%.0s", "%-43.43s",
                  "\t%-16s:">,
    guard,
};

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
  if (size < 2 || size > 512) return -1;
  kinds[data[0] % std::size(kinds)]({data, size});
  return 0;
}
