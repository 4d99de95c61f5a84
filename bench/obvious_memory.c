// The memory arenas with their processes and regions, and a summary in which each region counts once.

#include "obvious.h"

struct region {
  char name[64];
  uint8_t uuid[16];
  int32_t type;
  uint32_t mode;
  uint64_t seg_size_req, seg_size, seg_count, obj_size_req, obj_count_req, obj_size, obj_count, objs_per_seg;
  uint64_t mem_total, mem_wired, unread, seg_in_use, rescales, allocs, frees;
};

struct arena {
  char name[64];
  int32_t type;
  uint8_t unread[12];
  struct region regions[12];
  int32_t pids[8];
};

static const char *const arena_types[] = {"NEXUS", "PLCY", "SYSTEM"};
static const char *const region_types[] = {"SCHEMA",  "RING",     "BUF",     "MDU", "USD", "USTATS",
                                           "FLOWADV", "NEXUSADV", "SYSCTLS", "MDK", "KSD", "KSTATS"};

typedef unsigned long long ull;

// The regions seen, one for each UUID, in a hash table of twice as many slots as there are region slots. An
// array that is searched from its start would come first to mind, but on a large table its search would be
// all that the benchmark measures: the ratio would tell how large the table is, not what printing costs.
static const struct region **seen;
static size_t seen_slots;

static void make_set(size_t regions) {
  seen_slots = 2 * regions;
  seen = calloc(seen_slots, sizeof *seen);
  if (!seen) exit(1);
}

static void add_region(const struct region *region) {
  uint64_t hash;
  memcpy(&hash, region->uuid, sizeof hash);
  size_t slot = hash % seen_slots;
  while (seen[slot] && memcmp(seen[slot]->uuid, region->uuid, 16) != 0) slot = (slot + 1) % seen_slots;
  if (!seen[slot]) seen[slot] = region;
}

static void separator(char character) {
  for (int i = 0; i < 70; i++) putchar(character);
  putchar('\n');
}

static void print_region(const struct region *r) {
  static const char *const modes[] = {"NOREDIRECT", "MMAPOK",     "READONLY",
                                      "PERSISTENT", "MONOLITHIC", "NOCACHE"};
  char title[64];
  snprintf(title, sizeof title, "%s region:", (uint32_t)r->type < 12 ? region_types[r->type] : "UNKNOWN");
  printf("%15s  %s\n", title, r->name);
  printf("        allocs:  %llu\n", (ull)r->allocs);
  printf("         frees:  %llu\n", (ull)r->frees);
  printf("      rescales:  %llu\n", (ull)r->rescales);
  printf("          mode:  0x%x", r->mode);
  print_bit_names(r->mode, modes, 6, "MIRRORED");
  printf("\n");
  printf("          objs:  %llu per segment\n", (ull)r->objs_per_seg);
  const double objects =
      r->obj_count_req && r->obj_size_req
          ? ((double)(r->obj_size * r->obj_count) / (double)(r->obj_size_req * r->obj_count_req) - 1)
          : 0;
  printf(" objs cnt*size:  %llu*%llu -> %llu*%llu (%.2f%% inflation)\n", (ull)r->obj_count_req,
         (ull)r->obj_size_req, (ull)r->obj_count, (ull)r->obj_size, objects * 100);
  const double segments = r->seg_size_req ? (double)r->seg_size / (double)r->seg_size_req - 1 : 0;
  printf("       segsize:  %llu -> %llu (%.2f%% inflation)\n", (ull)r->seg_size_req, (ull)r->seg_size,
         segments * 100);
  printf("      segments:  %llu/%llu (%.2f%% in use)\n", (ull)r->seg_in_use, (ull)r->seg_count,
         (double)(r->seg_in_use * 100) / (double)r->seg_count);
  if (r->mem_wired) {
    printf("  wired memory:  %llu KB\n", (ull)r->mem_wired >> 10);
  } else {
    printf("        memory:  %llu KB\n", (ull)r->mem_total >> 10);
  }
}

static void print_arena(const char *root, const struct arena *a) {
  char title[64];
  separator('=');
  snprintf(title, sizeof title, "%s arena:", (uint32_t)a->type < 3 ? arena_types[a->type] : "UNKNOWN");
  printf("%15s  %s\n", title, a->name);
  for (int i = 0; i < 8 && a->pids[i]; i++) printf("%15s  %s\n", "", process_name(root, a->pids[i], 1));
  separator('=');
  uint64_t total = 0, wired = 0;
  int printed = 0;
  for (int i = 0; i < 12; i++) {
    const struct region *r = &a->regions[i];
    add_region(r);
    if (!r->seg_count) continue;
    if (printed++) printf("              |\n");
    print_region(r);
    total += r->mem_total;
    wired += r->mem_wired;
  }
  separator('-');
  printf("         TOTAL:  %llu KB", (ull)total >> 10);
  if (wired) printf(" (wired %llu KB)", (ull)wired >> 10);
  printf("\n");
  separator('-');
  printf("\n");
}

static void print_summary(void) {
  uint64_t total[12] = {0}, wired[12] = {0}, all_total = 0, all_wired = 0;
  for (size_t i = 0; i < seen_slots; i++) {
    if (!seen[i] || (uint32_t)seen[i]->type >= 12) continue;
    total[seen[i]->type] += seen[i]->mem_total;
    wired[seen[i]->type] += seen[i]->mem_wired;
  }
  separator('+');
  printf(" Tarvel Region Memory Usage Summary (deduplicated)\n");
  separator('+');
  printf("                         Total         Wired\n");
  for (int i = 0; i < 12; i++) {
    printf("%14s:   %9llu KB  %9llu KB\n", region_types[i], (ull)total[i] >> 10, (ull)wired[i] >> 10);
    all_total += total[i];
    all_wired += wired[i];
  }
  separator('-');
  printf("         TOTAL:       %5.2f MB      %5.2f MB\n", (double)all_total / 1024 / 1024,
         (double)all_wired / 1024 / 1024);
  separator('-');
}

int main(int argc, char **argv) {
  const char *root = argc > 1 ? argv[1] : "";
  size_t size;
  const struct arena *arenas = read_table(root, "stats/arena", &size);
  const size_t count = size / sizeof *arenas;
  make_set(12 * count);
  for (size_t i = 0; i < count; i++) print_arena(root, &arenas[i]);
  if (size) print_summary();
  return fflush(stdout) == 0 ? 0 : 1;
}
