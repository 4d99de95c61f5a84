// Where reports and diagnostics go.
//
// A report is buffered and written in whole lines, so that whoever reads along, and whatever ends the
// process, never meets a torn row: a pipe gets pieces of at most PIPE_BUF bytes that end where a line ends,
// everything else larger pieces. A diagnostic is written at once, after what the report has so far.

#ifndef TARVELCTL_COMMON_TEXT_OUTPUT_H
#define TARVELCTL_COMMON_TEXT_OUTPUT_H

#include <signal.h>
#include <sys/types.h>

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <span>
#include <string_view>

#include "common/text/print.h"

namespace exit_status {
inline constexpr int usage = 64;
inline constexpr int output_failed = 74;
inline constexpr int out_of_memory = 255;
}  // namespace exit_status

class output {
 public:
  // What a failed write means: the end of the process, or nothing because there is no one left to tell.
  enum class failure : std::uint8_t { fatal, ignored };

  // An output with `storage` as its first buffer, so that a diagnostic needs no allocation. It owns no
  // descriptor until attach().
  constexpr output(std::span<char> storage, failure on_failure)
      : begin_(storage.data()),
        end_(storage.data()),
        limit_(storage.data() + storage.size() - format::slack),
        lines_end_(storage.data()),
        storage_(storage.data()),
        on_failure_(on_failure) {}

  // Writes to `fd` from here on, and closes it by close(). Nothing may be buffered.
  void attach(int fd);

  // Lets the descriptor stand for the open file of `fd`, which it takes over. Nothing may be buffered.
  void redirect(int fd);

  // Whether the reader is a terminal.
  bool is_terminal() const { return guard_ != format::guard::none; }

  // Writes everything, also an unfinished line. Waits where the reader is slow.
  //
  // A write that fails ends the process: "write error: %s" and status 74, or quietly by SIGPIPE where the
  // reader has gone.
  void flush() {
    if (end_ != begin_) drain(end_);
  }

  // As flush(), but where the write fails, that is said and the process goes on: it ends in another way. A
  // reader that has gone ends it here too.
  void flush_at_last();

  // Flushes, closes the descriptor and reports what closing it says.
  void close();

  // For a signal handler, at any instruction: writes the whole lines that are not written yet. A reader that
  // takes nothing for 0.1 s loses the rest. Returns 0 or the error number of a write.
  int abandon() const noexcept;

  // For a signal handler, at any instruction: writes `text` past the buffer. What takes longer than 0.1 s, or
  // fails, is lost.
  void write_at_once(std::string_view text) const noexcept { write_within_limit(text); }

  // The sink interface of format::print_to.
  char *room(std::size_t size) {
    if (size > static_cast<std::size_t>(limit_ - end_)) make_room(size);
    return end_;
  }
  void commit(char *end, bool ends_line) {
    end_ = end;
    if (!ends_line) return;
    lines_end_.store(end, std::memory_order_release);
    if (end - begin_ >= flush_size) drain(end);
  }
  format::guard reader_guard() const { return guard_; }

  // A buffer of this size holds flush_size bytes and a long row.
  static constexpr std::size_t buffer_size = 40 * 1024;

 private:
  static constexpr std::ptrdiff_t flush_size = 32 * 1024;

  std::string_view next_piece(std::string_view bytes) const;
  ssize_t write_once(std::string_view bytes) const;
  int write_within_limit(std::string_view bytes) const noexcept;
  ssize_t write_piece(std::string_view bytes, const sigset_t &unheld);
  void make_room(std::size_t size);
  void drain(const char *upto);
  void write_out(const char *upto);
  void fail(int error);

  // begin_ <= lines_end_ <= end_ <= limit_. Bytes before begin_ are written, bytes up to lines_end_ are whole
  // lines. While a write may change begin_, or the buffer moves, SIGINT is held back, but for a terminal that
  // makes a write wait: write_is_open_ then says that nothing is known of begin_.
  char *begin_;
  char *end_;
  char *limit_;
  std::atomic<char *> lines_end_;
  char *storage_;
  std::unique_ptr<char[]> grown_;  // the buffer after a row that was longer than the first one
  int fd_ = -1;
  failure on_failure_;
  format::guard guard_ = format::guard::none;  // another one where the reader is a terminal
  bool is_pipe_ = false;
  bool is_socket_ = false;
  int error_ = 0;                            // of the write that ends the process
  std::atomic<bool> write_is_open_ = false;  // a write that SIGINT may cut off is going on
  bool may_block_ = false;                   // a pipe or terminal on whose reader a write waits
};

// Standard output, or the file that replaces it.
extern output report;

// Standard error. Use complain() to write to it.
extern output diagnostics;

// Prints to the report.
template <format::text F, class... Args>
void print(const Args &...args) {
  format::print_to<F>(report, args...);
}

// Prints to standard error, behind all that the report holds so far.
template <format::text F, class... Args>
void complain(const Args &...args) {
  report.flush();
  format::print_to<F>(diagnostics, args...);
  diagnostics.flush();
}

// Prints to standard error as complain() does, for a process that ends by what it says: a report that cannot
// be written does not end it in another way, but is complained of first.
template <format::text F, class... Args>
void say_last_words(const Args &...args) {
  report.flush_at_last();
  format::print_to<F>(diagnostics, args...);
  diagnostics.flush();
}

// Attaches both to the process's standard descriptors. Descriptors that were closed are opened in a way that
// makes their use fail, so that no file opened later can take their place.
void attach_standard_outputs();

// The same for a program that starts others, with descriptors of their own: those others get their standard
// descriptors as they were.
void attach_own_outputs();

#endif
