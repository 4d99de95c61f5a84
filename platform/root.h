// Which kernel is in sight: that of this machine, or one that a directory stands for.

#ifndef TARVELCTL_PLATFORM_ROOT_H
#define TARVELCTL_PLATFORM_ROOT_H

#include <string>

namespace platform {

// The directory in which the kernel in sight is said to lie, by the environment variable TARVEL_ROOT; empty
// where it is the live one, and where the process runs with more rights than its caller, who then has no say.
std::string given_root();

// Shows the kernel of another directory from here on: to sysctl_fetch, to query_process_name and to programs
// that are started. Returns whether it is in sight; it is not where the caller has no say.
bool show_root(const std::string &root);

}  // namespace platform

#endif
