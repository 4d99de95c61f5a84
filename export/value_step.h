// One value of a line: how it is read from its record and written.

#ifndef TARVELCTL_EXPORT_VALUE_STEP_H
#define TARVELCTL_EXPORT_VALUE_STEP_H

#include <array>
#include <cstddef>
#include <cstdint>
#include <memory>

#include "common/tables/description.h"
#include "export/keys.h"
#include "export/process_texts.h"

namespace exporter {

// Names in quotation marks: those of an enumeration's values in their order, those of flags by bit.
struct quoted_names {
  struct text {
    char chars[32];  // all of them may be read
    std::size_t size;
  };
  std::array<text, 32> texts{};
};

struct value_step {
  // Appends the value that lies at `at`; of an array the function for its elements is `put_element`. Writes
  // at most `most` bytes that count, and format::slack behind them.
  using writer = char *(*)(char *to, const value_step &how, const std::byte *at);

  writer put = nullptr;
  // Whether there is none: `null` is written then. Null where there is always one, or `put` sees to it.
  bool (*is_none)(const value_step &how, const std::byte *at) = nullptr;
  writer put_element = nullptr;
  const key *of = nullptr;
  std::size_t offset = 0;
  std::size_t most = 0;
  std::size_t literal = 0;  // where the bytes in front of it are kept, and how many there are
  std::size_t literal_size = 0;
  process_texts *processes = nullptr;
  std::unique_ptr<quoted_names> names = {};

  record_bytes record(const std::byte *at) const { return {at - offset, offset + of->field->size}; }
};

// Of a key that is no object and no array of records. The key and the processes must outlive it.
value_step step_of(const key &of, process_texts &processes);

// Appends a text that is known to fit.
char *put_plain(char *to, std::string_view text);

}  // namespace exporter

#endif
