#include "common/output_helpers.h"
#include "tarvelctl/command.h"

const option no_options[] = {{}};
const std::uint32_t no_option_flags[] = {0};

const command_entry command_table[] = {
    {"provider", cmd_provider, 0, nullptr, provider_options, provider_option_flags},
    {"list-providers", cmd_provider, 0, nullptr, provider_options, provider_option_flags},
    {},
};
