#include "lab/tables.h"

#include "common/provider.h"

namespace lab {

namespace {

constexpr table all_tables[] = {
    {provider_list_node, write_providers, nullptr},
};

}  // namespace

const std::span<const table> tables = all_tables;

}  // namespace lab
