// memory: arenas, their regions, the summary of all regions.

#include <gtest/gtest.h>

#include <map>

#include "tests/support/records.h"

namespace {

constexpr char arena_list[] = "kern.tarvel.stats.arena";

// A region with one segment. `id` is its UUID.
bytes region(std::string_view name, std::uint32_t type, std::uint64_t id, std::uint64_t total = 0,
             std::uint64_t wired = 0) {
  return bytes(208).text(0, name).u64(72, id).u32(80, type).u64(104, 1).u64(152, total).u64(160, wired);
}

bytes arena(std::string_view name, std::uint32_t type, const std::vector<bytes> &regions,
            const std::vector<std::uint32_t> &processes = {}) {
  bytes record = bytes(2608).text(0, name).u32(64, type).text(68, "not to be read");
  for (std::size_t i = 0; i < regions.size(); ++i) record.text(80 + 208 * i, regions[i]);
  for (std::size_t i = 0; i < processes.size(); ++i) record.u32(2576 + 4 * i, processes[i]);
  return record;
}

const std::string dashes(70, '-'), pluses(70, '+');

std::string heading(const std::string &lines) {
  return std::string(70, '=') + "\n" + lines + std::string(70, '=') + "\n";
}

std::string total(const std::string &text) {
  return dashes + "\n         TOTAL:  " + text + "\n" + dashes + "\n\n";
}

// The summary; a row is given where it is not this one.
constexpr char zeros[] = "        0 KB          0 KB";
std::string summary(const std::map<int, std::string> &rows, const std::string &megabytes) {
  std::string text = pluses + "\n Tarvel Region Memory Usage Summary (deduplicated)\n" + pluses +
                     "\n                         Total         Wired\n";
  int type = 0;
  for (const char *name : {"        SCHEMA", "          RING", "           BUF", "           MDU",
                           "           USD", "        USTATS", "       FLOWADV", "      NEXUSADV",
                           "       SYSCTLS", "           MDK", "           KSD", "        KSTATS"}) {
    const auto row = rows.find(type++);
    text += name + std::string(":   ") + (row == rows.end() ? zeros : row->second) + "\n";
  }
  return text + dashes + "\n         TOTAL:       " + megabytes + "\n" + dashes + "\n";
}
const std::string nothing = " 0.00 MB       0.00 MB";

run_result report(const std::string &table) {
  return run_on(arena_list, table, "memory");
}

std::string summary_of(const std::string &table) {
  const std::string out = report(table).out;
  return out.substr(out.find('+'));
}

// The lines of a region, its numbers in their order.
std::string block(const std::string &title, const std::vector<std::string> &of) {
  return title + "\n        allocs:  " + of[0] + "\n         frees:  " + of[1] +
         "\n      rescales:  " + of[2] + "\n          mode:  " + of[3] + "\n          objs:  " + of[4] +
         " per segment\n objs cnt*size:  " + of[5] + " inflation)\n       segsize:  " + of[6] +
         " inflation)\n      segments:  " + of[7] + " in use)\n" + of[8] + " KB\n";
}

TEST(memory, ReportsArenaWithItsProcessesAndRegions) {
  bytes schema =
      region("schema.en0", 0, 1, 65'536 + 1023).u32(84, 5).u64(88, 4096).u64(96, 16'384).u64(104, 4);
  schema.u64(112, 64).u64(120, 100).u64(128, 64).u64(136, 128).u64(144, 16);
  schema.u64(168, 999).u64(176, 3).u64(184, 5).u64(192, ~0ULL).u64(200, 6);
  const bytes unused = region("unused", 1, 4, 1024, 2048).u64(104, 0);
  const bytes adv = region("adv", 7, 2, 4095, 1535).u32(84, 0x8000007F).u64(120, 7).u64(176, 2).u64(104, 3);
  const bytes odd = region("odd", 12, 3, 1, 513);
  const std::string table = arena("tarvel-main", 0, {schema, unused, adv, odd}, {42, ~0U - 1, 0, 42});
  const std::string bar = "              |\n";
  const std::string flags = "NOREDIRECT,MMAPOK,READONLY,PERSISTENT,MONOLITHIC,NOCACHE,MIRRORED";
  EXPECT_EQ(
      report(table),
      printed(
          heading("   NEXUS arena:  tarvel-main\n                 curl.42\n                 <unknown>.-2\n") +
          block(" SCHEMA region:  schema.en0", {"18446744073709551615", "6", "5", "0x5<NOREDIRECT,READONLY>",
                                                "16", "100*64 -> 128*64 (28.00%", "4096 -> 16384 (300.00%",
                                                "3/4 (75.00%", "        memory:  64"}) +
          bar +
          block("NEXUSADV region:  adv",
                {"0", "0", "0", "0x8000007f<" + flags + ">", "0", "7*0 -> 0*0 (0.00%", "0 -> 0 (0.00%",
                 "2/3 (66.67%", "  wired memory:  1"}) +
          bar +
          block("UNKNOWN region:  odd", {"0", "0", "0", "0x0<>", "0", "0*0 -> 0*0 (0.00%", "0 -> 0 (0.00%",
                                         "0/1 (0.00%", "  wired memory:  0"}) +
          total("68 KB (wired 2 KB)") +  // 70655 and 2048 bytes: no region's rest is lost
          summary({{0, "       64 KB          0 KB"},
                   {1, "        1 KB          2 KB"},
                   {7, "        3 KB          1 KB"}},
                  " 0.07 MB       0.00 MB")));
}

TEST(memory, ArenaWithoutRegionsHasOnlyItsTotal) {
  const std::string name(64, 'n');
  std::string lines = "    PLCY arena:  " + name + "\n";
  for (int i = 0; i < 8; ++i) lines += "                 curl.42\n";
  EXPECT_EQ(report(arena(name, 1, {}, std::vector<std::uint32_t>(8, 42)) + arena("", 2, {})),
            printed(heading(lines) + total("0 KB") + heading("  SYSTEM arena:  \n") + total("0 KB") +
                    summary({}, nothing)));
}

TEST(memory, TypesAreNamed) {
  for (const std::uint32_t type : {3U, 0x80000000U, ~0U}) {
    EXPECT_EQ(count_of(report(arena("x", type, {})).out, "\n UNKNOWN arena:  x\n"), 1U) << type;
  }
  std::vector<bytes> regions;
  for (std::uint32_t type = 0; type < 12; ++type) regions.push_back(region("r", type, type));
  const std::string out = report(arena("x", 0, regions) + arena("x", 0, {region("r", ~0U, 99)})).out;
  for (const char *name :
       {"\n SCHEMA region:", "|\n   RING region:", "|\n    BUF region:", "|\n    MDU region:",
        "|\n    USD region:", "|\n USTATS region:", "|\nFLOWADV region:", "|\nNEXUSADV region:",
        "|\nSYSCTLS region:", "|\n    MDK region:", "|\n    KSD region:", "|\n KSTATS region:",
        "=\nUNKNOWN region:"}) {
    EXPECT_EQ(count_of(out, name + std::string("  r\n")), 1U) << name << "\n" << out;
  }
}

// Requested and effective count and size, segments in use.
TEST(memory, ProductsWrapBeforeTheyAreCompared) {
  constexpr std::uint64_t half = 1ULL << 32, top = 1ULL << 63;
  struct {
    std::uint64_t count, size, effective_count, effective_size, in_use;
    const char *inflation, *occupancy;
  } const cases[] = {
      {1, 4, 1, 1, 5, "(-75.00% ", "(500.00% "},     {1, top, 3, top, top, "(0.00% ", "(0.00% "},
      {half, half, 1, 1, 0, "(inf% ", "(0.00% "},    {half, half, half, half, 0, "(-nan% ", "(0.00% "},
      {0, 9, 9, 9, top + 1, "(0.00% ", "(100.00% "}, {top, 0, 9, 9, 1, "(0.00% ", "(100.00% "},
  };
  for (const auto &[count, size, effective_count, effective_size, in_use, inflation, occupancy] : cases) {
    bytes record = region("r", 0, 1).u64(112, size).u64(120, count).u64(128, effective_size);
    const std::string out = report(arena("a", 0, {record.u64(136, effective_count).u64(176, in_use)})).out;
    const auto line = out.find(" objs cnt*size:");
    EXPECT_NE(out.substr(line, out.find('\n', line) - line).find(inflation), out.npos) << out;
    EXPECT_NE(out.find(occupancy + std::string("in use)")), out.npos) << out;
  }
}

TEST(memory, SummaryCountsEachRegionOnceAsItAppearedFirst) {
  const std::string first =
      arena("a", 0, {region("r", 2, 7, 1'572'864, 1'000'000), region("", 4, 0, 2047).u64(104, 0)});
  const std::string again =
      arena("b", 0, {region("r", 3, 7, 9'999'999, 9'999'999), region("", 5, 0, 1 << 20)});
  const std::vector<bytes> odd = {region("r", 12, 8, 1 << 20), region("r", ~0U, 9, 1 << 20, 1 << 20)};
  EXPECT_EQ(summary_of(first + again + arena("c", 0, odd)),
            summary({{2, "     1536 KB        976 KB"}, {4, "        1 KB          0 KB"}},
                    " 1.50 MB       0.95 MB"));
  EXPECT_EQ(summary_of(again + first),
            summary({{3, "     9765 KB       9765 KB"}, {5, "     1024 KB          0 KB"}},
                    "10.54 MB       9.54 MB"));
}

TEST(memory, SummaryHoldsAnyNumberOfRegions) {
  std::string table;
  for (std::uint64_t i = 0; i < 250; ++i) {
    std::vector<bytes> regions;
    for (std::uint64_t slot = 0; slot < 12; ++slot)
      regions.push_back(region("", 11, 1 + 12 * i + slot, 1024).u64(104, 0));
    table += arena("", 0, regions);
  }
  EXPECT_EQ(summary_of(table + table),
            summary({{11, "     3000 KB          0 KB"}}, " 2.93 MB       0.00 MB"));
}

TEST(memory, SummaryRemembersTheRegionsOfEarlierRuns) {
  kernel_dir kernel;
  kernel.table(arena_list, arena("a", 0, {region("r", 0, 1, 1024)}));
  const auto meanwhile = [&, interrupt = interrupt_after(2, "MB\n")](const running &run) {
    if (count_of(run.out, "MB\n") == 1)
      kernel.table(arena_list, arena("a", 0, {region("r", 1, 1, 5120), region("s", 0, 2, 2048, 1024)}));
    interrupt(run);
  };
  const run_result result = run_tarvelctl(kernel, "memory -w 1", {.meanwhile = meanwhile});
  EXPECT_EQ(count_of(result.out, summary({{0, "        1 KB          0 KB"}}, nothing)), 1U) << result.out;
  EXPECT_TRUE(result.out.ends_with(total("7 KB (wired 1 KB)") +
                                   summary({{0, "        3 KB          1 KB"}}, nothing)))
      << result.out;
}

}  // namespace
