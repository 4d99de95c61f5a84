// Writes a completion script: its body, with the programs' own tables in place of the line "# TABLES".
//
// usage: generate_completions bash|zsh|fish PROGRAM BODY, or, for tests, generate_completions words

#include <algorithm>
#include <cstdio>
#include <fstream>
#include <iterator>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "common/tables/values.h"
#include "completions/live_lists.h"
#include "export/command_line.h"
#include "lab/command_line.h"
#include "lab/incidents.h"
#include "tarvelctl/command.h"
#include "tarvelctl/netstat_options.h"

namespace {

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
    {cmd_netns, "ip", "@addresses"},
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
  std::string_view meaning = {};  // or empty

  std::vector<std::string> spellings() const {
    std::vector<std::string> all;
    if (!letter.empty()) all.push_back(std::string("-").append(letter));
    if (!name.empty()) all.push_back(std::string("--").append(name));
    return all;
  }
};

struct completed_command {
  std::string name;
  std::string_view purpose;  // or empty
  std::string values;        // of its argument
  std::vector<completed_option> options;
};

struct completed_program {
  const char *name;
  bool joins_values;  // "--option=value" is one, too
  std::vector<completed_command> commands;
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

completed_program tarvelctl() {
  completed_program program{"tarvelctl", true, {}};
  for (const command_entry *row = command_table; row->name; ++row) {
    program.commands.push_back({row->name, "", values_of(row->handler, ""), options_of(*row)});
  }
  return program;
}

// A program with tables of commands and options. `words` are those of its commands that take some, `values`
// those of one of its options.
template <class Command, class Option>
completed_program companion(const char *name, std::span<const Command> commands,
                            std::span<const Option> known_options, const std::string &words,
                            std::string_view option = {}, const std::string &values = "") {
  completed_program program{name, false, {}};
  for (const Command &row : commands) {
    std::vector<completed_option> options;
    for (const Option &each : known_options) {
      if (!(each.in & row.bit)) continue;
      const bool is_letter = !each.name.starts_with("--");
      const std::string word(each.name.substr(is_letter ? 1 : 2));
      options.push_back({is_letter ? word : "", is_letter ? "" : word, !each.argument.empty(),
                         each.name == option ? values : "", each.meaning});
    }
    options.push_back({"", "help", false, "", "what there is to know"});
    program.commands.push_back(
        {std::string(row.name), row.purpose, row.arguments.empty() ? "" : words, std::move(options)});
  }
  return program;
}

completed_program tarvellab() {
  std::string incidents = "list";
  for (const lab::incident &row : lab::incidents) incidents.append(" ").append(row.name);
  return companion("tarvellab", lab::commands, lab::known_options, "", "--incident", incidents);
}

std::string table_names() {
  std::string names;
  for (const exporter::kind &each : exporter::all_kinds()) {
    names.append(names.empty() ? "" : " ").append(each.name);
  }
  return names;
}

completed_program tarvelexport() {
  return companion("tarvelexport", exporter::commands, exporter::known_options, table_names());
}

constexpr struct {
  std::string_view name;
  completed_program (*make)();
} programs[] = {{"tarvelctl", tarvelctl}, {"tarvellab", tarvellab}, {"tarvelexport", tarvelexport}};

void print_bash(const completed_program &program) {
  std::printf("declare -gA _%s_options=(\n", program.name);
  for (const completed_command &row : program.commands) {
    std::printf("  [%s]='", row.name.c_str());
    for (const completed_option &each : row.options) {
      for (const std::string &word : each.spellings()) std::printf("%s ", word.c_str());
    }
    std::printf("'\n");
  }
  std::printf(")\ndeclare -gA _%s_values=(\n", program.name);
  for (const completed_command &row : program.commands) {
    if (!row.values.empty()) std::printf("  [%s]='%s'\n", row.name.c_str(), row.values.c_str());
    for (const completed_option &each : row.options) {
      if (!each.takes_value) continue;
      for (const std::string &word : each.spellings())
        std::printf("  ['%s %s']='%s'\n", row.name.c_str(), word.c_str(), each.values.c_str());
    }
  }
  std::printf(")\n");
}

// A message and an action as _arguments wants them behind an option or an argument.
std::string zsh_action(std::string_view message, std::string_view values) {
  std::string action(":");
  action.append(message).append(":");
  if (values.empty()) return action.append(" ");
  if (values.starts_with('@')) return action.append("_tarvelctl_offer ").append(values.substr(1));
  return action.append("(").append(values).append(")");
}

// An option in one of its spellings, as _arguments wants it.
std::string zsh_option(const completed_option &each, std::string_view word, bool joins_values) {
  std::string spec(each.takes_value ? "*" : "");
  spec.append(word);
  if (each.takes_value && joins_values) spec.append(word.size() > 2 ? "=" : "+");
  if (!each.meaning.empty()) spec.append("[").append(each.meaning).append("]");
  return each.takes_value ? spec.append(zsh_action(each.name.empty() ? each.letter : each.name, each.values))
                          : spec;
}

void print_zsh(const completed_program &program) {
  std::printf("local -A specs=(\n");
  for (const completed_command &row : program.commands) {
    std::printf("  %s \"", row.name.c_str());
    for (const completed_option &each : row.options) {
      for (const std::string &word : each.spellings())
        std::printf(" '%s'", zsh_option(each, word, program.joins_values).c_str());
    }
    if (!row.values.empty()) std::printf(" '1%s'", zsh_action("argument", row.values).c_str());
    std::printf("\"\n");
  }
  std::printf(")\n");
}

void print_fish(const completed_program &program) {
  for (const completed_command &row : program.commands) {
    const auto print_head = [&](const char *when) {
      std::printf("complete -c %s -n '__%s_%s'", program.name, program.name, when);
    };
    const auto print_tail = [](const std::string &values, std::string_view meaning) {
      if (values.starts_with('@')) std::printf(" -a '(__tarvelctl_%s)'", values.c_str() + 1);
      if (!values.empty() && !values.starts_with('@')) std::printf(" -a '%s'", values.c_str());
      if (!meaning.empty()) std::printf(" -d '%s'", std::string(meaning).c_str());
      std::printf("\n");
    };
    const std::string runs = "runs " + row.name;
    print_head("wants_command");
    print_tail(row.name, row.purpose);
    if (!row.values.empty()) {
      print_head(runs.c_str());
      print_tail(row.values, "");
    }
    for (const completed_option &each : row.options) {
      print_head(runs.c_str());
      if (!each.letter.empty()) std::printf(" -s %s", each.letter.c_str());
      if (!each.name.empty()) std::printf(" -l %s", each.name.c_str());
      if (each.takes_value) std::printf(" -x");
      print_tail(each.values, each.meaning);
    }
  }
}

// A line for each command, and one for each of its options in each spelling.
void print_words(const completed_program &program) {
  for (const completed_command &row : program.commands) {
    std::printf("%s\n", row.name.c_str());
    for (const completed_option &each : row.options) {
      for (const std::string &word : each.spellings()) std::printf("%s %s\n", row.name.c_str(), word.c_str());
    }
  }
}

constexpr struct {
  std::string_view name;
  void (*print)(const completed_program &);
  const char *head = nullptr;  // of a function in the shell, and its end
  const char *tail = nullptr;
} forms[] = {{"bash", print_bash, "_tarvelctl_%s() {\n", "}"},
             {"zsh", print_zsh, "_tarvelctl_%s() {\n", "}"},
             {"fish", print_fish, "function __tarvelctl_%s\n", "end"},
             {"words", print_words}};

// Says on standard error what is wrong. Returns false.
bool complain(const char *about, const char *what) {
  std::fprintf(stderr, "generate_completions: %s: %s\n", about, what);
  return false;
}

// Copies the body to standard output. False, after a message, where it has no place for the tables.
template <class Print>
bool print_script(const char *body, Print print_tables) {
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
    if (argc != (form.head ? 4 : 2) || form.name != argv[1]) continue;
    const auto *const row =
        std::ranges::find_if(programs, [&](const auto &each) { return !form.head || each.name == argv[2]; });
    if (row == std::end(programs)) break;
    const completed_program program = row->make();
    if (!form.head) form.print(program);
    const bool made = !form.head || print_script(argv[3], [&] {
      if (program.joins_values) print_live_lists(form.head, form.tail);
      form.print(program);
    });
    const bool written = std::fflush(stdout) == 0 && !std::ferror(stdout);
    return (written || complain("standard output", "write error")) && made ? 0 : 1;
  }
  std::fprintf(stderr,
               "usage: generate_completions bash|zsh|fish PROGRAM BODY, or generate_completions words\n");
  return 64;
}
