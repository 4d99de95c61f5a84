// The object tree: providers, their nexus instances, their channels, their flows.

#include <arpa/inet.h>

#include "obvious.h"

struct provider {
  uint8_t uuid[16], unread_1[48];
  char name[64];
  uint32_t name_length, type;
  uint8_t unread_2[8];
  int32_t flags, format, tx_rings, rx_rings, tx_slots, rx_slots, buf_size, meta_size, unread_3, pipes,
      subtype, mhints;
  int32_t ifindex;
  uint8_t unread_4[60];
  uint32_t count, unread_5;
  uint8_t instances[][16];
};

enum node_type { ROOT, PROVIDER, NEXUS, CHANNEL, FLOW };

struct node {
  uint8_t uuid[16];
  enum node_type type;
  const void *record;
  uint32_t child_count;
  struct node **children;
};

static const char *root_directory;

static struct node *append_child(struct node *parent, enum node_type type, const uint8_t *uuid,
                                 const void *record) {
  const uint32_t count = parent->child_count;
  if ((count & (count - 1)) == 0) {
    parent->children = realloc(parent->children, (count ? 2 * count : 1) * sizeof *parent->children);
  }
  struct node *child = calloc(1, sizeof *child);
  if (!child || !parent->children) exit(1);
  child->type = type;
  if (uuid) memcpy(child->uuid, uuid, 16);
  child->record = record;
  parent->children[parent->child_count++] = child;
  return child;
}

// The nexus nodes, in the order of their UUIDs once all are there.
static struct node **nexuses;
static size_t nexus_count;

static int by_uuid(const void *a, const void *b) {
  return memcmp((*(struct node *const *)a)->uuid, (*(struct node *const *)b)->uuid, 16);
}

static struct node *find_nexus(const uint8_t *uuid) {
  struct node key, *wanted = &key;
  memcpy(key.uuid, uuid, 16);
  struct node **found = bsearch(&wanted, nexuses, nexus_count, sizeof *nexuses, by_uuid);
  return found ? *found : NULL;
}

static int by_port(const void *a, const void *b) {
  const struct channel *x = (*(struct node *const *)a)->record, *y = (*(struct node *const *)b)->record;
  return (x->port > y->port) - (x->port < y->port);
}

static struct node *find_channel(const struct node *nexus, uint32_t port) {
  const struct channel channel = {.port = port};
  struct node key = {.record = &channel}, *wanted = &key;
  struct node **found = bsearch(&wanted, nexus->children, nexus->child_count, sizeof wanted, by_port);
  return found ? *found : NULL;
}

static void add_providers(struct node *top) {
  size_t size;
  const char *at = read_table(root_directory, "nexus_provider_list", &size), *end = at + size;
  while (at < end) {
    const struct provider *record = (const void *)at;
    struct node *provider = append_child(top, PROVIDER, record->uuid, record);
    nexuses = realloc(nexuses, (nexus_count + record->count + 1) * sizeof *nexuses);
    if (!nexuses) exit(1);
    for (uint32_t i = 0; i < record->count; i++) {
      nexuses[nexus_count++] = append_child(provider, NEXUS, record->instances[i], NULL);
    }
    at += sizeof *record + record->count * sizeof *record->instances;
  }
  qsort(nexuses, nexus_count, sizeof *nexuses, by_uuid);
}

static void add_channels(void) {
  size_t size;
  const char *at = read_table(root_directory, "nexus_channel_list", &size), *end = at + size;
  while (at < end) {
    const struct channel_group *group = (const void *)at;
    struct node *nexus = find_nexus(group->nexus);
    at += sizeof *group;
    for (uint32_t i = 0; i < group->count; i++) {
      const struct channel *record = (const void *)at;
      if (nexus) append_child(nexus, CHANNEL, record->uuid, record);
      at += channel_size(record);
    }
    if (nexus && nexus->child_count)
      qsort(nexus->children, nexus->child_count, sizeof *nexus->children, by_port);
  }
}

static void add_flows(void) {
  size_t size;
  const struct flow *flows = read_table(root_directory, "stats/flow", &size);
  for (size_t i = 0; i < size / sizeof *flows; i++) {
    const struct node *nexus = find_nexus(flows[i].nexus);
    if (!nexus) fprintf(stderr, "orphan flow orphan nx_uuid");
    struct node *channel = nexus && nexus->child_count ? find_channel(nexus, flows[i].port) : NULL;
    if (channel) append_child(channel, FLOW, NULL, &flows[i]);
  }
}

static const char *provider_type(const struct provider *p) {
  static const char *const names[] = {"user-pipe", "kernel-pipe", "net-if"};
  if (p->type < 3) return names[p->type];
  if (p->type > 3) return "unknown";
  return p->subtype == 0   ? "flow-switch (bridge)"
         : p->subtype == 1 ? "flow-switch (multistack)"
                           : "flow-switch (unknown type))";
}

static void print_provider(const struct provider *p, const char *indent) {
  const int length = p->name_length < sizeof p->name ? (int)p->name_length : (int)sizeof p->name;
  printf("%s\"name\":\"%.*s\",\n", indent, length, p->name);
  printf("%s\"provider_type\":\"%s\",\n", indent, provider_type(p));
  printf("%s\"flags\":%d,\n", indent, p->flags);
  printf("%s\"anonymous\":%s,\n", indent, p->flags & 1 ? "true" : "false");
  printf("%s\"format\":%d,\n", indent, p->format);
  printf("%s\"tx_rings\":%d,\n", indent, p->tx_rings);
  printf("%s\"rx_rings\":%d,\n", indent, p->rx_rings);
  printf("%s\"tx_slots\":%d,\n", indent, p->tx_slots);
  printf("%s\"rx_slots\":%d,\n", indent, p->rx_slots);
  printf("%s\"buf_size\":%d,\n", indent, p->buf_size);
  printf("%s\"meta_size\":%d,\n", indent, p->meta_size);
  printf("%s\"pipes\":%d,\n", indent, p->pipes);
  printf("%s\"mhints\":%d,\n", indent, p->mhints);
  printf("%s\"ifindex\":%d,\n", indent, p->ifindex);
}

static void print_channel(const struct channel *c, const char *indent) {
  printf("%s\"flags\":%d,\n", indent, (int)c->flags);
  printf("%s\"pid\":%d,\n", indent, c->pid);
  printf("%s\"proc_name\":\"%s\",\n", indent, process_name(root_directory, c->pid, 0));
  printf("%s\"fd\":%d,\n", indent, c->fd);
  printf("%s\"port\":%d,\n", indent, (int)c->port);
  printf("%s\"n_tx_rings\":%d,\n", indent, (int)c->tx_rings);
  printf("%s\"n_rx_rings\":%d,\n", indent, (int)c->rx_rings);
}

static void print_endpoint(const char *which, const struct endpoint_address *address, const char *indent) {
  char text[INET6_ADDRSTRLEN];
  if (address->family == 30) {
    inet_ntop(AF_INET6, address->ipv6, text, sizeof text);
  } else {
    inet_ntop(AF_INET, address->ipv4, text, sizeof text);
  }
  printf("%s\"%s_addr\":\"%s\",\n", indent, which, text);
  printf("%s\"%s_port\":%d,\n", indent, which, ntohs(address->port));
}

static void print_flow(const struct flow *f, const char *indent) {
  if (f->local.family == 30 || f->local.family == 2) {
    struct endpoint_address remote = f->remote;
    remote.family = f->local.family;
    print_endpoint("local", &f->local, indent);
    print_endpoint("remote", &remote, indent);
  }
  printf("%s\"protocol\":\"%s\",\n", indent, protocol_name(f->protocol));
  printf("%s\"in_bytes\":%llu,\n", indent, (unsigned long long)f->remote_stats.bytes);
  printf("%s\"out_bytes\":%llu,\n", indent, (unsigned long long)f->local_stats.bytes);
  printf("%s\"in_packets\":%llu,\n", indent, (unsigned long long)f->remote_stats.packets);
  printf("%s\"out_packets\":%llu,\n", indent, (unsigned long long)f->local_stats.packets);
  printf("%s\"interface\":\"%s\",\n", indent, f->interface);
  printf("%s\"flags\":\"%s\",\n", indent, flags_text(f->flags));
  printf("%s\"local_state\":\"%s\",\n", indent, state_name(f->local_stats.state));
  printf("%s\"remote_state\":\"%s\",\n", indent, state_name(f->remote_stats.state));
  printf("%s\"process\":\"%s\",\n", indent, f->process);
  printf("%s\"pid\":%d,\n", indent, f->pid);
}

static void print_node(const struct node *node, int level) {
  static const char *const types[] = {"root", "nexus_provider", "nexus", "channel", "flow"};
  char indent[32];
  snprintf(indent, sizeof indent, "%*s", 3 * level, "");
  printf("%s{\n", indent);
  printf("%s\"uuid\":\"%s\",\n", indent, uuid_text(node->uuid));
  printf("%s\"type\":\"%s\",\n", indent, types[node->type]);
  if (node->type == PROVIDER) print_provider(node->record, indent);
  if (node->type == CHANNEL) print_channel(node->record, indent);
  if (node->type == FLOW) print_flow(node->record, indent);
  if (node->child_count) {
    printf("%s\"children\": [\n", indent);
    for (uint32_t i = 0; i < node->child_count; i++) {
      print_node(node->children[i], level + 1);
      printf("%c\n", i + 1 < node->child_count ? ',' : ' ');
    }
    printf("%s]\n", indent);
  } else {
    printf("%s\"children\": []\n", indent);
  }
  printf("%s}", indent);
}

int main(int argc, char **argv) {
  root_directory = argc > 1 ? argv[1] : "";
  struct node top = {.type = ROOT};
  add_providers(&top);
  add_channels();
  add_flows();
  print_node(&top, 0);
  printf("\n");
  return fflush(stdout) == 0 ? 0 : 1;
}
