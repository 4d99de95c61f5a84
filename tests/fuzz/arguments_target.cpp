// The front end: the input is a command line, each argument ended by a NUL.

#include <algorithm>
#include <array>
#include <utility>

#include "tests/fuzz/harness.h"

namespace {

// The same few records for whichever table is asked for, so that every command has something to say.
constexpr std::array<std::uint8_t, 2608> no_bytes{};
constexpr struct {
  std::string_view node;
  std::size_t size;
} tables[] = {
    {"kern.tarvel.nexus_provider_list", 2 * 264}, {"kern.tarvel.nexus_channel_list", 2 * 24},
    {"kern.tarvel.ring_stat_enable", 1},          {"kern.tarvel.stats.flow", 0},
    {"kern.tarvel.stats.flow_adv", 2 * 40},       {"kern.tarvel.stats.flow_owner", 2 * 128},
    {"kern.tarvel.stats.userstack", 2496},        {"kern.tarvel.stats.arena", 2608},
    {"kern.tarvel.stats.netns", 2 * 32},
};

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
  if (size == 0 || size > 1024) return -1;
  fuzz::surroundings around;
  if (data[0] & 1) around.reader = format::guard::bytes;
  around.files_can_open = data[0] & 2;
  around.sleeps = 1;
  for (const auto &each : tables)
    around.tables.push_back({each.node, fuzz::bytes(no_bytes).first(each.size)});

  std::vector<std::string> words;
  for (fuzz::bytes rest(data + 1, size - 1); !rest.empty();) {
    const auto end = std::find(rest.begin(), rest.end(), 0);
    words.emplace_back(rest.begin(), end);
    rest = rest.subspan(std::min(rest.size(), words.back().size() + 1));
  }
  const fuzz::outcome &seen = fuzz::observe(around, std::move(words));
  fuzz::expect_readable(seen.report, format::guard::none);
  fuzz::expect(!seen.assertion, "whole tables fail an assertion", seen.assertion ? seen.assertion : "");
  fuzz::expect(!seen.has_exited || seen.status == 0 || seen.status == 64, "an exit status of no meaning",
               seen.diagnostics);
  fuzz::expect(seen.status == 0 || !seen.diagnostics.empty(), "a usage error without a message");
  return 0;
}
