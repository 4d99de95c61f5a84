// What the kernel in sight has, for completions to offer.

#ifndef TARVELCTL_COMPLETIONS_LIVE_LISTS_H
#define TARVELCTL_COMPLETIONS_LIVE_LISTS_H

#include <cstdio>

// Lists, each by the report that tells it and the awk program that finds it there: words,
// each with what it is behind a tab, if that is known.
inline constexpr struct {
  const char *name;
  const char *report;
  const char *always;  // what there is in any kernel
  const char *program;
} live_lists[] = {
    {"objects", "tree", "", R"(BEGIN { FS = "\"" } { v = $4 $3; gsub(/[^A-Za-z0-9._-]/, "", v) }
    function done() { if (id !~ /^0*-0*-0*-0*-0*$/) print id "\t" what }
    $2 == "uuid" { done(); id = v; what = "" }
    $2 == "type" { what = v }
    $2 == "name" { on = v; what = what " " v }
    $2 == "type" && v == "nexus" { what = what " of " on }
    $2 == "pid" { pid = v }
    $2 == "proc_name" { what = what " of " v "." pid " on " on }
    END { done() })"},
    {"nexuses", "provider", "", R"(/^\tinstance / { print $2 "\t" what; next }
    match($0, / [0-9A-F]+-[0-9A-F]+-[0-9A-F]+-[0-9A-F]+-/) {
      what = substr($0, 1, RSTART - 1); gsub(/[^A-Za-z0-9._ -]/, "", what) })"},
    {"addresses", "netns -a", "global", R"($2 == "port" && $5 != "global" { print $5 })"},
};

// Reports hold texts of strangers: nothing but a UUID or an address gets through, and words behind a tab.
inline constexpr char harmless[] =
    "^([0-9A-F]{8}(-[0-9A-F]{4}){3}-[0-9A-F]{12}|[0-9a-f.:]+)(\t[A-Za-z0-9._ -]*)?$";

// Prints the functions that print the lists, in what the three shells have in common; `head` and `tail` are
// what a function begins, with its name, and ends with.
inline void print_live_lists(const char *head, const char *tail) {
  for (const auto &list : live_lists) {
    std::printf(head, list.name);
    if (*list.always) std::printf("  echo %s\n", list.always);
    std::printf(
        "  command timeout 1 tarvelctl %s </dev/null 2>/dev/null | command env LC_ALL=C awk '%s' |\n"
        "    command env LC_ALL=C sed -nE '/%s/p' | command sort -u\n%s\n",
        list.report, list.program, harmless, tail);
  }
}

#endif
