// The root is in the environment, where kernel_file looks for it at each open.

#include "platform/root.h"

#include <cstdlib>

namespace platform {

std::string given_root() {
  const char *given = secure_getenv("TARVEL_ROOT");
  return given ? given : "";
}

bool show_root(const std::string &root) {
  setenv("TARVEL_ROOT", root.c_str(), 1);
  return given_root() == root;
}

}  // namespace platform
