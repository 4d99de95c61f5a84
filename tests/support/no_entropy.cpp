// Takes chance away from a program that loads it first: random numbers there are none, and time passes only
// where the program waits, LATE milliseconds more than it asked for, and TICK of them each time it looks at
// the clock. After WAITS of its waits it is told to end, and after LOOKS
// at the clock it is interrupted.

#include <signal.h>
#include <time.h>
#include <unistd.h>

#include <cstdlib>

static long number_of(const char *variable) {
  const char *text = getenv(variable);
  return text ? atol(text) : 0;
}

static long now;  // in milliseconds

extern "C" int getentropy(void * /*buffer*/, std::size_t /*length*/) {
  return -1;
}
extern "C" int clock_gettime(clockid_t /*clock*/, timespec *time) {
  static long looks = 0;
  if (++looks == number_of("LOOKS")) raise(SIGINT);
  now += number_of("TICK");
  *time = {.tv_sec = now / 1000, .tv_nsec = now % 1000 * 1'000'000};
  return 0;
}
extern "C" int sigtimedwait(const sigset_t * /*signals*/, siginfo_t * /*found*/, const timespec *time) {
  static long waits = 0;
  if (++waits == number_of("WAITS")) return SIGTERM;
  now += time->tv_sec * 1000 + time->tv_nsec / 1'000'000 + number_of("LATE");
  return -1;
}
