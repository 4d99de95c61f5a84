// The flow listing.

#include <arpa/inet.h>
#include <netdb.h>

#include "obvious.h"

static int by_pid(const void *a, const void *b) {
  const struct flow *x = a, *y = b;
  return (x->pid > y->pid) - (x->pid < y->pid);
}

static const char *service_class_name(int32_t value) {
  switch (value) {
    case 0x000000:
      return "BE";
    case 0x080090:
      return "BKS";
    case 0x100080:
      return "BK";
    case 0x180010:
      return "RD";
    case 0x200020:
      return "OAM";
    case 0x280120:
      return "AV";
    case 0x300110:
      return "RV";
    case 0x380100:
      return "VI";
    case 0x400180:
      return "VO";
    case 0x480190:
      return "CTL";
    default:
      return "UNK";
  }
}

static void ipv4_endpoint(char *text, size_t size, const struct endpoint_address *address) {
  char host[256] = "*";
  const uint8_t *b = address->ipv4;
  if (b[0] | b[1] | b[2] | b[3]) snprintf(host, sizeof host, "%u.%u.%u.%u", b[0], b[1], b[2], b[3]);
  if (address->port) {
    snprintf(text, size, "%.37s.%d ", host, ntohs(address->port));
  } else {
    snprintf(text, size, "%.37s.%.15s ", host, "*");
  }
}

static void ipv6_endpoint(char *text, size_t size, const struct endpoint_address *address) {
  static const uint8_t any[16];
  char host[NI_MAXHOST] = "*";
  if (memcmp(address->ipv6, any, sizeof any) != 0) {
    struct sockaddr_in6 in = {.sin6_family = AF_INET6};
    uint8_t *b = in.sin6_addr.s6_addr;
    memcpy(b, address->ipv6, 16);
    if ((b[0] == 0xfe && (b[1] & 0xc0) == 0x80) || (b[0] == 0xff && ((b[1] & 15) == 1 || (b[1] & 15) == 2))) {
      in.sin6_scope_id = (uint32_t)(b[2] << 8 | b[3]);
      b[2] = b[3] = 0;
    }
    if (getnameinfo((struct sockaddr *)&in, sizeof in, host, sizeof host, NULL, 0, NI_NUMERICHOST))
      strcpy(host, "?");
    host[49] = '\0';
  }
  if (address->port) {
    snprintf(text, size, "%.37s.%d", host, ntohs(address->port));
  } else {
    snprintf(text, size, "%.37s.%.15s", host, "*");
  }
}

static void print_index(uint32_t value, int width) {
  if (value == UINT32_MAX) {
    printf(" %-*s", width, "-");
  } else {
    printf(" %-*u", width, value);
  }
}

static void print_flow(const struct flow *f) {
  char text[80];
  printf("%4s", protocol_name(f->protocol));
  if (f->local.family == 30) {
    printf("%c ", '6');
    ipv6_endpoint(text, sizeof text, &f->local);
    printf("%-*.*s ", 43, 43, text);
    ipv6_endpoint(text, sizeof text, &f->remote);
    printf("%-*.*s ", 43, 43, text);
  } else if (f->local.family == 2) {
    printf("%c ", '4');
    ipv4_endpoint(text, sizeof text, &f->local);
    printf("%-*s ", 43, text);
    ipv4_endpoint(text, sizeof text, &f->remote);
    printf("%-*s ", 43, text);
  }
  printf(" %-12llu %-12llu %-10llu %-10llu", (unsigned long long)f->remote_stats.bytes,
         (unsigned long long)f->local_stats.bytes, (unsigned long long)f->remote_stats.packets,
         (unsigned long long)f->local_stats.packets);
  printf(" %-3s", service_class_name(f->service_class));
  printf(" %-8s", f->interface);
  print_index(f->port, 4);
  print_index(f->advisory, 3);
  printf(" %s", flags_text(f->flags));
  printf(" %-12s %-12s", state_name(f->local_stats.state), state_name(f->remote_stats.state));
  if (f->local_stats.rtt) {
    printf("%7.2f ms", (float)f->local_stats.rtt / 1000);
  } else {
    printf("          ");
  }
  if (f->remote_stats.rtt) {
    printf("  %7.2f ms", (float)f->remote_stats.rtt / 1000);
  } else {
    printf("            ");
  }
  print_index(f->bucket, 3);
  printf(" %s.%d\n", f->process, f->pid);
}

int main(int argc, char **argv) {
  size_t size;
  struct flow *flows = read_table(argc > 1 ? argv[1] : "", "stats/flow", &size);
  const size_t count = size / sizeof *flows;
  if (!count) return 0;
  printf(
      "%-5s %-43s %-43s %-12s %-12s %-10s %-10s %-3s %-8s %-4s %-3s %-14s %-12s %-12s %-10s %-10s %-3s %s\n",
      "Proto", "Local Address", "Remote Address", "InBytes", "OutBytes", "InPackets", "OutPackets", "SvC",
      "NetIf", "Port", "Adv", "Flags", "Local State", "Remote State", "Local RTT", "Remote RTT", "Bkt",
      "Process.PID");
  qsort(flows, count, sizeof *flows, by_pid);
  for (size_t i = 0; i < count; i++) print_flow(&flows[i]);
  return fflush(stdout) == 0 ? 0 : 1;
}
