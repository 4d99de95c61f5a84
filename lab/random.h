// Random numbers that are the same for the same seed, on every machine and with every library.

#ifndef TARVELCTL_LAB_RANDOM_H
#define TARVELCTL_LAB_RANDOM_H

#include <cstdint>
#include <cstring>

#include "common/tables/uuid.h"

namespace lab {

class random_source {
 public:
  explicit random_source(std::uint64_t seed) : state_(seed) {}

  // A source of its own for a part of what `seed` stands for, whatever was drawn before.
  random_source(std::uint64_t seed, std::uint64_t part, std::uint64_t number = 0)
      : state_(mixed(mixed(seed ^ part * step) ^ number)) {}

  std::uint64_t next() { return mixed(state_ += step); }

  // From 0 up to `bound` - 1; 0 where `bound` is 0.
  std::uint32_t below(std::uint32_t bound) {
    return static_cast<std::uint32_t>((next() >> 32) * bound >> 32);
  }

  // From `low` up to `high`.
  std::uint32_t between(std::uint32_t low, std::uint32_t high) { return low + below(high - low + 1); }

  // True `times` out of `per`.
  bool chance(std::uint32_t times, std::uint32_t per) { return below(per) < times; }

  // `amount` * `times` / `per`, rounded up as often as the rest is large, so that the sum of many is exact.
  std::uint64_t share(std::uint64_t amount, std::uint32_t times, std::uint32_t per) {
    return (amount * times + below(per)) / per;
  }

  // A random (version 4) identity.
  uuid identity() {
    const std::uint64_t halves[] = {next(), next()};
    uuid made;
    std::memcpy(made.bytes, halves, sizeof made.bytes);
    made.bytes[6] = static_cast<unsigned char>((made.bytes[6] & 0x0f) | 0x40);
    made.bytes[8] = static_cast<unsigned char>((made.bytes[8] & 0x3f) | 0x80);
    return made;
  }

 private:
  static constexpr std::uint64_t step = 0x9e3779b97f4a7c15;

  // Spreads every bit over all others (splitmix64).
  static std::uint64_t mixed(std::uint64_t value) {
    value = (value ^ (value >> 30)) * 0xbf58476d1ce4e5b9;
    value = (value ^ (value >> 27)) * 0x94d049bb133111eb;
    return value ^ (value >> 31);
  }

  std::uint64_t state_;
};

}  // namespace lab

#endif
