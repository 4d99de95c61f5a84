// How the lines of a kind are written: the keys of its records as a flat list of "write these bytes, then the
// value there", made once, so that a line costs little more than its bytes.

#ifndef TARVELCTL_EXPORT_LINE_PLAN_H
#define TARVELCTL_EXPORT_LINE_PLAN_H

#include <cstddef>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "common/text/output.h"
#include "export/keys.h"
#include "export/value_step.h"

namespace exporter {

class record_plan {
 public:
  // Of an object with these keys, `opening` in front of the first one and `closing` at its end. Keys and
  // processes must outlive it.
  record_plan(const std::vector<key> &keys, std::string_view opening, std::string_view closing,
              process_texts &processes);

  // Writes the values of a record behind `head`, with those that follow it, which are as the record's
  // description says.
  void put(output &to, std::string_view head, record_bytes record, std::span<const record_bytes> followers,
           bool ends_line) const;

  // The values alone, as a text. There may be no arrays of records among them.
  std::string text(record_bytes record) const;

 private:
  // An array of records, which stands behind all values.
  struct list {
    std::string opening;
    const key *of;
    std::vector<record_plan> each;  // one
  };

  void compile(const std::vector<key> &keys);
  char *put_values(char *to, record_bytes record) const;
  void put_list(output &to, const list &which, record_bytes record,
                std::span<const record_bytes> followers) const;

  process_texts &processes_;
  std::string pending_;   // while it is made: what stands in front of the next value
  std::string literals_;  // with format::slack bytes behind
  std::vector<value_step> steps_;
  std::size_t most_ = 0;  // bytes that all steps may need
  std::vector<list> lists_;
  std::string closing_;
};

}  // namespace exporter

#endif
