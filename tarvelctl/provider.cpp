// provider: the registered nexus providers and their instances.

#include "common/tables/provider.h"

#include <cstring>
#include <iterator>

#include "common/tables/kernel_table.h"
#include "common/tables/record_walk.h"
#include "common/text/output.h"
#include "common/text/output_helpers.h"
#include "tarvelctl/command.h"

const option provider_options[] = {{"details", no_argument, nullptr, 'D'}, {}};
const std::uint32_t provider_option_flags[] = {option_is_optional};
static_assert(std::size(provider_option_flags) == std::size(provider_options) - 1);

namespace {

void print_provider(const nexus_provider_record &record, std::span<const std::byte> instances, bool details) {
  const nexus_provider_parameters &p = record.parameters;
  print<"%s %s %s">(provider_type_name(p.type, p.subtype), p.shown_name(), record.provider_uuid);
  if (p.flags & p.anonymous) print<" [anon]">();
  print<"\n">();
  if (details) {
    print<"\trings: tx %d rx %d slots: tx %d rx %d bufsize %d metasize %d mhints %d\n">(
        p.tx_rings, p.rx_rings, p.tx_slots, p.rx_slots, p.buf_size, p.meta_size, p.mhints);
  }
  record_walk walk(instances);
  for (uuid instance; walk.take(instance);) print<"\tinstance %s\n">(instance);
}

}  // namespace

int cmd_provider(int argc, char **argv) {
  bool details = false;
  const char *letters = short_options_of(cmd_provider);
  for (int result; (result = getopt_long(argc, argv, letters, provider_options, nullptr)) != -1;) {
    if (result != 'D') {
      print_options_usage(provider_options, provider_option_flags);
      return exit_status::usage;
    }
    details = true;
  }

  kernel_table table;
  if (const int error = table.fetch(provider_list_node)) {
    complain<"failed to retrieve nexus provider list, %s\n">(std::strerror(error));
    return 0;
  }
  if (table.empty()) {
    print<"No providers\n">();
    return 0;
  }
  record_walk walk(table.bytes());
  nexus_provider_record record;
  std::span<const std::byte> instances;
  while (walk.take(record, instances)) {
    print_provider(record, instances, details);
  }
  if (!walk.at_end()) complain<"Buffer too short\n">();
  return 0;
}
