// What changed between two moments: which records are the same, and how far their counters have gone on.
//
// It works from the rows of the records: a record is the same as one before where all that identifies it
// (row::is_key) is equal, also in the records that it follows or lies in. No one else compares moments.

#ifndef TARVELCTL_COMMON_CHANGES_H
#define TARVELCTL_COMMON_CHANGES_H

#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string_view>
#include <vector>

#include "common/kept_records.h"
#include "common/moment.h"

// What became of a record since the moment before.
enum class fate : std::uint8_t {
  unknown,    // nothing is known of before: its table had not been read, or ended too early
  same,       // it was there, and its counters have gone on
  appeared,   // it was not there
  restarted,  // it was there, and a counter has fallen: what the others say is of no use
  ambiguous,  // there are or were several that nothing tells apart
  gone,       // it is there no more
};

// How far a counter has gone on. There is no difference but for records that are the same, and none where the
// counter did not hold before or does not hold now. A counter that falls has restarted, unless it has gone on
// modulo 2^64 by less than 2^48, which no counter does by restarting; one that has risen by more has not
// counted up to there.
struct counter_change : counter_at {
  std::optional<std::uint64_t> difference{};
};

struct changed_record {
  const record_description *what = nullptr;
  std::string_view part{};                // of the record above, as rows and followers call it, or empty
  std::size_t place = 0;                  // among those of that part
  const changed_record *above = nullptr;  // the record that it follows or lies in, if any
  record_bytes
      bytes{};  // as in its table; of what is gone, what identifies it and its counters: the rest is 0
  fate became = fate::unknown;
  double seconds =
      0;  // between the two readings of its table, more than 0, or 0 where the clock did not go on
  std::span<const counter_change> counters{};  // all that it has, in the order of its rows

  // What a counter counted per second, where there is a difference and the clock went on.
  std::optional<double> rate(const counter_change &change) const {
    if (!change.difference || seconds <= 0) return {};
    return static_cast<double>(*change.difference) / seconds;
  }
};

// One moment, as the next one needs it: keys and counters.
class earlier_moment {
 public:
  // Takes the place of what was kept before. A table that this moment lacks or could not read stays as it was
  // kept, so that the next one that has it compares with that.
  void keep(const moment &now) { follow(now, nullptr, nullptr); }

  // Compares `now` with what is kept, then keeps it. Calls visit(const changed_record &) once for each record
  // of the tables that could be read, those that something follows or lies in first, and behind the records
  // of a table for each that is gone. What it is given holds until it returns.
  template <class Visit>
  void follow(const moment &now, Visit visit) {
    follow(
        now, [](void *to, const changed_record &each) { (*static_cast<Visit *>(to))(each); }, &visit);
  }

  // Bytes of memory that are kept.
  std::size_t size() const;

 private:
  friend class table_comparison;
  struct kept_table {
    const table_description *what;
    std::int64_t monotonic;
    bool is_whole;
    kept_records records;
  };
  using visitor = void (*)(void *, const changed_record &);

  void follow(const moment &now, visitor visit, void *to);

  std::vector<kept_table> tables_;
};

#endif
