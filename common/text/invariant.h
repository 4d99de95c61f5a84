// Tables that contradict themselves.

#ifndef TARVELCTL_COMMON_TEXT_INVARIANT_H
#define TARVELCTL_COMMON_TEXT_INVARIANT_H

// Where an invariant of a kernel table is checked, and the check, as users and their scripts know them. The
// line is a name, not a position in today's source.
struct invariant {
  const char *function;
  const char *file;
  int line;
  const char *expression;
};

// Ends the process by abort(), with the invariant named on standard error, unless `holds`. The report printed
// so far reaches its destination first.
void require(bool holds, const invariant &broken);

#endif
