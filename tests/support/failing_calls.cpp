// The tool, with calls that fail on demand. CALLS names a file of 128 counts, into which calls are counted by
// their letters. FAULTS says which of them go wrong: "w3+2=28,s1+1=-16," lets the 3rd and the 4th write of
// the report fail with error 28, and the first call of the kernel deliver 16 bytes less. A capital letter
// lets a signal arrive in front of the call: "W3+1=2,".
//
// s      sysctlbyname                          -N: N bytes less
// w d    write or send of the report, others   -N: at most N bytes are taken
// c      close of the report
// m r n  malloc, realloc, operator new
// z      sleep, which returns at once

#include <fcntl.h>
#include <signal.h>
#include <sys/mman.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <cctype>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <new>

#include "platform/sysctl.h"

constexpr long unharmed = -1L << 40;  // more than any call is asked for
static struct {
  char letter;
  unsigned long first, count;
  long value;
} plan[8];

// None behind the last of the tool's own calls, where what it has covered is saved.
unsigned *call_counts = nullptr;

__attribute__((constructor(101))) static void read_plan() {
  const char *at = std::getenv("FAULTS");
  if (!at) return;
  for (auto *fault = plan; *at; ++fault, at = std::strchr(at, ',') + 1)
    std::sscanf(at, "%c%lu+%lu=%ld", &fault->letter, &fault->first, &fault->count, &fault->value);
  const int file = open(std::getenv("CALLS"), O_RDWR | O_CLOEXEC);
  call_counts = static_cast<unsigned *>(mmap(nullptr, 4096, PROT_READ | PROT_WRITE, MAP_SHARED, file, 0));
  close(file);
}

// Counts a call. Returns what shall become of it.
static long take_turn(char letter) {
  if (!call_counts) return unharmed;
  const unsigned long turn = ++call_counts[static_cast<unsigned char>(letter)];
  long value = unharmed;
  for (const auto &fault : plan) {
    if (turn - fault.first >= fault.count) continue;
    if (fault.letter == std::toupper(letter)) kill(getpid(), static_cast<int>(fault.value));
    if (fault.letter == letter) value = fault.value;
  }
  return value;
}

// Whether the value is an error number, which errno then has.
static bool is_error(long value) {
  if (value > 0) errno = static_cast<int>(value);
  return value > 0;
}

// What a write may take of so many bytes, or -1 where it fails.
static ssize_t share(int fd, std::size_t size) {
  const long value = take_turn(fd == STDOUT_FILENO ? 'w' : 'd');
  return is_error(value) ? -1 : std::min(static_cast<long>(size), -value);
}

extern "C" {

decltype(sysctlbyname) __real_sysctlbyname;
decltype(malloc) __real_malloc;
decltype(realloc) __real_realloc;
decltype(write) __real_write;
decltype(send) __real_send;
decltype(close) __real_close;

int __wrap_sysctlbyname(const char *name, void *old, std::size_t *length, const void *value,
                        std::size_t size) {
  const long turn = take_turn('s');
  const int result = is_error(turn) ? -1 : __real_sysctlbyname(name, old, length, value, size);
  if (result == 0 && turn != unharmed) *length -= std::min(*length, static_cast<std::size_t>(-turn));
  return result;
}

void *__wrap_malloc(std::size_t size) {
  return is_error(take_turn('m')) ? nullptr : __real_malloc(size);
}

void *__wrap_realloc(void *block, std::size_t size) {
  return is_error(take_turn('r')) ? nullptr : __real_realloc(block, size);
}

ssize_t __wrap_write(int fd, const void *data, std::size_t size) {
  const ssize_t taken = share(fd, size);
  return taken < 0 ? -1 : __real_write(fd, data, static_cast<std::size_t>(taken));
}

ssize_t __wrap_send(int fd, const void *data, std::size_t size, int flags) {
  const ssize_t taken = share(fd, size);
  return taken < 0 ? -1 : __real_send(fd, data, static_cast<std::size_t>(taken), flags);
}

int __wrap_close(int fd) {
  return __real_close(fd) < 0 || (fd == STDOUT_FILENO && is_error(take_turn('c'))) ? -1 : 0;
}

unsigned __wrap_sleep(unsigned /*seconds*/) {
  return take_turn('z') == 0;
}

}  // extern "C"

// As the standard library's own, but that a failure is final.
void *operator new(std::size_t size) {
  if (is_error(take_turn('n'))) std::get_new_handler()();
  return __real_malloc(size);
}
