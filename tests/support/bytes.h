// Kernel records for tests, written byte by byte: what a record means is the business of the code under test.

#ifndef TARVELCTL_TESTS_SUPPORT_BYTES_H
#define TARVELCTL_TESTS_SUPPORT_BYTES_H

#include <bit>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <stdexcept>
#include <string>
#include <string_view>

// A record of `size` zero bytes, to be filled at offsets and put together with others by "+":
//   bytes(264).text(64, "en0").u32(128, 3) + bytes(264)
// Writing past the end is an error of the test.
class bytes : public std::string {
 public:
  explicit bytes(std::size_t size) : std::string(size, '\0') {}

  bytes &u8(std::size_t at, std::uint8_t value) { return put(at, value); }
  bytes &u16(std::size_t at, std::uint16_t value) { return put(at, value); }
  bytes &u32(std::size_t at, std::uint32_t value) { return put(at, value); }
  bytes &u64(std::size_t at, std::uint64_t value) { return put(at, value); }

  // In network byte order.
  bytes &net16(std::size_t at, std::uint16_t value) {
    return put(at, static_cast<std::uint16_t>(value << 8 | value >> 8));
  }

  // The characters alone, no NUL behind them.
  bytes &text(std::size_t at, std::string_view value) {
    if (at + value.size() > size()) throw std::out_of_range("text leaves the record");
    replace(at, value.size(), value);
    return *this;
  }

  // From canonical form.
  bytes &uuid(std::size_t at, std::string_view canonical) {
    std::string digits(canonical);
    std::erase(digits, '-');
    for (std::size_t i = 0; i < 16; ++i) {
      u8(at + i, static_cast<std::uint8_t>(std::stoul(digits.substr(2 * i, 2), nullptr, 16)));
    }
    return *this;
  }

 private:
  static_assert(std::endian::native == std::endian::little, "kernel records are in the order of the machine");

  template <class T>
  bytes &put(std::size_t at, T value) {
    if (at + sizeof value > size()) throw std::out_of_range("value leaves the record");
    std::memcpy(data() + at, &value, sizeof value);
    return *this;
  }
};

#endif
