// The way out on SIGINT.

#ifndef TARVELCTL_COMMON_TEXT_INTERRUPT_H
#define TARVELCTL_COMMON_TEXT_INTERRUPT_H

// From here on SIGINT, which may come at any instruction, ends the process: the whole lines that are printed
// are written, and the status is 0; "write error: %s" and 74 where they cannot be.
void end_on_interrupt();

#endif
