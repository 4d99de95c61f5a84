// Runs a command and writes what it cost to a file: wall, user and system time in seconds, the most memory
// resident in KiB, minor and major page faults. What a process has resident counts from the one that starts
// it on, so that one is kept small.

#include <spawn.h>
#include <stdio.h>
#include <stdlib.h>
#include <sys/resource.h>
#include <sys/wait.h>
#include <time.h>

extern char **environ;

static double seconds(struct timeval time) {
  return (double)time.tv_sec + (double)time.tv_usec / 1e6;
}

int main(int argc, char **argv) {
  if (argc < 3) return fprintf(stderr, "usage: launch REPORT COMMAND...\n"), 64;
  struct timespec start, end;
  struct rusage usage;
  pid_t pid;
  int status;
  clock_gettime(CLOCK_MONOTONIC, &start);
  if (posix_spawnp(&pid, argv[2], NULL, NULL, argv + 2, environ) != 0) return perror(argv[2]), 127;
  wait4(pid, &status, 0, &usage);
  clock_gettime(CLOCK_MONOTONIC, &end);
  FILE *report = fopen(argv[1], "w");
  if (!report) return perror(argv[1]), 1;
  const double wall = (double)(end.tv_sec - start.tv_sec) + (double)(end.tv_nsec - start.tv_nsec) / 1e9;
  fprintf(report, "%.6f %.6f %.6f %ld %ld %ld\n", wall, seconds(usage.ru_utime), seconds(usage.ru_stime),
          usage.ru_maxrss, usage.ru_minflt, usage.ru_majflt);
  if (fclose(report) != 0) return perror(argv[1]), 1;
  return WIFEXITED(status) ? WEXITSTATUS(status) : 1;
}
