// netns: one port namespace, or all of them.

#include <gtest/gtest.h>

#include <algorithm>

#include "tests/support/records.h"

namespace {

constexpr char namespaces[] = "kern.tarvel.stats.netns";
constexpr std::string_view v4("\x0A\0\0\x01", 4);                             // 10.0.0.1
constexpr std::string_view v6("\xFE\x80\0\0\0\0\0\0\0\0\0\0\0\0\0\x01", 16);  // fe80::1
constexpr std::uint8_t tcp = 6, udp = 17;

struct range {
  std::uint16_t first, last;
  std::uint32_t tarvel, bsd, listener;
};

// The namespace of an address in network byte order; the global one has none.
bytes space(std::string_view address, std::uint8_t protocol, const std::vector<range> &ranges = {}) {
  bytes record(32 + 32 * ranges.size());
  record.text(0, address).u8(16, static_cast<std::uint8_t>(address.size())).u8(17, protocol).u64(19, ~0ULL);
  record.u8(18, static_cast<std::uint8_t>(ranges.size()));
  for (std::size_t at = 32; const range &ports : ranges) {
    record.u16(at, ports.first).u16(at + 2, ports.last).u32(at + 4, ports.tarvel).u32(at + 8, ports.bsd);
    record.u32(at + 12, ~0U).u32(at + 16, ports.listener).u64(at + 20, ~0ULL);
    at += 32;
  }
  return record;
}

// A report, from its protocol and address and its rows.
std::string reservations(const std::string &of, const std::string &rows = "") {
  const auto blank = of.find(' ');
  return of.substr(0, blank) + " port reservations for " + of.substr(blank + 1) +
         "\n    PORT(S)     TARVEL        BSD   LISTENER\n" + rows +
         "--------------------------------------------\n";
}

const std::string rows =
    "49152-65535          1         -1          3\n"
    "         53          0 -2147483648          2\n"
    "        2-1          0          0          0\n"
    "          0 1234567890          0          0\n";
const std::vector<range> ranges = {
    {49152, 65535, 1, ~0U, 3}, {53, 0, 0, 0x80000000, 2}, {2, 1, 0, 0, 0}, {0, 0, 1234567890, 0, 0}};

// Namespaces that differ in one thing each, the one that is found with rows of its own.
const std::string table = space(std::string_view("\x0A\0\0\x01\0\0\0", 7), tcp) + space("", 200) +
                          space("", udp, {{2, 0, 0, 0, 0}}).text(0, v6) + space("", tcp, ranges) +
                          space(std::string(v4) + std::string(12, '\0'), tcp) + space(v4, udp) +
                          space(v4, tcp, {{6, 0, 0, 0, 0}}) + space(v4, tcp) +
                          space(v6, udp, {{8, 0, 0, 0, 0}});

std::string port_row(const std::string &port) {
  return "          " + port + "          0          0          0\n";
}
const std::string global_udp = reservations("udp global namespace", port_row("2"));
const std::string global_tcp = reservations("tcp global namespace", rows);
const std::string v4_udp = reservations("udp 10.0.0.1");
const std::string v4_tcp = reservations("tcp 10.0.0.1", port_row("6"));
const std::string v6_udp = reservations("udp fe80::1", port_row("8"));
const std::string all = reservations("tcp global namespace") + reservations("tcp global namespace") +
                        global_udp + global_tcp + reservations("tcp a00:1::") + v4_udp + v4_tcp +
                        reservations("tcp 10.0.0.1") + v6_udp;

// In the command line, '' is an empty word.
run_result report(const std::string &from, words line) {
  std::replace(line.begin(), line.end(), std::string("''"), std::string());
  return run_on(namespaces, from, line);
}

TEST(netns, AllShowsEveryNamespaceInTableOrder) {
  for (const char *line :
       {"netns -a", "netns --all", "netns x -a -p icmp -i localhost", "netns -a -i 10.0.0"}) {
    EXPECT_EQ(report(table, line), printed(all)) << line;
  }
  const std::string warning = "WARNING: With -a, any further namespace specifiers are ignored\n";
  for (const char *line :
       {"netns -a -p udp", "netns -i 10.0.0.2 -a", "netns -ai global", "netns -i :: --all"}) {
    EXPECT_EQ(report(table, line), printed(warning + all)) << line;
  }
}

TEST(netns, ShowsTheNamespaceThatIsNamed) {
  const struct {
    std::string expected;
    std::vector<const char *> lines;
  } cases[] = {
      {global_tcp, {"-i global -p tcp", "-i global -i 10.0.0.1 -p tcp", "-i global -i localhost -p tcp"}},
      {global_udp, {"-p udp -i global", "-i 10.0.0.1 -i global -p udp"}},
      {v4_udp, {"x --ip=10.0.0.1 --proto udp", "-i fe80::1 -i 10.0.0.1 -p udp", "-i 10.0.0.1 -p tcp -p udp"}},
      {v4_udp, {"-i 10.0.0.1 -p udp -p icmp", "-i localhost -i 10.0.0.1 -p udp"}},
      {v4_tcp, {"-i 10.0.0.1 -p tcp"}},
      {v6_udp, {"-i FE80:0:0:0:0:0:0:1 -p udp", "-i 10.0.0.1 -i fe80::1 -p udp"}},
      {reservations("tcp a00:1::"), {"-i a00:1:: -p tcp"}},
  };
  for (const auto &[expected, lines] : cases) {
    for (const char *line : lines)
      EXPECT_EQ(report(table, "netns " + std::string(line)), printed(expected)) << line;
  }
}

// What fails ends the watch loop, too.
TEST(netns, FailuresEndWithTheirText) {
  const run_result no_address = printed("Specify -a or a valid IP address\n");
  const run_result no_protocol = printed("Specify -a or a valid L4 protocol name\n");
  const std::string options = "\n\t[--all, -a ]\n\t[--ip, -i <ip> ]\n\t[--proto, -p <proto> ]\n";
  const auto refused = [&](const std::string &reason) { return complained("netns: " + reason + options); };
  const struct {
    run_result expected;
    std::vector<const char *> lines;
  } cases[] = {
      {no_address,
       {"", "-p udp", "-p udp -i localhost", "-p udp -i Global", "-p udp -i global.", "-p udp -i ''"}},
      {no_address,
       {"-p udp -i 10.0.0", "-p udp -i ::g", "-p udp -i 10.0.0.1:80", "-p udp -i fe80::1 -i 10.0.0"}},
      {no_protocol, {"-i 10.0.0.1", "-i 10.0.0.1 -p icmp", "-i global -p UDP", "-i fe80::1 -p udp6"}},
      {printed(""), {"-i 10.0.0.2 -p tcp", "-i fe80::1 -p tcp", "-i fe80::2 -p udp"}},
      {refused("invalid option -- 'x'"), {"-x -a"}},
      {refused("option '--proto' requires an argument"), {"-a --proto"}},
  };
  for (const auto &[expected, lines] : cases) {
    for (const char *line : lines) {
      EXPECT_EQ(report(table, "netns " + std::string(line)), expected) << line;
      const run_result watched = report(table, "-w 60 netns " + std::string(line));
      EXPECT_EQ(hide_times(watched.out), "\n<time>\n" + expected.out) << line;
    }
  }
}

}  // namespace
