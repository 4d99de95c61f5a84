// What reading a table costs: medians of the size query and of the read, in microseconds, for each variable
// named. The buffer of a read is new, as that of a listing is, or one that was written before.

#include <stdio.h>
#include <stdlib.h>
#include <time.h>

enum { most_rounds = 1001 };

int sysctlbyname(const char *name, void *old_value, size_t *old_length, const void *new_value,
                 size_t new_length);

static double now(void) {
  struct timespec time;
  clock_gettime(CLOCK_MONOTONIC, &time);
  return (double)time.tv_sec * 1e6 + (double)time.tv_nsec / 1e3;
}

static int ascending(const void *a, const void *b) {
  const double x = *(const double *)a, y = *(const double *)b;
  return (x > y) - (x < y);
}

static double median(double *values, int count) {
  qsort(values, (size_t)count, sizeof *values, ascending);
  return values[count / 2];
}

// A read into `buffer`, or into a new one where that is null. Returns how long it took.
static double timed_read(const char *name, char *buffer, size_t size) {
  const double start = now();
  char *to = buffer ? buffer : malloc(size);
  size_t length = size;
  if (!to || sysctlbyname(name, to, &length, NULL, 0) != 0) return perror(name), exit(1), 0;
  const double end = now();
  if (!buffer) free(to);
  return end - start;
}

int main(int argc, char **argv) {
  static double query[most_rounds], fresh[most_rounds], again[most_rounds];
  const int rounds = argc > 2 ? atoi(argv[1]) : 0;
  if (rounds < 1 || rounds > most_rounds) return fprintf(stderr, "usage: fetch ROUNDS VARIABLE...\n"), 64;
  for (int i = 2; i < argc; i++) {
    size_t size = 0;
    for (int round = 0; round < rounds; round++) {
      const double start = now();
      if (sysctlbyname(argv[i], NULL, &size, NULL, 0) != 0) return perror(argv[i]), 1;
      query[round] = now() - start;
    }
    char *buffer = calloc(1, size + 1);
    if (!buffer) return perror(argv[i]), 1;
    for (int round = 0; round < rounds; round++) {
      fresh[round] = timed_read(argv[i], NULL, size);
      again[round] = timed_read(argv[i], buffer, size);
    }
    printf("%s %zu %.1f %.1f %.1f\n", argv[i], size, median(query, rounds), median(fresh, rounds),
           median(again, rounds));
    free(buffer);
  }
  return 0;
}
