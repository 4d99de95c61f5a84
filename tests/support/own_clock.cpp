// Takes the place of the system's clock in a program that loads it first: a sleep is told on standard error
// and lasts until SIGALRM, so that what the program does between two sleeps is a matter of order and not of
// time.

#include <signal.h>
#include <stdio.h>
#include <unistd.h>

extern "C" unsigned sleep(unsigned seconds) {
  sigset_t wakes;
  sigemptyset(&wakes);
  sigaddset(&wakes, SIGALRM);
  sigprocmask(SIG_BLOCK, &wakes, nullptr);
  dprintf(STDERR_FILENO, "sleep %u\n", seconds);
  int number = 0;
  sigwait(&wakes, &number);
  return 0;
}
