// Guarding a terminal against texts from strangers.

#ifndef TARVELCTL_COMMON_TEXT_GUARD_H
#define TARVELCTL_COMMON_TEXT_GUARD_H

#include <cstdint>
#include <span>

namespace format {

// What a reader is guarded against: nothing, or what a terminal obeys, whose characters are bytes or UTF-8.
enum class guard : std::uint8_t { none, bytes, utf8 };

// The guard of this process's terminals: `utf8` where the locale of the environment has that character set,
// else `bytes`. The environment is asked once; the process stays in the C locale.
guard terminal_guard();

// Whether a terminal may obey this character: controls (C0, DEL, C1), what separates lines and paragraphs,
// and what reorders the text around it.
bool is_hidden(char32_t code);

// Puts a "?" in the place of each byte of a control character (C0, DEL, C1), for a terminal in either
// character set. In UTF-8 the same goes for what separates lines and paragraphs, for what reorders the text
// around it, and for bytes that are no part of a valid character.
void hide_controls(std::span<char> text, guard against) noexcept;

}  // namespace format

#endif
