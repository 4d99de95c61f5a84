#include "common/text/invariant.h"

#include <cstdlib>

#include "common/text/output.h"

void require(bool holds, const invariant &broken) {
  if (holds) return;
  say_last_words<"Assertion failed: (%s), function %s, file %s, line %d.\n">(
      broken.expression, broken.function, broken.file, broken.line);
  std::abort();
}
