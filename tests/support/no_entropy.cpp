// Takes the system's random numbers away from a program that loads it first.

#include <unistd.h>

#include <cstddef>

extern "C" int getentropy(void * /*buffer*/, std::size_t /*length*/) {
  return -1;
}
