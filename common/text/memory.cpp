#include "common/text/memory.h"

#include "common/text/output.h"

namespace {

[[noreturn]] void end_without_memory() {
  say_last_words<"malloc failed">();
  std::exit(exit_status::out_of_memory);
}

}  // namespace

void *xmalloc(std::size_t size) {
  void *block = std::malloc(size ? size : 1);
  if (!block) end_without_memory();
  return block;
}

void *xrealloc(void *block, std::size_t size) {
  void *resized = std::realloc(block, size ? size : 1);
  if (!resized) end_without_growth();
  return resized;
}

void end_without_growth() {
  say_last_words<"realloc failed">();
  std::exit(exit_status::out_of_memory);
}

void make_new_fail_fast() {
  std::set_new_handler(end_without_memory);
}
