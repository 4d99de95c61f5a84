// flow, flow-adv, flow-owner, flow-route.

#include <gtest/gtest.h>

#include <climits>
#include <functional>

#include "tests/support/records.h"

namespace {

constexpr char other_nexus[] = "00112233-4455-6677-8899-AABBCCDDEEFF";

constexpr std::string_view loopback4("\x7f\x00\x00\x01", 4);
constexpr std::string_view local6("\xfe\x80\xfe\x4d\0\0\0\0\0\0\0\0\0\0\0\x01", 16);  // on interface 65101
constexpr std::string_view long_local6("\xfe\xbf\xfe\x4d\x11\x11\x22\x22\x33\x33\x44\x44\x55\x55\x66\x66",
                                       16);
constexpr std::string_view long6("\xfd\x11\x11\x11\x22\x22\x33\x33\x44\x44\x55\x55\x66\x66\x77\x77", 16);

std::string padded(std::string text, std::size_t width) {
  if (text.size() < width) text.resize(width, ' ');
  return text;
}

run_result list(const std::string &table, const words &line, const std::string &contents) {
  return run_on("kern.tarvel.stats." + table, contents, line);
}

// flow

const std::string flow_header =
    "Proto Local Address                               Remote Address                              "
    "InBytes      OutBytes     InPackets  OutPackets SvC NetIf    Port Adv Flags          "
    "Local State  Remote State Local RTT  Remote RTT Bkt Process.PID\n";

// Something different in each member, and the wrong family in the remote address.
bytes full_flow(int family, std::uint8_t protocol) {
  bytes record = flow(42);
  endpoint(record, 80, family, 443, loopback4, local6);
  endpoint(record, 108, 32 - family, 0, any4, long6);
  record.text(16, "en0").u32(32, 17).text(36, "curl").u32(72, 0x80000010).u32(76, 5).u8(136, protocol);
  record.u32(140, 0x400180).u32(144, 3).u64(152, 1000).u64(160, 10).u32(168, 4).u32(172, 1500);
  return record.u64(216, 0xFFFFFFFFFFFFFFFF).u64(224, 20).u32(232, 22).u32(236, 20250);
}

const std::string full_row_behind_addresses =
    " 18446744073709551615 1000         20         10        "
    " VO  en0      5    3   t-----------r "
    " ESTABLISHED  MULTIPLE    "
    "   1.50 ms    20.25 ms 17  curl.42\n";

std::string full_row(const std::string &protocol, const std::string &local, const std::string &remote) {
  return protocol + padded(local, 43) + " " + padded(remote, 43) + " " + full_row_behind_addresses;
}

const std::string numeric_row = full_row(" tcp4 ", "127.0.0.1.443 ", "*.* ");

// The columns of a row, those of a record of zeros unless stated.
struct row {
  std::string protocol = "unk.", service_class = " BE ", interface = "         ";
  std::string indexes = " 0    0  ", flags = " ------------- ", states = " CLOSED       CLOSED      ";
  std::string times = "                      ", bucket = " 0  ", process = " ";

  std::string text(int pid) const {
    return protocol + " 0            0            0          0         " + service_class + interface +
           indexes + flags + states + times + bucket + process + "." + std::to_string(pid) + "\n";
  }
};

TEST(flow, PrintsEveryColumn) {
  EXPECT_EQ(list("flow", "flow", full_flow(2, 6) + full_flow(30, 17) + full_flow(10, 1)),
            printed(flow_header + numeric_row +
                    full_row(" udp6 ", "fe80::1%65101.443", "fd11:1111:2222:3333:4444:5555:6666:77.*") +
                    "unk." + full_row_behind_addresses));
}

TEST(flow, NamesAndPlaceholders) {
  const std::string process = " 0123456789abcdef0123456789ABCDEF";
  std::vector<std::pair<bytes, row>> cases = {
      {flow(), {}},
      {flow().u32(72, 0x30FFCC8F), {}},
      {flow().u32(72, 0xFFFFFFFF), {.flags = " tclqbweandoxr "}},
      {flow().u32(72, 0x45001120), {.flags = " -c-q-w-a-d-x- "}},
      {flow().u32(76, 0xFFFFFFFF).u32(144, 0xFFFFFFFE), {.indexes = " -    4294967294"}},
      {flow().u32(76, 0xFFFFFFFE).u32(144, 0xFFFFFFFF), {.indexes = " 4294967294 -  "}},
      {flow().u32(32, 0xFFFFFFFF), {.bucket = " -  "}},
      {flow().text(16, process.substr(1, 16)), {.interface = " 0123456789abcdef"}},
      {flow().text(36, process.substr(1)), {.process = process}},
      // In single precision 0.00499..., 0.245000005..., 4294967.5.
      {flow().u32(172, 5), {.times = "   0.00 ms            "}},
      {flow().u32(236, 245), {.times = "               0.25 ms"}},
      {flow().u32(172, 0xFFFFFFFF), {.times = "4294967.50 ms            "}},
  };
  const std::pair<std::uint32_t, const char *> classes[] = {
      {0x080090, " BKS"}, {0x100080, " BK "}, {0x180010, " RD "}, {0x200020, " OAM"}, {0x280120, " AV "},
      {0x300110, " RV "}, {0x380100, " VI "}, {0x480190, " CTL"}, {0x1400180, " UNK"}};
  for (const auto &[value, label] : classes)
    cases.push_back({flow().u32(140, value), {.service_class = label}});
  const std::pair<std::uint32_t, const char *> states[] = {
      {0, "CLOSED"},     {1, "LISTEN"},          {2, "SYN_SENT"},    {3, "SYN_RCVD"},   {5, "CLOSE_WAIT"},
      {6, "FIN_WAIT_1"}, {7, "CLOSING"},         {8, "LAST_ACK"},    {9, "FIN_WAIT_2"}, {10, "TIME_WAIT"},
      {11, "UNKNOWN"},   {19, "UNKNOWN"},        {20, "NO_TRAFFIC"}, {21, "SINGLE"},    {22, "MULTIPLE"},
      {23, "UNKNOWN"},   {0xFFFFFFFF, "UNKNOWN"}};
  for (std::size_t i = 1; i < std::size(states); ++i) {
    cases.push_back({flow().u32(168, states[i].first).u32(232, states[i - 1].first),
                     {.states = std::string(" ").append(padded(states[i].second, 12)) + " " +
                                padded(states[i - 1].second, 12)}});
  }

  std::string table, report = flow_header;
  for (int pid = 0; auto &[record, expected] : cases) {
    table += record.u32(68, static_cast<std::uint32_t>(pid));
    report += expected.text(pid++);
  }
  EXPECT_EQ(list("flow", "flow", table), printed(report));
}

TEST(flow, IsSortedByProcessIdOverTheWholeRange) {
  std::string table, report = flow_header;
  for (const int pid : {300, INT_MAX, -1, 25, INT_MIN, 0, 1 << 16, -300}) table += flow(pid);
  for (const int pid : {INT_MIN, -300, -1, 0, 25, 300, 1 << 16, INT_MAX}) report += row{}.text(pid);
  EXPECT_EQ(list("flow", "flow", table), printed(report));
}

TEST(netstat_flow, ResolvesNamesUnlessNumerical) {
  const std::string named_row = full_row(" tcp4 ", "localhost.https ", "*.* ");
  const std::pair<const char *, std::string> cases[] = {
      {"flow -n", numeric_row},     {"flow x -nn -- -x", numeric_row},
      {"netstat -a", named_row},    {"netstat --flow", named_row},
      {"netstat -na", numeric_row}, {"netstat --flow --numerical", numeric_row}};
  for (const auto &[line, row] : cases)
    EXPECT_EQ(list("flow", line, full_flow(2, 6)), printed(flow_header + row)) << line;
  EXPECT_EQ(list("flow", "netstat -a", full_flow(2, 1)),
            printed(flow_header + full_row("unk.4 ", "localhost.443 ", "*.* ")));
}

TEST(netstat_flow, EveryWatchRunSeesTheWordsAsTyped) {
  const std::string complaint = "netstat: option requires an argument -- 'p'\n";
  const std::string report = "\n<time>\n" + flow_header + numeric_row;
  const run_result result = run_on(flow_list, full_flow(2, 6), "netstat -a -n x -p -w 1",
                                   {.meanwhile = interrupt_after(2, numeric_row)});
  EXPECT_EQ(complained(result.err, result.status, hide_times(result.out)),
            complained(complaint + complaint, 0, report + report));
}

// flow-adv

bytes advisories(int pid, std::uint32_t count, const char *uuid = mixed_uuid) {
  return bytes(40).uuid(0, uuid).text(16, "en0").u32(32, static_cast<std::uint32_t>(pid)).u32(36, count);
}
bytes advisory(std::uint32_t flags) {
  return bytes(20).uuid(0, other_nexus).u32(16, flags);
}

std::string advisory_heading(const std::string &process, const std::string &uuid = mixed_uuid) {
  return " - " + process + "\n\tNexus UUID: " + uuid +
         "\n\tNetif     : en0\n\tFlowAdvIdx               Flow UUID                 Flags\n";
}
std::string advisory_line(const std::string &index, const std::string &flags) {
  return "\t    [" + index + "] : " + other_nexus + " flags=" + flags + "\n";
}

const std::string one_advisory = advisories(42, 1) + advisory(1);
const std::string one_block = advisory_heading("curl.42") + advisory_line("  0", "1<VALID>");

TEST(flow_adv, PrintsABlockForEachNexus) {
  EXPECT_EQ(
      list("flow_adv", "flow-adv --pid 1",
           advisories(43, 0) + one_advisory + advisories(-7, 3, other_nexus) + advisory(3) +
               advisory(0x80000006) + advisory(0xC)),
      printed(advisory_heading("<unknown>.43") + one_block + advisory_heading("<unknown>.-7", other_nexus) +
              advisory_line("  0", "3<VALID,CONTROLLED>") + advisory_line("  1", "80000006<CONTROLLED>") +
              advisory_line("  2", "c<>")));
}

TEST(flow_adv, MoreThan512EntriesFailBehindTheTitles) {
  std::string entries, block = advisory_heading("curl.42");
  for (int i = 0; i < 512; ++i) {
    const std::string index = std::to_string(i);
    block += advisory_line(std::string(3 - index.size(), ' ').append(index), "0<>");
    entries += advisory(0);
  }
  EXPECT_EQ(list("flow_adv", "flow-adv", advisories(42, 512) + entries + one_advisory),
            printed(block + one_block));
  const std::string table = one_advisory + advisories(43, 513) + entries + advisory(0) + one_advisory;
  EXPECT_EQ(list("flow_adv", "flow-adv", table),
            inconsistent("__tv_stats_flow_adv_print", 729, "sfa->sfa_entries_count <= 512",
                         one_block + advisory_heading("<unknown>.43")));
  EXPECT_EQ(list("flow_adv", "netstat --flow-adv --pid 42", table), printed(one_block + one_block));
}

TEST(flow_adv, CountsThatLieAreNotFollowed) {
  // In 32 bits the last ones are -16, -20 and 20 bytes.
  for (const std::uint32_t count : {0U, 2U, 513U, 0xCCCCCCCCU, 0xFFFFFFFFU, 0x40000001U}) {
    const std::string heading = count == 0 ? advisory_heading("curl.42") : "";
    EXPECT_EQ(list("flow_adv", "flow-adv", one_advisory + advisories(42, count) + advisory(0)),
              inconsistent("cmd_flow_adv", 766, "scan == (buffer + length)", one_block + heading))
        << count;
  }
}

// flow-owner

bytes owner(int pid, const char *uuid = mixed_uuid) {
  bytes record = bytes(128).uuid(0, uuid).text(16, "en0").u32(32, 7).text(36, "curl").u32(72, 3);
  return unread(record, 84, 44).u32(68, static_cast<std::uint32_t>(pid));
}

const std::string owner_header = "NetIf     Port   Property              Bkt  Process\n";

std::string owner_row(int pid) {
  return "en0       3                            7    curl(" + std::to_string(pid) + ")\n";
}

TEST(flow_owner, PrintsARowForEachInTheOrderOfTheTable) {
  const bytes full = owner(1).text(16, "0123456789abcdef").u32(32, 0xFFFFFFFF).text(36, std::string(32, 'p'));
  EXPECT_EQ(list("flow_owner", "flow-owner x",
                 owner(42).u32(76, 0x100) + owner(-1).u32(80, 2) + owner(42) +
                     bytes(full).u32(72, 0xFFFFFFFF).u32(76, 1).u32(80, 1)),
            printed(owner_header +
                    "en0       3      PID-Bound             7    curl(42)\n"
                    "en0       3                 Destroyed  7    curl(-1)\n" +
                    owner_row(42) + "0123456789abcdef  4294967295  PID-Bound  Destroyed  4294967295  " +
                    std::string(32, 'p') + "(1)\n"));
}

// flow-route

const std::string route_header =
    "Local Address                            Remote Address                           "
    "Gateway Address                          MAC Address          NetIf   Refs Expire  bidx ibidx  Flags\n";

// From here to anywhere by a long way. Only the remote family is right.
bytes route(int family, std::uint32_t flags) {
  bytes record = bytes(256).text(32, "en0").u32(48, 4).u32(52, 5).u32(56, flags).u32(60, 6);
  unread(unread(unread(record, 0, 32), 156, 36), 198, 58);
  endpoint(record, 72, 32 - family, 443, loopback4, long_local6);
  endpoint(record, 100, family, 443, any4, any6);
  endpoint(record, 128, 32 - family, 443, loopback4, long_local6);
  return record.u64(64, 0xFFFFFFFFFFFFFFFF).text(192, std::string_view("\x02\x00\x5e\xff\x0a\x01", 6));
}

std::string route_row(const std::string &local, const std::string &gateway, const std::string &link_address,
                      const std::string &flags, const std::string &remote = "*") {
  return padded(local, 40) + " " + padded(remote, 40) + " " + padded(gateway, 40) + " " +
         padded(link_address, 17) + "      en0      6     -1     4     5  " + flags + "\n";
}

TEST(flow_route, PrintsARowForEachInTheOrderOfTheTable) {
  const std::string mac = "02:00:5e:ff:0a:01";
  const std::string local = "febf:0:1111:2222:3333:4444:5555:6666%651";  // the gateway is two digits longer
  bytes full = route(9, 0).text(32, "0123456789abcdef").u32(48, 0xFFFFFFFF).u32(52, 0xFFFFFFFE);
  full.u32(60, 0x80000000).u64(64, 0x8000000000000000);
  EXPECT_EQ(list("flow_route", "flow-route -n",
                 route(30, 0x1F0) + route(2, 0xFFFFFE0F) + route(2, 0x120) + route(30, 0xC0) +
                     route(9, 0xB0) + full),
            printed(route_header + route_row(local, local + "01", mac, "ogrid") +
                    route_row("127.0.0.1", "-", "-", "-----") +
                    route_row("127.0.0.1", "127.0.0.1", "-", "-g--d") + route_row(local, "-", mac, "--ri-") +
                    " " + mac + "      en0      6     -1     4     5  og-i-\n" +
                    " -                 0123456789abcdef 2147483648 -9223372036854775808 4294967295 "
                    "4294967294  -----\n"));
}

TEST(flow_listings, OnlyIpv6NamesAreCutToTheirColumnsAndNoGateways) {
  const std::string name(300, 'n'), host = name.substr(0, 33) + ".", address6 = name.substr(0, 40);
  const run_options named{.environment = {{"LD_PRELOAD", NAME_SERVICES},
                                          {"ASAN_OPTIONS", "verify_asan_link_order=0"},
                                          {"NAME_SERVICES_ANSWER", name}}};
  const auto to_a_host = [](bytes record, std::size_t remote, int family) {
    return endpoint(record, remote, family, 80, loopback4, long6);
  };
  const std::string local4 = host + name.substr(0, 15) + " ", local6_cut = host + name.substr(0, 9);
  const std::string flows = to_a_host(full_flow(2, 6), 108, 2) + to_a_host(full_flow(30, 6), 108, 30);
  EXPECT_EQ(
      run_on(flow_list, flows, "netstat -a", named),
      printed(flow_header + full_row(" tcp4 ", local4, local4) + full_row(" tcp6 ", local6_cut, local6_cut)));
  const std::string address4 = name.substr(0, 255), gateway6 = name.substr(0, 49);
  const std::string routes = to_a_host(route(2, 0x20), 100, 2) + to_a_host(route(30, 0x20), 100, 30);
  EXPECT_EQ(run_on("kern.tarvel.stats.flow_route", routes, "flow-route", named),
            printed(route_header + route_row(address4, address4, "-", "-g---", address4) +
                    route_row(address6, gateway6, "-", "-g---", address6)));
}

// Those that netstat filters

struct listing {
  std::string table, command, header;
  std::function<std::string(int pid, const char *uuid)> record, row;
};

const listing listings[] = {
    {"flow", "flow", flow_header, flow, [](int pid, auto) { return row{}.text(pid); }},
    {"flow_adv", "flow-adv", "", [](int pid, auto uuid) { return advisories(pid, 1, uuid) + advisory(0); },
     [](int pid, auto uuid) {
       return advisory_heading(pid == 42 ? "curl.42" : "<unknown>.43", uuid) + advisory_line("  0", "0<>");
     }},
    {"flow_owner", "flow-owner", owner_header, owner, [](int pid, auto) { return owner_row(pid); }},
};

TEST(flow_listings, AreFilteredUnderNetstat) {
  for (const auto &[table, command, header, record, row_of] : listings) {
    const std::string contents = record(42, mixed_uuid) + record(42, other_nexus) + record(43, mixed_uuid);
    const std::string line = "netstat --" + command;
    const std::string by_nexus = line + " --uuid " + mixed_uuid;
    EXPECT_EQ(list(table, line + " --pid 42", contents),
              printed(header + row_of(42, mixed_uuid) + row_of(42, other_nexus)));
    EXPECT_EQ(list(table, by_nexus, contents),
              printed(header + row_of(42, mixed_uuid) + row_of(43, mixed_uuid)));
    EXPECT_EQ(list(table, by_nexus + " --pid 43", contents), printed(header + row_of(43, mixed_uuid)));
    EXPECT_EQ(list(table, line + " --pid x", contents), printed(header));
  }
}

}  // namespace
