// Writes a completion script: its body, with the program's own tables in place of the line "# TABLES".
//
// usage: generate_completions bash|zsh|fish BODY, or, for tests, generate_completions words

#include <cstdio>
#include <fstream>
#include <string>
#include <string_view>
#include <vector>

#include "common/tables/values.h"
#include "tarvelctl/command.h"
#include "tarvelctl/netstat_options.h"

namespace {

#define UUID_PATTERN "[0-9A-F]{8}(-[0-9A-F]{4}){3}-[0-9A-F]{12}"

// UUIDs of the kernel in sight, by the report that tells them and the sed command that finds them there.
// Reports hold texts of strangers: nothing but a UUID gets through.
constexpr struct {
  const char *name;
  const char *report;
  const char *filter;
} live_lists[] = {
    {"objects", "tree", "/\"0{8}-0{4}-0{4}-0{4}-0{12}\"/!s/^ *\"uuid\":\"(" UUID_PATTERN ")\".*$/\\1/p"},
    {"nexuses", "provider", "s/^[[:blank:]]instance (" UUID_PATTERN ")$/\\1/p"},
};

template <class Words>
std::string names_of(const Words &words) {
  std::string names;
  for (const auto &word : words) names.append(names.empty() ? "" : " ").append(word.name.view());
  return names;
}

// What can be offered as the value of a long option or, where none is named, as the argument of a command:
// words, or "@" and the name of a live list.
const struct {
  command_handler handler;
  std::string_view option;
  std::string values;
} known_values[] = {
    {cmd_netns, "ip", "global"},
    {cmd_netns, "proto", names_of(ip_protocols.rows)},
    {cmd_netstat, "per-protocol", names_of(netstat_protocols)},
    {cmd_netstat, "uuid", "@nexuses"},
    {cmd_tree, "", "@objects"},
};

std::string values_of(command_handler handler, std::string_view option) {
  for (const auto &row : known_values) {
    if (row.handler == handler && row.option == option) return row.values;
  }
  return {};
}

struct completed_option {
  std::string letter;  // or empty
  std::string name;    // or empty
  bool takes_value;
  std::string values;

  std::vector<std::string> spellings() const {
    std::vector<std::string> all;
    if (!letter.empty()) all.push_back(std::string("-").append(letter));
    if (!name.empty()) all.push_back(std::string("--").append(name));
    return all;
  }
};

// The long options of a command, each with its letter if the handler takes it, then the other letters.
std::vector<completed_option> options_of(const command_entry &row) {
  std::vector<completed_option> all;
  std::string letters = short_options_of(row.handler);
  std::erase(letters, ':');
  for (const option *each = row.options; each->name; ++each) {
    const std::size_t at = each->val ? letters.find(static_cast<char>(each->val)) : letters.npos;
    const std::string letter = at == letters.npos ? "" : letters.substr(at, 1);
    if (!letter.empty()) letters.erase(at, 1);
    all.push_back({letter, each->name, each->has_arg != no_argument, values_of(row.handler, each->name)});
  }
  for (const char letter : letters) all.push_back({{letter}, "", false, ""});
  return all;
}

template <class Action>
void for_each_command(Action action) {
  for (const command_entry *row = command_table; row->name; ++row) action(*row);
}

// The functions that print the live lists, in what the three shells have in common.
void print_live_lists(const char *head, const char *tail) {
  for (const auto &list : live_lists) {
    std::printf(head, list.name);
    std::printf(
        "  command timeout 1 tarvelctl %s </dev/null 2>/dev/null |\n"
        "    command env LC_ALL=C sed -nE '%s' | command sort -u\n%s\n",
        list.report, list.filter, tail);
  }
}

void print_bash() {
  std::printf("declare -gA _tarvelctl_options=(\n");
  for_each_command([](const command_entry &row) {
    std::printf("  [%s]='", row.name);
    for (const completed_option &each : options_of(row)) {
      for (const std::string &word : each.spellings()) std::printf("%s ", word.c_str());
    }
    std::printf("-f -w'\n");
  });
  std::printf(")\ndeclare -gA _tarvelctl_values=(\n");
  for_each_command([](const command_entry &row) {
    if (const std::string values = values_of(row.handler, ""); !values.empty()) {
      std::printf("  [%s]='%s'\n", row.name, values.c_str());
    }
    for (const completed_option &each : options_of(row)) {
      if (!each.takes_value) continue;
      for (const std::string &word : each.spellings())
        std::printf("  ['%s %s']='%s'\n", row.name, word.c_str(), each.values.c_str());
    }
  });
  std::printf(")\n");
  print_live_lists("_tarvelctl_%s() {\n", "}");
}

// A message and an action as _arguments wants them behind an option or an argument.
std::string zsh_action(std::string_view message, std::string_view values) {
  std::string action(":");
  action.append(message).append(":");
  if (values.empty()) return action.append(" ");
  if (values.starts_with('@')) return action.append("_tarvelctl_offer ").append(values.substr(1));
  return action.append("(").append(values).append(")");
}

void print_zsh() {
  std::printf("local -A specs=(\n");
  for_each_command([](const command_entry &row) {
    std::printf("  %s \"", row.name);
    for (const completed_option &each : options_of(row)) {
      for (const std::string &word : each.spellings()) {
        if (!each.takes_value) std::printf(" %s", word.c_str());
        if (each.takes_value)
          std::printf(" '*%s%s%s'", word.c_str(), word.size() > 2 ? "=" : "+",
                      zsh_action(each.name, each.values).c_str());
      }
    }
    if (const std::string values = values_of(row.handler, ""); !values.empty()) {
      std::printf(" '1%s'", zsh_action("argument", values).c_str());
    }
    std::printf("\"\n");
  });
  std::printf(")\n");
  print_live_lists("_tarvelctl_%s() {\n", "}");
}

void print_fish() {
  print_live_lists("function __tarvelctl_%s\n", "end");
  for_each_command([](const command_entry &row) {
    std::printf("complete -c tarvelctl -n __tarvelctl_wants_command -a %s\n", row.name);
    const auto print_values = [](const std::string &values) {
      if (values.starts_with('@')) std::printf(" -a '(__tarvelctl_%s)'", values.c_str() + 1);
      if (!values.empty() && !values.starts_with('@')) std::printf(" -a '%s'", values.c_str());
    };
    if (const std::string values = values_of(row.handler, ""); !values.empty()) {
      std::printf("complete -c tarvelctl -n '__tarvelctl_runs %s'", row.name);
      print_values(values);
      std::printf("\n");
    }
    for (const completed_option &each : options_of(row)) {
      std::printf("complete -c tarvelctl -n '__tarvelctl_runs %s'", row.name);
      if (!each.letter.empty()) std::printf(" -s %s", each.letter.c_str());
      if (!each.name.empty()) std::printf(" -l %s", each.name.c_str());
      if (each.takes_value) std::printf(" -x");
      print_values(each.values);
      std::printf("\n");
    }
  });
}

// A line for each command, and one for each of its options in each spelling.
void print_words() {
  for_each_command([](const command_entry &row) {
    std::printf("%s\n", row.name);
    for (const completed_option &each : options_of(row)) {
      for (const std::string &word : each.spellings()) std::printf("%s %s\n", row.name, word.c_str());
    }
  });
}

constexpr struct {
  std::string_view name;
  void (*print)();
} forms[] = {{"bash", print_bash}, {"zsh", print_zsh}, {"fish", print_fish}, {"words", print_words}};

// Says on standard error what is wrong. Returns false.
bool complain(const char *about, const char *what) {
  std::fprintf(stderr, "generate_completions: %s: %s\n", about, what);
  return false;
}

// Copies the body to standard output. False, after a message, where it has no place for the tables.
bool print_script(const char *body, void (*print_tables)()) {
  bool placed = false;
  std::ifstream in(body);
  for (std::string line; std::getline(in, line);) {
    if (line == "# TABLES") {
      print_tables();
      placed = true;
    } else {
      std::printf("%s\n", line.c_str());
    }
  }
  return placed || complain(body, "no line for the tables");
}

}  // namespace

int main(int argc, char **argv) {
  for (const auto &form : forms) {
    if (argc < 2 || form.name != argv[1]) continue;
    if (argc == 2) form.print();
    const bool made = argc == 2 || print_script(argv[2], form.print);
    const bool written = std::fflush(stdout) == 0 && !std::ferror(stdout);
    return (written || complain("standard output", "write error")) && made ? 0 : 1;
  }
  std::fprintf(stderr, "usage: generate_completions bash|zsh|fish|words [BODY]\n");
  return 64;
}
