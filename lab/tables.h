// Every table of the kernel: how the world looks in it.

#ifndef TARVELCTL_LAB_TABLES_H
#define TARVELCTL_LAB_TABLES_H

#include <cstddef>
#include <cstdint>
#include <cstring>
#include <span>
#include <string_view>
#include <vector>

#include "common/tables/tables.h"
#include "common/text/text.h"
#include "lab/table_file.h"
#include "lab/world.h"

namespace lab {

struct table {
  const table_description *what;

  // Writes the table's bytes.
  void (*write)(const world &, table_file &);
};

// In the order in which they are published: what others refer to comes first.
extern const std::span<const table> tables;

// Fills a text field: cut to its width, the rest NUL.
template <std::size_t Width>
void set_text(text_field<Width> &field, std::string_view text) {
  std::memset(field.bytes, 0, Width);
  std::memcpy(field.bytes, text.data(), std::min(text.size(), Width));
}

}  // namespace lab

#endif
