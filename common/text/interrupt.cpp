#include "common/text/interrupt.h"

#include <signal.h>
#include <unistd.h>

#include <cstdlib>
#include <cstring>
#include <string_view>

#include "common/text/output.h"

namespace {

void interrupted(int /*signal*/) {
  const int error = report.abandon();
  if (!error) _exit(EXIT_SUCCESS);
  const char *const known = strerrordesc_np(error);  // strerror() allocates where it knows none
  const auto unknown = format::text_of<"Unknown error %d", 32>(error);
  const std::string_view reason = known ? known : unknown.view();
  diagnostics.write_at_once(format::text_of<"write error: %.60s\n", 80>(reason).view());
  _exit(exit_status::output_failed);
}

}  // namespace

void end_on_interrupt() {
  struct sigaction action {};
  action.sa_handler = interrupted;
  sigaction(SIGINT, &action, nullptr);
}
