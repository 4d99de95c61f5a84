// The names of processes as they stand in lines.

#ifndef TARVELCTL_EXPORT_PROCESS_TEXTS_H
#define TARVELCTL_EXPORT_PROCESS_TEXTS_H

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include "common/tables/key_index.h"

namespace exporter {

// Asks for the name of each process once a moment.
class process_texts {
 public:
  // The short name that the kernel gives for a pid, in quotation marks, or "null". Valid until the next call.
  std::string_view of(std::int32_t pid);

  // Forgets all names: processes come and go.
  void clear();

 private:
  std::vector<std::string> texts_;
  key_index by_pid_;
};

}  // namespace exporter

#endif
