// tree: the object tree, whole or below one object, as nested JSON objects.

#include "common/mib.h"
#include "common/text/output.h"
#include "common/text/output_helpers.h"
#include "tarvelctl/command.h"

int cmd_tree(int argc, char **argv) {
  uuid target{};  // the null UUID names the root
  if (argc > 1 && uuid_parse(argv[1], target.bytes) != 0) {
    complain<"Invalid UUID\n">();
    print_options_usage(no_options, no_option_flags);
    return exit_status::usage;
  }
  object_tree tree;
  if (const int error = tree.scrape_tree()) return error;
  const object_id found = tree.find_object(target);
  if (found == no_object) {
    complain<"No tarvel object with UUID %s\n">(target);
    print_options_usage(no_options, no_option_flags);
    return exit_status::usage;
  }
  tree.dump_object(found);
  print<"\n">();
  return 0;
}
