// A file that appears complete or not at all.

#ifndef TARVELCTL_EXPORT_REPLACED_FILE_H
#define TARVELCTL_EXPORT_REPLACED_FILE_H

#include <string>

namespace exporter {

// Lets the report go to a new file beside `path`. However the process ends, but by commit_replacement(),
// nothing is left of that, and `path` is as it was: an interrupt then ends the process as that signal does.
// Called once. False, after a message, where there can be no such file, or `path` is no plain one.
bool begin_replacement(const std::string &path);

// Ends the report and moves the new file, with the mode of one that is just made, to its place. False, after
// a message, where that fails. What cannot be written ends the process as a report does.
bool commit_replacement();

}  // namespace exporter

#endif
