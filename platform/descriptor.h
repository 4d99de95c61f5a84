// What a descriptor needs so that writing to it can be given up.

#ifndef TARVELCTL_PLATFORM_DESCRIPTOR_H
#define TARVELCTL_PLATFORM_DESCRIPTOR_H

namespace platform {

// Makes writes to `fd`, a pipe or a terminal, return EAGAIN where they would wait, for this process alone:
// the mode of an open file is shared with whoever else holds it, so `fd` gets an opening of its own, which an
// exec closes where it would have closed `fd`. Returns false, with everything as it was, where the system
// does not allow that.
bool make_writes_nonblocking(int fd);

}  // namespace platform

#endif
