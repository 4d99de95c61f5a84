#include "obvious.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>
#include <uuid/uuid.h>

static int open_below_proc(const char *root, const char *folder, const char *name) {
  char path[4096];
  snprintf(path, sizeof path, "%s/proc/%s%s", root, folder, name);
  return open(path, O_RDONLY | O_CLOEXEC);
}

void *read_table(const char *root, const char *name, size_t *size) {
  struct stat status;
  const int fd = open_below_proc(root ? root : "", "sys/kern/tarvel/", name);
  if (fd < 0 || fstat(fd, &status) < 0) return perror(name), exit(1), NULL;
  *size = (size_t)status.st_size;
  char *table = malloc(*size + 1);
  if (!table) return perror(name), exit(1), NULL;
  for (size_t done = 0; done < *size;) {
    const ssize_t got = read(fd, table + done, *size - done);
    if (got <= 0) return perror(name), exit(1), NULL;
    done += (size_t)got;
  }
  close(fd);
  return table;
}

long read_small(const char *root, const char *name, char *text, size_t size) {
  const int fd = open_below_proc(root, "", name);
  if (fd < 0) return -1;
  const ssize_t length = read(fd, text, size);
  close(fd);
  return length;
}

const char *process_name(const char *root, int pid, int with_pid) {
  static char name[64];
  char file[32], comm[16];
  snprintf(file, sizeof file, "%d/comm", pid);
  long length = pid > 0 ? read_small(root, file, comm, sizeof comm) : -1;
  if (length <= 0) {
    snprintf(name, sizeof name, "<unknown>.%d", pid);
    return name;
  }
  if (comm[length - 1] == '\n' || length == sizeof comm) length--;
  if (with_pid) {
    snprintf(name, sizeof name, "%.*s.%d", (int)length, comm, pid);
  } else {
    snprintf(name, sizeof name, "%.*s", (int)length, comm);
  }
  return name;
}

const char *uuid_text(const uint8_t *uuid) {
  static char text[UUID_STR_LEN];
  uuid_unparse_upper(uuid, text);
  return text;
}

void print_bit_names(uint32_t value, const char *const *names, int count, const char *highest) {
  const char *separator = "";
  putchar('<');
  for (int bit = 0; bit < count; bit++) {
    if (!(value & 1u << bit)) continue;
    printf("%s%s", separator, names[bit]);
    separator = ",";
  }
  if (value & 0x80000000) printf("%s%s", separator, highest);
  putchar('>');
}

const char *protocol_name(uint8_t protocol) {
  switch (protocol) {
    case 6:
      return "tcp";
    case 17:
      return "udp";
    default:
      return "unk.";
  }
}

const char *state_name(uint32_t state) {
  static const char *names[] = {
      "CLOSED",   "LISTEN",     "SYN_SENT",  "SYN_RCVD", "ESTABLISHED", "CLOSE_WAIT", "FIN_WAIT_1", "CLOSING",
      "LAST_ACK", "FIN_WAIT_2", "TIME_WAIT", "UNKNOWN",  "UNKNOWN",     "UNKNOWN",    "UNKNOWN",    "UNKNOWN",
      "UNKNOWN",  "UNKNOWN",    "UNKNOWN",   "UNKNOWN",  "NO_TRAFFIC",  "SINGLE",     "MULTIPLE"};
  return state < sizeof names / sizeof *names ? names[state] : "UNKNOWN";
}

const char *flags_text(uint32_t flags) {
  static char text[32];
  snprintf(text, sizeof text, "%c%c%c%c%c%c%c%c%c%c%c%c%c ", flags & 0x10 ? 't' : '-',
           flags & 0x20 ? 'c' : '-', flags & 0x40 ? 'l' : '-', flags & 0x100 ? 'q' : '-',
           flags & 0x200 ? 'b' : '-', flags & 0x1000 ? 'w' : '-', flags & 0x2000 ? 'e' : '-',
           flags & 0x1000000 ? 'a' : '-', flags & 0x2000000 ? 'n' : '-', flags & 0x4000000 ? 'd' : '-',
           flags & 0x8000000 ? 'o' : '-', flags & 0x40000000 ? 'x' : '-', flags & 0x80000000 ? 'r' : '-');
  return text;
}
