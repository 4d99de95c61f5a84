#include "common/names/process_names.h"

#include "common/text/output_helpers.h"

const process_names::text &process_names::of(int pid) {
  const std::uint32_t known = by_pid_.find(pid);
  if (known != key_index::none) return texts_[known];
  text name;
  name.size = pid_to_name(pid, name.chars, sizeof name.chars, with_pid_).text.size();
  name.foreign = true;
  by_pid_.add(pid, static_cast<std::uint32_t>(texts_.size()));
  texts_.push_back(name);
  return texts_.back();
}
