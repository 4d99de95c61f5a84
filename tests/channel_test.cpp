// channel: the listing, the ring table, the watch loop of its own.

#include <gtest/gtest.h>

#include <chrono>

#include "tests/support/records.h"

namespace {

constexpr char ring_switch[] = "kern.tarvel.ring_stat_enable";
constexpr char channel_p[] = "01010101-0000-0000-0000-000000000001";
constexpr char channel_q[] = "02020202-0000-0000-0000-000000000002";
constexpr char channel_r[] = "03030303-0000-0000-0000-000000000003";

// The totals of one of the two halves of a ring, at 8 its transfers, at 88 its syncs.
struct totals {
  std::uint64_t slots, bytes, count;
};

bytes ring(std::uint32_t id, const totals &xfer = {}, const totals &sync = {}) {
  bytes block(184);
  block.u32(0, id).u32(4, ~0U).u64(64, ~0ULL).u64(144, ~0ULL).u64(176, ~0ULL);
  block.u64(8, xfer.slots).u64(16, xfer.bytes).u64(24, xfer.count);
  return block.u64(88, sync.slots).u64(96, sync.bytes).u64(104, sync.count);
}

const std::string once_header =
    "Ring            Bytes/s  average        Bytes  Slots/s  average        Slots  Min  Avg  Max\n"
    " Mem Use/Total    /sync                 Bytes    /sync                 Slots               \n";
const std::string watch_header =
    "Ring            Bytes/s  average    delta  Slots/s  average    delta  Min  Avg  Max   Xfer/s\n"
    " Mem Use/Total    /sync                      /sync                                    Sync/s\n";

std::string port_line(const std::string &port) {
  return "\tPort[" + port + "] curl.42                (fd 5)\t\n";
}

// With process 42, and ring statistics on.
class channel_command : public testing::Test {
 protected:
  channel_command() { kernel.process(42, "curl\n").table(ring_switch, "\x80"); }

  run_result list(const std::string &table, const words &line = "channel", const run_options &options = {}) {
    kernel.table(channel_list, table);
    return run_tarvelctl(kernel, line, options);
  }

  kernel_dir kernel;
};

TEST_F(channel_command, ListsNexusesChannelsAndRings) {
  bytes tx = ring(0, {.slots = 23, .bytes = ~0ULL, .count = 4}, {.slots = 7, .bytes = 12, .count = 0});
  tx.u32(32, 1).u32(36, ~0U).u32(40, 999).u32(44, ~0U).u64(48, 999'999).u64(56, 1'500'000);
  tx.u64(72, 3 << 20).u64(80, 1536);
  tx.u32(112, 0x80000000).u32(116, 9999).u32(120, 1).u32(124, 2000).u64(128, 1000).u64(136, 1'000'000'000);
  tx.u64(152, 3);
  bytes rx = ring(~0U, {.slots = ~0ULL, .bytes = 0, .count = 1}, {.slots = 1999, .bytes = 1, .count = 1000});
  rx.u64(48, 1'000'000'000'000'000).u64(56, ~0ULL).u64(72, ~0ULL).u64(80, 1'234'567);
  rx.u64(128, 1'000'000'000'000).u64(152, 1'000'000).u64(160, 1).u64(168, 1500);
  const std::string unknown_owner = channel(channel_p, 2).u32(20, 77).u32(24, ~0U);
  const std::string flags = channel(channel_q, ~0U, 1, 1).u32(16, 0x8000007F);
  const std::string rows =
      R"(TX[0]          1000.00K    1.50M 18446744073709551615   999.00    4.29G           23    1    5   -1
     1.5KB/3MB    1.00K    1.00G           12     1.00    2.00K            7 -2147483648    0 9999
     Errors: Corrupted data: 3.00
RX[-1]         1000.00T 18446744.07T            0     0.00     0.00 18446744073709551615    0 18446744073709551615    0
1.17737MB/1.67772e+07TB    1.00T     0.00            1     0.00     0.00         1999    0    1    0
     Errors: Length modified: 1.00 Length too large: 1.50K Corrupted data: 1.00M

)";
  const std::string idle_rows =
      R"(RX[1]              0.00     0.00            0     0.00     0.00            0    0    0    0
           0/0     0.00     0.00            0     0.00     0.00            0    0    0    0

)";
  EXPECT_EQ(list(group(nexus_b, 0) + group(nexus_a, 3) + unknown_owner + flags + tx + rx +
                 channel(channel_p, 12, 0, 1) + ring(1)),
            printed("Instances: 2\n1. BBBBBBBB-0000-0000-0000-00000000000B\n"
                    "2. AAAAAAAA-0000-0000-0000-00000000000A\n"
                    "\tPort[ 2] <unknown>.77           (fd -1)\t\n\n"
                    "\tPort[4294967295] curl.42                (fd 5)\t flags=8000007f"
                    "<MON_TX,MON_RX,NO_COPY,USER_PACKET_POOL,DEFUNCT_OK,EXCLUSIVE,DEFUNCT>\n" +
                    once_header + rows + port_line("12") + idle_rows + "\n"));
}

TEST_F(channel_command, SwitchDecidesAboutRings) {
  std::string table;
  std::string ports = "Instances: 3\n";
  std::string failures;
  for (const char *number : {"1", "2", "3"}) {
    table += group(nexus_a, 5);
    ports += number + std::string(". ") + nexus_a + "\n";
    for (const char port : {'9', '1', '8', '2', '5'}) {
      table += channel(channel_p, static_cast<std::uint32_t>(port - '0'), 0, 1) + ring(0);
      ports += port_line({' ', port});
      failures += "failed to get channel stat, No such file or directory\n";
    }
  }
  EXPECT_EQ(count_of(list(table).out, once_header), 1U);
  kernel.table(ring_switch, std::string_view("\0", 1));
  EXPECT_EQ(list(table), printed(ports + "\n"));
  remove(kernel.table_path(ring_switch));
  EXPECT_EQ(list(table), complained(failures, 0, ports + "\n"));
}

TEST_F(channel_command, TableThatLiesHasNoChannels) {
  const run_result nothing = complained(too_short, 0, "No channels\n");
  const std::string first = group(nexus_a, 1) + channel(channel_p, 2);
  EXPECT_EQ(list(group(nexus_a, ~0U) + channel(channel_p, 2)), nothing);
  const std::pair<std::uint32_t, std::uint32_t> rings[] = {
      {~0U, 1}, {1, ~0U}, {0x80000000, 0x80000000}, {0x20000000, 0}, {~0U, ~0U}};
  for (const auto &[tx, rx] : rings)
    EXPECT_EQ(list(first + group(nexus_b, 1) + channel(channel_q, 3, tx, rx) + ring(0)), nothing) << tx;
}

// A line of a ring where all is 0 but what is given, each text with the blanks in front of it.
std::string watch_line(const std::string &title, const std::string &bytes = "     0.00",
                       const std::string &slots = "     0.00", const std::string &average = "    0",
                       const std::string &rate = "     0.00") {
  const std::string kernel_rates = "     0.00     0.00";
  return title + kernel_rates + bytes + kernel_rates + slots + "    0" + average + "    0" + rate + "\n";
}
const std::string idle_sync = watch_line("           0/0");

// How many listings are complete.
std::size_t listings(const running &run) {
  return count_of(run.out, "\n\n\n");
}

TEST_F(channel_command, WatchShowsWhatHappenedBetweenTwoSnapshots) {
  std::string before = group(nexus_a, 2) + channel(channel_p, 2, 3, 1) +
                       ring(3, {10, 1000, 100}, {1, 5, 2}).u64(168, 5) + ring(3, {20, 2400, 101}) + ring(5) +
                       ring(3, {0, 70, 0}) + channel(channel_r, 3, 20) + ring(90, {0, 60, 0}) + ring(90);
  for (std::uint32_t id = 18; id > 0; --id) before += ring(2 * id, {0, id, 0});
  const std::string after = group(nexus_b, 1) + channel(channel_q, 7, 1) + ring(3, {9, 9, 2}, {9, 9, 9}) +
                            group(nexus_a, 2) + channel(channel_p, 2, 2, 1) +
                            ring(3, {400, 2500, 105}, {1, 3, 5}).u64(168, 7) + ring(4, {8, 9, 2}) +
                            ring(3, {0, 75, 0}) + channel(channel_r, 3, 4) + ring(90, {0, 67, 0}) +
                            ring(7, {0, 9, 0}) + ring(4, {0, 11, 0}) + ring(91, {0, 9, 0});
  const auto meanwhile = [&, interrupt = interrupt_after(2, "\n\n\n")](const running &run) {
    if (listings(run) == 1) kernel.table(channel_list, after);
    interrupt(run);
  };
  const run_result result = list(before, "channel -w 2", {.meanwhile = meanwhile});
  EXPECT_EQ(count_of(result.out, "Instances: "), 2U) << result.out;
  EXPECT_EQ(result.out.substr(result.out.rfind("Instances: ")),
            "Instances: 2\n1. BBBBBBBB-0000-0000-0000-00000000000B\n" + port_line(" 7") + watch_header +
                watch_line("TX[3]         ", "     0.00", "     0.00", "    4") +
                watch_line("           0/0", "     0.00", "     0.00", "    1") +
                "\n2. AAAAAAAA-0000-0000-0000-00000000000A\n" + port_line(" 2") +
                watch_line("TX[3]         ", "    1.50K", "   390.00", "    3", "     2.00") +
                watch_line("           0/0", " 18446744.07T", "     0.00", "    0", "     1.00") +
                "     Errors: Length too large: 7.00\n" +
                watch_line("TX[4]         ", "     0.00", "     0.00", "    4") + idle_sync +
                watch_line("RX[3]         ", "     5.00") + idle_sync + "\n" + port_line(" 3") +
                watch_line("TX[90]        ", "     7.00") + idle_sync + watch_line("TX[7]         ") +
                idle_sync + watch_line("TX[4]         ", "     9.00") + idle_sync +
                watch_line("TX[91]        ") + idle_sync + "\n\n");
}

TEST_F(channel_command, WatchStartsAnewAfterTheTableWasAway) {
  const std::string head = group(nexus_a, 1) + channel(channel_p, 2, 1);
  const auto meanwhile = [&, interrupt = interrupt_after(2, "\n\n\n")](const running &run) {
    const std::size_t failures = count_of(run.err, "\n");
    if (listings(run) == 1 && failures < 2) remove(kernel.table_path(channel_list));
    if (listings(run) == 1 && failures == 2) kernel.table(channel_list, head + ring(0, {0, 50, 0}));
    interrupt(run);
  };
  const auto start = std::chrono::steady_clock::now();
  const run_result result = list(head + ring(0), "channel -w 1", {.meanwhile = meanwhile});
  // The first snapshots before and after are only looked at.
  EXPECT_GE(std::chrono::steady_clock::now() - start, std::chrono::seconds(5));
  const std::string listing = "Instances: 1\n1. AAAAAAAA-0000-0000-0000-00000000000A\n" + port_line(" 2") +
                              watch_header + watch_line("TX[0]         ") + idle_sync + "\n\n";
  EXPECT_EQ(hide_times(result.out), "\n<time>\n" + listing + "No channels\n" + listing);
  EXPECT_EQ(complained(result.err, result.status), complained(missing + missing));
}

}  // namespace
