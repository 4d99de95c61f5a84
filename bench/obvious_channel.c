// The channels of each nexus with the statistics of their rings.

#include "obvious.h"

static const char *units(char *text, int divisor, double value) {
  static const char *decimal[] = {"", "K", "M", "G", "T"}, *binary[] = {"", "KB", "MB", "GB", "TB"};
  int i = 0;
  for (; value >= divisor && i < 4; i++) value /= divisor;
  if (divisor == 1000) {
    snprintf(text, 32, "%.2f%s", value, decimal[i]);
  } else {
    snprintf(text, 32, "%g%s", value, binary[i]);
  }
  return text;
}

static void print_activity(const struct ring_activity *a) {
  char t[4][32];
  printf(" %8s %8s", units(t[0], 1000, (double)a->bytes_per_sec),
         units(t[1], 1000, (double)a->bytes_per_sec_avg));
  printf(" %12llu", (unsigned long long)a->bytes);
  printf(" %8s %8s", units(t[2], 1000, a->slots_per_sec), units(t[3], 1000, a->slots_per_sec_avg));
  printf(" %12llu", (unsigned long long)a->slots);
  printf(" %4d %4llu %4d\n", (int)a->min_slots, a->count ? (unsigned long long)(a->slots / a->count) : 0,
         (int)a->max_slots);
}

static void print_ring(const char *direction, const struct ring *ring) {
  char text[80], used[32], total[32];
  snprintf(text, 16, "%s[%d]", direction, (int)ring->id);
  printf("%-14s", text);
  print_activity(&ring->xfer);
  snprintf(text, sizeof text, "%s/%s", units(used, 1024, (double)ring->mem_used),
           units(total, 1024, (double)ring->mem_total));
  printf("%14s", text);
  print_activity(&ring->sync);
  if (!ring->length_modified && !ring->length_too_large && !ring->corrupted) return;
  printf("%12s", "Errors:");
  if (ring->length_modified) printf(" Length modified: %s", units(text, 1000, (double)ring->length_modified));
  if (ring->length_too_large)
    printf(" Length too large: %s", units(text, 1000, (double)ring->length_too_large));
  if (ring->corrupted) printf(" Corrupted data: %s", units(text, 1000, (double)ring->corrupted));
  printf("\n");
}

static void print_header(void) {
  printf("%-14s %8s %8s %12s %8s %8s %12s %4s %4s %4s\n", "Ring", "Bytes/s", "average", "Bytes", "Slots/s",
         "average", "Slots", "Min", "Avg", "Max");
  printf("%14s %8s %8s %12s %8s %8s %12s %4s %4s %4s\n", "Mem Use/Total", "/sync", "", "Bytes", "/sync", "",
         "Slots", "", "", "");
}

static void print_channel(const char *root, const struct channel *channel) {
  static const char *const flags[] = {"MON_TX",           "MON_RX",     "NO_COPY",
                                      "USER_PACKET_POOL", "DEFUNCT_OK", "EXCLUSIVE"};
  static int has_header;
  printf("\tPort[%2u] %-22s (fd %d)\t", channel->port, process_name(root, channel->pid, 1), channel->fd);
  if (channel->flags) {
    printf(" flags=%x", channel->flags);
    print_bit_names(channel->flags, flags, 6, "DEFUNCT");
  }
  printf("\n");
  char enabled = 0;
  if (read_small(root, "sys/kern/tarvel/ring_stat_enable", &enabled, 1) < 0)
    perror("failed to get channel stat");
  if (!enabled) return;
  if ((channel->tx_rings || channel->rx_rings) && !has_header) {
    print_header();
    has_header = 1;
  }
  const struct ring *ring = (const struct ring *)(channel + 1);
  for (uint32_t i = 0; i < channel->tx_rings; i++) print_ring("TX", ring++);
  for (uint32_t i = 0; i < channel->rx_rings; i++) print_ring("RX", ring++);
  printf("\n");
}

int main(int argc, char **argv) {
  const char *root = argc > 1 ? argv[1] : "";
  size_t size;
  const char *table = read_table(root, "nexus_channel_list", &size), *end = table + size;
  uint32_t instances = 0;
  for (const char *at = table; at < end; instances++) {
    const struct channel_group *group = (const void *)at;
    at += sizeof *group;
    for (uint32_t i = 0; i < group->count; i++) at += channel_size((const void *)at);
  }
  if (!instances) return puts("No channels"), 0;
  printf("Instances: %u\n", instances);
  uint32_t number = 0;
  for (const char *at = table; at < end;) {
    const struct channel_group *group = (const void *)at;
    printf("%u. %s\n", ++number, uuid_text(group->nexus));
    at += sizeof *group;
    for (uint32_t i = 0; i < group->count; i++) {
      const struct channel *channel = (const void *)at;
      print_channel(root, channel);
      at += channel_size(channel);
    }
  }
  printf("\n");
  return fflush(stdout) == 0 ? 0 : 1;
}
