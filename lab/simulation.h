// A world in a directory, which may move.

#ifndef TARVELCTL_LAB_SIMULATION_H
#define TARVELCTL_LAB_SIMULATION_H

#include <signal.h>

#include "lab/command_line.h"
#include "lab/root_directory.h"

namespace lab {

class simulation {
 public:
  simulation(const options &asked, own_directory directory);

  // Publishes the world, in place of any other that the directory shows. Like all here, returns false after a
  // message on standard error.
  bool start();

  // Publishes what happens every interval, until one of the signals in `stop`, which must be blocked,
  // arrives.
  bool keep_moving(const sigset_t &stop);

 private:
  root_directory root_;
  world state_;
  std::uint32_t interval_;
  std::string host_;
};

}  // namespace lab

#endif
