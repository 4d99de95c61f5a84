// One kernel table, through every command that reads it. FUZZ_TABLE names the target.
//
// The input's first 8 bytes choose: the command; the surroundings; the ring statistics switch; where in the
// table the arguments "@" (a UUID) and "#" (a number) are found; and the sizes, 16 bits each, of two more
// tables that follow. The rest is the table.

#include <uuid/uuid.h>

#include <algorithm>
#include <cstdlib>
#include <cstring>

#include "common/tables/arena.h"
#include "common/tables/channel.h"
#include "common/tables/counters.h"
#include "common/tables/flow.h"
#include "common/tables/netns.h"
#include "common/tables/provider.h"
#include "tests/fuzz/harness.h"

namespace {

constexpr std::size_t header_size = 8;
constexpr const char *object_nodes[] = {provider_list_node, channel_list_node, flow_node};

struct target {
  std::string_view name;
  const char *node;
  const char *more_nodes[2];
  std::vector<std::string_view> commands;  // a command in front of which "-w 1" stands is watched
  std::vector<std::string_view> assertions;
};

constexpr std::string_view whole_flows = "(length % sizeof (*sf)) == 0";
constexpr std::string_view known_family = "0";

const target targets[] = {
    {"provider",
     provider_list_node,
     {channel_list_node, flow_node},
     {"provider", "provider -D", "list-providers --details", "tree", "tree @", "show"},
     {whole_flows, known_family}},
    {"channel",
     channel_list_node,
     {channel_list_node, provider_list_node},
     {"channel", "-w 1 channel", "tree", "tree @", "show", "-w 7 channel"},
     {}},
    {"flow",
     flow_node,
     {provider_list_node, channel_list_node},
     {"flow", "flow -n", "netstat -a", "netstat -an --uuid @", "netstat -a --pid #", "netstat -a -p tcp",
      "tree", "channel-stats"},
     {whole_flows, known_family}},
    {"flow_adv",
     flow_adv_node,
     {},
     {"flow-adv", "netstat --flow-adv", "netstat --flow-adv --uuid @"},
     {"sfa->sfa_entries_count <= 512", "scan == (buffer + length)"}},
    {"flow_owner",
     flow_owner_node,
     {},
     {"flow-owner", "netstat --flow-owner", "netstat --flow-owner --pid #"},
     {"sfo == (buffer + length)"}},
    {"flow_route", flow_route_node, {}, {"flow-route", "flow-route -n"}, {"sfr == (buffer + length)"}},
    {"userstack",
     userstack_node,
     {},
     {"netstat -s", "netstat -s -p udp", "netstat -s --show-zeros", "netstat -s --global",
      "netstat -sp tcp --pid #"},
     {"scan == (buffer + length)"}},
    {"net_if",
     net_if_node,
     {},
     {"interface", "netstat --netif", "netstat --netif --show-zeros", "netstat --netif --global"},
     {"(length % width) == 0"}},
    {"flow_switch",
     flow_switch_node,
     {},
     {"flow-switch", "netstat --flowswitch", "netstat --flowswitch --show-zeros",
      "netstat --flowswitch --global"},
     {"(length % width) == 0"}},
    {"arena", arena_node, {}, {"memory", "-w 1 memory"}, {"scan == (buffer + length)"}},
    {"netns",
     netns_node,
     {},
     {"netns", "netns -a", "netns -a -p tcp", "netns -i global", "netns -i 10.0.0.1 -p udp",
      "netns -i fe80::1"},
     {}},
};

const target &the_target() {
  static const target &found = *std::find_if(std::begin(targets), std::end(targets),
                                             [](const target &each) { return each.name == FUZZ_TABLE; });
  return found;
}

std::string uuid_at(fuzz::bytes at) {
  unsigned char uuid[16] = {};
  std::copy_n(at.begin(), std::min(at.size(), sizeof uuid), uuid);
  char text[UUID_STR_LEN];
  uuid_unparse_upper(uuid, text);
  return text;
}

std::string number_at(fuzz::bytes at) {
  std::int32_t number = 0;
  if (at.size() >= sizeof number) std::memcpy(&number, at.data(), sizeof number);
  return std::to_string(number);
}

// A command line as entries, with what "@" and "#" stand for.
std::vector<std::string> entries(std::string_view text, fuzz::bytes at) {
  std::vector<std::string> words{"tarvelctl"};
  while (!text.empty()) {
    const std::string_view word = text.substr(0, text.find(' '));
    words.push_back(word == "@" ? uuid_at(at) : word == "#" ? number_at(at) : std::string(word));
    text.remove_prefix(std::min(text.size(), word.size() + 1));
  }
  return words;
}

fuzz::bytes take(fuzz::bytes &input, std::size_t size) {
  const fuzz::bytes taken = input.first(std::min(size, input.size()));
  input = input.subspan(taken.size());
  return taken;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
  if (size < header_size) return -1;
  const target &target = the_target();
  fuzz::bytes rest(data + header_size, size - header_size);
  fuzz::surroundings around;
  if (data[1] & 1) around.reader = data[1] & 4 ? format::guard::utf8 : format::guard::bytes;
  const fuzz::bytes name = rest.last(std::min<std::size_t>(rest.size(), 20));
  if (data[1] & 2) around.name.assign(name.begin(), std::find(name.begin(), name.end(), 0));
  around.sleeps = 2;
  std::uint16_t sizes[2];
  std::memcpy(sizes, data + 4, sizeof sizes);
  const fuzz::bytes more[] = {take(rest, sizes[0]), take(rest, sizes[1])};
  around.tables = {{target.node, rest}, {ring_stat_enable_node, {data + 2, 1}}};
  for (std::size_t i = 0; i < 2; ++i) {
    if (target.more_nodes[i]) around.tables.push_back({target.more_nodes[i], more[i]});
  }
  for (const char *node : object_nodes) around.tables.push_back({node, {}});

  const std::string_view words = target.commands[data[0] % target.commands.size()];
  const fuzz::bytes place = rest.subspan(rest.empty() ? 0 : data[3] * 4 % rest.size());
  const fuzz::outcome &seen = fuzz::observe(around, entries(words, place));
  fuzz::expect_readable(seen.report, around.reader);
  if (seen.assertion) {
    fuzz::expect(std::count(target.assertions.begin(), target.assertions.end(), seen.assertion) > 0,
                 "an assertion of another table", seen.assertion);
  }
  fuzz::expect(!seen.has_exited || seen.status == 0, "the process ends by exit()", seen.diagnostics);
  fuzz::expect(seen.report.size() <= 4096 + 100 * size, "the report is far larger than its table", words);
  return 0;
}
