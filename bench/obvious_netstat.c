// The counters of every protocol stack, those that are 0 left out.

#include "obvious.h"

struct stack {
  uint8_t nexus[16];
  char interface[16];
  int32_t pid;
  uint8_t unread_1[12];
  uint64_t ip[43], unread_2, ip6[36], tcp[203], unread_3, udp[22];
};

static void print_section(const char *title, const struct counter_name *names, const uint64_t *counters,
                          size_t count) {
  printf("\t%s:\n", title);
  for (size_t i = 0; i < count; i++) {
    if (counters[i]) printf("\t\t%-16s: %llu\n", names[i].text, (unsigned long long)counters[i]);
  }
}

int main(int argc, char **argv) {
  const char *root = argc > 1 ? argv[1] : "";
  size_t size;
  const struct stack *stacks = read_table(root, "stats/userstack", &size);
  for (size_t i = 0; i < size / sizeof *stacks; i++) {
    const struct stack *s = &stacks[i];
    printf(" - %s\n", s->pid ? process_name(root, s->pid, 1) : "<Closed Port Stats>");
    printf("\tNexus UUID: %s\n", uuid_text(s->nexus));
    printf("\tNetif     : %s\n", s->interface);
    print_section("ip", ip_counter_names, s->ip, 43);
    print_section("ip6", ip6_counter_names, s->ip6, 36);
    print_section("tcp", tcp_counter_names, s->tcp, 203);
    print_section("udp", udp_counter_names, s->udp, 22);
  }
  return fflush(stdout) == 0 ? 0 : 1;
}
