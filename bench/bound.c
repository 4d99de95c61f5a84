// The least that a listing costs: reads files into memory whole and writes as many bytes as asked in pieces
// of 32 KiB, with nothing in between.

#include <fcntl.h>
#include <stdio.h>
#include <stdlib.h>
#include <sys/stat.h>
#include <unistd.h>

static char piece[32 * 1024];

int main(int argc, char **argv) {
  if (argc < 2) return fprintf(stderr, "usage: bound BYTES FILE...\n"), 64;
  for (int i = 2; i < argc; i++) {
    struct stat status;
    const int fd = open(argv[i], O_RDONLY);
    if (fd < 0 || fstat(fd, &status) < 0) return perror(argv[i]), 1;
    const size_t size = (size_t)status.st_size;
    char *buffer = malloc(size + 1);
    for (size_t done = 0; buffer && done < size;) {
      const ssize_t got = read(fd, buffer + done, size - done);
      if (got <= 0) return perror(argv[i]), 1;
      done += (size_t)got;
    }
    close(fd);
  }
  for (size_t left = strtoull(argv[1], NULL, 10); left;) {
    const ssize_t written = write(STDOUT_FILENO, piece, left < sizeof piece ? left : sizeof piece);
    if (written <= 0) return perror("write"), 1;
    left -= (size_t)written;
  }
  return 0;
}
