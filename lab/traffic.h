// Amounts of traffic, and what is counted of it.

#ifndef TARVELCTL_LAB_TRAFFIC_H
#define TARVELCTL_LAB_TRAFFIC_H

#include <cstddef>
#include <cstdint>

namespace lab {

inline constexpr std::uint32_t segment_headers = 52;  // bytes of a segment with the usual options

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

inline two_way<traffic> &operator+=(two_way<traffic> &sum, const two_way<traffic> &more) {
  sum.out += more.out;
  sum.in += more.in;
  return sum;
}

// What a ring has moved, with the rates of the latest interval, as a kernel keeps them.
struct meter {
  traffic total;
  traffic interval;
  std::uint64_t bytes_per_second = 0;
  std::uint64_t bytes_average = 0;
  std::uint32_t packets_per_second = 0;
  std::uint32_t packets_average = 0;
  std::uint32_t waiting = 0;  // packets in the ring

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
};

// What happens in a protocol stack.
namespace stack {
// Connections that were asked for here, or there; of both, those that were established, that never were, that
// were given up, and that are no more.
enum connections : std::uint8_t { initiated, accepted, established, refused, timed_out, closed, packets };

// What was sent again, for a time-out or not, and datagrams for no one or for who does not read them.
enum event : std::uint8_t { resent = packets, resent_bytes, timeouts, no_port, full_socket, events };
}  // namespace stack

// What a protocol stack in user space has seen.
struct stack_totals {
  two_way<traffic> moved[2][2];  // by IPv6 or not, by UDP or TCP
  std::uint64_t count[stack::events] = {};

  stack_totals &operator+=(const stack_totals &more) {
    for (int kind = 0; kind < 4; ++kind) moved[kind / 2][kind % 2] += more.moved[kind / 2][kind % 2];
    for (std::size_t i = 0; i < stack::events; ++i) count[i] += more.count[i];
    return *this;
  }
};

// Why packets are lost on their way through a nexus: no flow waits for it or the flow is no more, its channel
// is defunct or has a full ring, and so on; the last one on the way out.
namespace lost {
enum reason : std::uint8_t {
  no_match,
  torn_down,
  defunct,
  no_space,
  no_memory,
  bad_length,
  not_sent,
  reasons
};
}  // namespace lost

// In percent, 50 to 150 and 100 on average: what rises and falls in the course of some minutes, of a machine
// that has run so many milliseconds, for each key at a pace of its own.
inline std::uint32_t tide(std::uint64_t elapsed, std::uint64_t key) {
  const std::uint64_t period = 120'000 + key % 500'000;
  const std::uint64_t at = (elapsed + key / 8 % period) % period;
  return static_cast<std::uint32_t>(50 + (at < period - at ? at : period - at) * 200 / period);
}

}  // namespace lab

#endif
