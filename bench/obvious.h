// What the obvious programs share. Each writes one listing as one would write it first: read the whole table,
// walk it, printf each line, qsort where an order is asked for. They are what the benchmark measures
// tarvelctl against, on the same tables and with the same bytes as result. Their argument is the directory
// that stands for the root.

#ifndef TARVELCTL_BENCH_OBVIOUS_H
#define TARVELCTL_BENCH_OBVIOUS_H

#include <stdint.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>

struct endpoint_address {
  uint8_t length, family;
  uint16_t port;
  uint8_t ipv4[4], ipv6[16];
  uint32_t scope;
};

struct endpoint_stats {
  uint64_t bytes, packets;
  uint32_t state, rtt;
  uint8_t unread[40];
};

struct flow {
  uint8_t nexus[16];
  char interface[16];
  uint32_t bucket;
  char process[32];
  int32_t pid;
  uint32_t flags, port;
  struct endpoint_address local, remote;
  uint8_t protocol, unread_1[3];
  int32_t service_class;
  uint32_t advisory;
  uint8_t unread_2[4];
  struct endpoint_stats local_stats, remote_stats;
  uint8_t unread_3[40];
};

const char *protocol_name(uint8_t protocol);
const char *state_name(uint32_t state);
const char *flags_text(uint32_t flags);

struct channel_group {
  uint8_t nexus[16];
  uint32_t count, unread;
};

struct ring_activity {
  uint64_t slots, bytes, count;
  uint32_t min_slots, max_slots, slots_per_sec, slots_per_sec_avg;
  uint64_t bytes_per_sec, bytes_per_sec_avg;
};

struct ring {
  uint32_t id, unread_1;
  struct ring_activity xfer;
  uint64_t unread_2, mem_total, mem_used;
  struct ring_activity sync;
  uint64_t unread_3, corrupted, length_modified, length_too_large, unread_4;
};

struct channel {
  uint8_t uuid[16];
  uint32_t flags;
  int32_t pid, fd;
  uint32_t port, tx_rings, rx_rings;
  uint8_t unread[8];  // then the rings
};

static inline size_t channel_size(const struct channel *channel) {
  return sizeof *channel + ((size_t)channel->tx_rings + channel->rx_rings) * sizeof(struct ring);
}

// Names of the counters of a protocol stack: the tables of tarvelctl.
struct counter_name {
  char text[24];
  size_t unread_1;
  uint8_t unread_2;
};
extern const struct counter_name ip_counter_names[], ip6_counter_names[];
extern const struct counter_name tcp_counter_names[], udp_counter_names[];

// Reads a variable such as "stats/flow" whole. The program ends where that fails.
void *read_table(const char *root, const char *name, size_t *size);

// Reads what fits of a small file below proc. Returns its length, negative on failure.
long read_small(const char *root, const char *name, char *text, size_t size);

// These return a buffer that the next call overwrites.
const char *process_name(const char *root, int pid, int with_pid);
const char *uuid_text(const uint8_t *uuid);

// The names of the bits that are set, between angle brackets. There is one for each of `count` bits, and one
// for the highest bit.
void print_bit_names(uint32_t value, const char *const *names, int count, const char *highest);

#endif
