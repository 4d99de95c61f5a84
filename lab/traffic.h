// Amounts of traffic.

#ifndef TARVELCTL_LAB_TRAFFIC_H
#define TARVELCTL_LAB_TRAFFIC_H

#include <cstdint>

namespace lab {

// Something that exists for both directions.
template <class T>
struct two_way {
  T out;
  T in;
};

struct traffic {
  std::uint64_t bytes = 0;
  std::uint64_t packets = 0;

  traffic &operator+=(const traffic &more) {
    bytes += more.bytes;
    packets += more.packets;
    return *this;
  }
};

// A total with the rates of the latest interval, as a kernel keeps them.
struct meter {
  traffic total;
  traffic interval;
  std::uint64_t bytes_per_second = 0;
  std::uint64_t bytes_average = 0;
  std::uint32_t packets_per_second = 0;
  std::uint32_t packets_average = 0;

  void add(const traffic &more) {
    total += more;
    interval += more;
  }

  // Takes the rates of an interval that ends; the next one begins.
  void end_interval(std::uint32_t milliseconds) {
    bytes_per_second = interval.bytes * 1000 / milliseconds;
    packets_per_second = static_cast<std::uint32_t>(interval.packets * 1000 / milliseconds);
    bytes_average = bytes_average ? (7 * bytes_average + bytes_per_second) / 8 : bytes_per_second;
    packets_average = packets_average ? (7 * packets_average + packets_per_second) / 8 : packets_per_second;
    interval = {};
  }

  // Keeps the total and nothing else.
  void forget_rates() { *this = {.total = total}; }
};

// What a protocol stack in user space has seen.
struct stack_totals {
  // By IPv6 or not, by UDP or TCP.
  two_way<traffic> moved[2][2];
  std::uint64_t initiated = 0;  // connections
  std::uint64_t accepted = 0;
  std::uint64_t closed = 0;

  stack_totals &operator+=(const stack_totals &more) {
    for (int ipv6 = 0; ipv6 < 2; ++ipv6) {
      for (int udp = 0; udp < 2; ++udp) {
        moved[ipv6][udp].out += more.moved[ipv6][udp].out;
        moved[ipv6][udp].in += more.moved[ipv6][udp].in;
      }
    }
    initiated += more.initiated;
    accepted += more.accepted;
    closed += more.closed;
    return *this;
  }
};

}  // namespace lab

#endif
