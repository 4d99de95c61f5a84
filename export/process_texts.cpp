#include "export/process_texts.h"

#include "export/json_text.h"
#include "platform/process.h"

namespace exporter {

std::string_view process_texts::of(std::int32_t pid) {
  // More processes than that are a table's invention, and would take more memory than the table.
  constexpr std::size_t most = 1 << 14;
  const std::uint32_t known = by_pid_.find(pid);
  if (known != key_index::none) return texts_[known];
  if (texts_.size() == most) clear();
  char name[platform::process_name_size];
  by_pid_.add(pid, static_cast<std::uint32_t>(texts_.size()));
  texts_.push_back(platform::query_process_name(pid, name) ? quoted(name) : "null");
  return texts_.back();
}

void process_texts::clear() {
  texts_.clear();
  by_pid_ = {};
}

}  // namespace exporter
