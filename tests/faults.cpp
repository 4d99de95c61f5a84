// The tool, with calls that fail on demand. Its torture drivers steer it by two environment variables. CALLS
// names a file of 64 KB, into which each call that may fail puts its letter while there is room. FAULTS says
// which calls of a letter go wrong, and how: "w3+2=28,s1+1=-16" lets the 3rd and the 4th write of the report
// fail with error 28, and the first call of the kernel deliver 16 bytes less.
//
// letter  call                                 value
// s       sysctlbyname                         N: fails with error N    -N: N bytes less
// w d     write or send: the report, others    N: fails with error N    -N: at most N bytes are taken
// c       close of the report                  N: fails with error N
// m r n   malloc, realloc, operator new        1: fails
// z       sleep, which returns at once
//
// A value of 1000 + N for any of them lets signal N arrive in front of the call.

#include <fcntl.h>
#include <signal.h>
#include <sys/mman.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <climits>
#include <cstdlib>
#include <new>

namespace {

struct fault {
  char letter;
  unsigned long first, count;
  long value;
};

constexpr long unharmed = LONG_MIN;
constexpr long signals = 1000;

fault plan[8];
unsigned long turns[128];
char *calls = nullptr;  // where the next letter goes
std::size_t room = 64 * 1024;

}  // namespace

// For what comes behind the last of the tool's own calls, such as saving what it has covered.
extern "C" void disarm_faults() {
  calls = nullptr;
}

namespace {

__attribute__((constructor(101))) void read_plan() {
  const char *at = std::getenv("FAULTS");
  for (fault *next = plan; at && *at; ++next) {
    char *end;
    next->letter = *at;
    next->first = std::strtoul(at + 1, &end, 10);
    next->count = std::strtoul(end + 1, &end, 10);
    next->value = std::strtol(end + 1, &end, 10);
    at = *end ? end + 1 : end;
  }
  const char *path = std::getenv("CALLS");
  if (!path) return;
  const int file = open(path, O_RDWR | O_CLOEXEC);
  calls = static_cast<char *>(mmap(nullptr, room, PROT_READ | PROT_WRITE, MAP_SHARED, file, 0));
  close(file);
}

// Counts a call. Returns what shall become of it.
long take_turn(char letter) {
  if (!calls) return unharmed;
  if (room > 0) {
    *calls++ = letter;
    --room;
  }
  const unsigned long turn = ++turns[static_cast<unsigned char>(letter)];
  long value = unharmed;
  for (const fault &each : plan) {
    if (each.letter != letter || turn < each.first || turn - each.first >= each.count) continue;
    if (each.value >= signals) {
      kill(getpid(), static_cast<int>(each.value - signals));
    } else {
      value = each.value;
    }
  }
  return value;
}

// Whether the value is an error number, which errno then has.
bool is_error(long value) {
  if (value <= 0) return false;
  errno = static_cast<int>(value);
  return true;
}

bool memory_fails(char letter) {
  return take_turn(letter) != unharmed && is_error(ENOMEM);
}

// A write of at most `size` bytes by `call`.
template <class Call>
ssize_t write_some(int fd, std::size_t size, Call call) {
  const long value = take_turn(fd == STDOUT_FILENO ? 'w' : 'd');
  if (is_error(value)) return -1;
  return call(value == unharmed ? size : std::min(size, static_cast<std::size_t>(-value)));
}

}  // namespace

extern "C" {

int __real_sysctlbyname(const char *, void *, std::size_t *, const void *, std::size_t);
void *__real_malloc(std::size_t);
void *__real_realloc(void *, std::size_t);
ssize_t __real_write(int, const void *, std::size_t);
ssize_t __real_send(int, const void *, std::size_t, int);
int __real_close(int);

int __wrap_sysctlbyname(const char *name, void *old_value, std::size_t *old_length, const void *new_value,
                        std::size_t new_length) {
  const long value = take_turn('s');
  if (is_error(value)) return -1;
  const int result = __real_sysctlbyname(name, old_value, old_length, new_value, new_length);
  if (result == 0 && value != unharmed)
    *old_length -= std::min(*old_length, static_cast<std::size_t>(-value));
  return result;
}

void *__wrap_malloc(std::size_t size) {
  return memory_fails('m') ? nullptr : __real_malloc(size);
}

void *__wrap_realloc(void *block, std::size_t size) {
  return memory_fails('r') ? nullptr : __real_realloc(block, size);
}

// For the sanitizer: operator new is the one below, operator delete its own.
const char *__asan_default_options();
const char *__asan_default_options() {
  return "alloc_dealloc_mismatch=0";
}

ssize_t __wrap_write(int fd, const void *data, std::size_t size) {
  return write_some(fd, size, [&](std::size_t some) { return __real_write(fd, data, some); });
}

ssize_t __wrap_send(int fd, const void *data, std::size_t size, int flags) {
  return write_some(fd, size, [&](std::size_t some) { return __real_send(fd, data, some, flags); });
}

int __wrap_close(int fd) {
  const long value = fd == STDOUT_FILENO ? take_turn('c') : unharmed;
  const int result = __real_close(fd);
  return is_error(value) ? -1 : result;
}

unsigned __wrap_sleep(unsigned /*seconds*/) {
  take_turn('z');
  return 0;
}

}  // extern "C"

// As the standard library's own, but that a failure is final.
void *operator new(std::size_t size) {
  if (memory_fails('n')) std::get_new_handler()();
  return __real_malloc(size);
}

void *operator new[](std::size_t size) {
  return operator new(size);
}

void *operator new(std::size_t size, const std::nothrow_t & /*unused*/) noexcept {
  return operator new(size);
}
