// tree; show, also called channel-stats.

#include <gtest/gtest.h>

#include <algorithm>
#include <cstdlib>

#include "tests/support/records.h"

namespace {

constexpr char provider_p[] = "FFFFFFFF-0000-0000-0000-00000000000F";
constexpr char nowhere[] = "EEEEEEEE-0000-0000-0000-00000000000E";
constexpr char channel_c[] = "CCCCCCCC-0000-0000-0000-00000000000C";

// Anonymous, its name taken for 4 characters long.
std::string listed(std::string_view name, std::uint32_t type, std::uint32_t subtype,
                   const std::vector<const char *> &instances) {
  return provider(provider(name, type, subtype).uuid(0, provider_p).u32(128, 4).u32(144, 3), instances);
}

// With a transmit ring.
bytes port(std::uint32_t number, const char *uuid = channel_c, std::uint32_t flags = 0) {
  return channel(uuid, number, 1, 0, 1).u32(16, flags);
}

// From 10.0.0.1 for family 2, else from fe80::1; to an address of zeros.
bytes flow_of(const char *nexus, std::uint32_t port, int family, std::uint16_t remote_port = 0) {
  bytes record = flow(0, nexus).u32(76, port);
  endpoint(record, 80, family, 443, {"\x0A\0\0\x01", 4}, {"\xFE\x80\0\0\0\0\0\0\0\0\0\0\0\0\0\x01", 16});
  return endpoint(record, 108, 2, remote_port, any4, any6);
}

// The lines of one nesting level, each line end a bar.
std::string at(std::size_t level, const std::string &lines) {
  const std::string indent(3 * level, ' ');
  std::string text = indent;
  for (const char letter : lines) text += letter == '|' ? "\n" + indent : std::string(1, letter);
  return text + "\n";
}

// All values of a member in a dump, a blank behind each.
std::string values(const std::string &dump, const std::string &member) {
  std::string found;
  const std::string key = '"' + member + "\":";
  for (auto from = dump.find(key); from != dump.npos; from = dump.find(key, from)) {
    from += key.size();
    found += dump.substr(from, dump.find(',', from) - from) + " ";
  }
  return found;
}

class tree : public testing::Test {
 protected:
  tree() {
    kernel.process(42, "curl\n").table(channel_list, "").table(flow_list, "");
    kernel.table(provider_list, listed("wifi", 2, 1, {nexus_a, nexus_b}));
  }

  run_result run(const words &line = "tree", const run_options &options = {}) {
    return run_tarvelctl(kernel, line, options);
  }

  // With a defunct channel that has a flow of each family.
  void make_one_of_each() {
    bytes v4 = flow_of(nexus_a, 2, 2, 51000).text(16, "en0").text(36, "cli").u32(68, ~0U).u32(72, 0x80000010);
    v4.u8(136, 6).u64(152, ~0ULL).u64(160, 2).u32(168, 4).u64(216, 3).u64(224, 4).u32(232, 10);
    kernel.table(channel_list, group(nexus_a, 1) + port(2, channel_c, 0x80000001));
    kernel.table(flow_list, v4 + flow_of(nexus_a, 2, 30).u8(136, 17).u32(168, 20).u32(232, 23) +
                                flow_of(nexus_a, 2, 10));
  }

  kernel_dir kernel;
};

using show = tree;

TEST_F(tree, DumpsEveryKindOfObjectFromTheOneThatIsNamed) {
  make_one_of_each();
  kernel.table(provider_list, listed("wifiX", 2, 1, {nexus_a, nexus_b}) + listed("a\"\\", 9, 1, {}));
  const std::string unnamed = R"({|"uuid":"00000000-0000-0000-0000-000000000000",|"type":)";
  const std::string a_provider =
      R"({|"uuid":"FFFFFFFF-0000-0000-0000-00000000000F",|"type":"nexus_provider",|"name":)";
  const std::string parameters =
      R"("flags":3,|"anonymous":true,|"format":148,|"tx_rings":152,|"rx_rings":156,|"tx_slots":160,|)"
      R"("rx_slots":164,|"buf_size":168,|"meta_size":172,|"pipes":180,|"mhints":188,|"ifindex":192,|)"
      R"("children": [)";
  const std::string nexus =
      R"({|"uuid":"BBBBBBBB-0000-0000-0000-00000000000B",|"type":"nexus",|"children": []|})";
  const std::string idle = R"("in_bytes":0,|"out_bytes":0,|"in_packets":0,|"out_packets":0,|"interface":"",|)"
                           R"("flags":"------------- ",|"local_state":)";
  const std::string no_process = R"("process":"",|"pid":0,|"children": []|)";
  // The channel and its flows, at a level and the next.
  const auto below = [&](std::size_t level) {
    return at(level,
              R"({|"uuid":"CCCCCCCC-0000-0000-0000-00000000000C",|"type":"channel",|"flags":-2147483647,|)"
              R"("pid":42,|"proc_name":"curl",|"fd":5,|"port":2,|"n_tx_rings":1,|"n_rx_rings":0,|)"
              R"("children": [)") +
           at(level + 1,
              unnamed +
                  R"("flow",|"local_addr":"10.0.0.1",|"local_port":443,|"remote_addr":"0.0.0.0",|)"
                  R"("remote_port":51000,|"protocol":"tcp",|"in_bytes":3,|"out_bytes":18446744073709551615,|)"
                  R"("in_packets":4,|"out_packets":2,|"interface":"en0",|"flags":"t-----------r ",|)"
                  R"("local_state":"ESTABLISHED",|"remote_state":"TIME_WAIT",|"process":"cli",|"pid":-1,|)"
                  R"("children": []|},)") +
           at(level + 1, unnamed +
                             R"("flow",|"local_addr":"fe80::1",|"local_port":443,|"remote_addr":"::",|)"
                             R"("remote_port":0,|"protocol":"udp",|)" +
                             idle + R"("NO_TRAFFIC",|"remote_state":"UNKNOWN",|)" + no_process + "},") +
           at(level + 1, unnamed + R"("flow",|"protocol":"unk.",|)" + idle +
                             R"("CLOSED",|"remote_state":"CLOSED",|)" + no_process + "} ");
  };
  const run_result dump = printed(
      at(0, unnamed + R"("root",|"children": [)") +
      at(1, a_provider + R"("wifi",|"provider_type":"net-if",|)" + parameters) +
      at(2, R"({|"uuid":"AAAAAAAA-0000-0000-0000-00000000000A",|"type":"nexus",|"children": [)") + below(3) +
      at(3, "]|} ") + at(2, "]|},") + at(2, nexus + " ") + at(1, "]|},") +
      at(1, a_provider + R"("a"\",|"provider_type":"unknown",|)" + parameters + "]|} ") + at(0, "]|}"));
  EXPECT_EQ(run("tree"), dump);
  EXPECT_EQ(run(std::string("tree ") + null_uuid + " ignored -x"), dump);
  EXPECT_EQ(run("tree cccccccc-0000-0000-0000-00000000000C"), printed(below(0) + at(0, "]|}")));
  EXPECT_EQ(run("tree bbbbbbbb-0000-0000-0000-00000000000b"), printed(at(0, nexus)));

  const std::string path = kernel.file("dump");
  kernel.table(provider_list, listed("wifi", 2, 1, {nexus_a, nexus_b}));
  EXPECT_EQ(run("tree -f " + path), printed(""));
  EXPECT_EQ(std::system(("python3 -m json.tool " + path + " /dev/null").c_str()), 0);
}

TEST_F(tree, WordsThatNameNoObjectAreDiagnosedAndEndTheLoop) {
  for (const char *word : {"-D", "AAAAAAAA00000000000000000000000A", "AAAAAAAA-0000-0000-0000-00000000000",
                           "AAAAAAAA-0000-0000-0000-00000000000AA", "AAAAAAAA-0000-0000-0000-00000000000G"}) {
    EXPECT_EQ(run(std::string("tree ") + word), complained("Invalid UUID\n")) << word;
  }
  const std::string unknown = "No tarvel object with UUID EEEEEEEE-0000-0000-0000-00000000000E\n";
  EXPECT_EQ(run("tree eeeeeeee-0000-0000-0000-00000000000e"), complained(unknown));
  EXPECT_EQ(run("-w 60 tree x").err, "Invalid UUID\n");
  EXPECT_EQ(run("-w 60 tree eeeeeeee-0000-0000-0000-00000000000e").err, unknown);
}

TEST_F(tree, ChannelsHangUnderTheirNexusByPort) {
  const std::string a3 = group(nexus_a, 3) + port(7) + port(2), a1 = group(nexus_a, 1);
  const std::string liar = bytes(48).u32(28, 6).u32(32, ~0U).u32(36, 1) + bytes(184);
  const bool is_short = true;
  const struct {
    std::string channels, ports;
    bool cut = false;
  } cases[] = {
      {a3 + port(5), "2 5 7 "},
      {a3 + port(~0U), "-1 2 7 "},
      {group(nexus_b, 1) + port(9) + a1 + port(3), "3 9 "},
      {a3 + port(5) + a1 + port(4), "4 "},
      {a3 + port(5) + group(nexus_a, 0), "2 5 7 "},
      {group(nowhere, 2) + port(8) + port(9) + a1 + port(4), "4 "},
      {a1 + port(2) + group(channel_c, 1) + port(8, provider_p) + a1 + port(3, nowhere), "3 "},
      {group(provider_p, 1) + port(4) + a1 + port(5), "4 "},
      {group(nexus_a, 2) + port(2) + port(3) + a1 + port(4, nowhere) + group(channel_c, 1) + port(5), "4 "},
      {group(null_uuid, 1) + port(4) + group(provider_p, 1) + port(5), "4 "},
      {a3 + port(5) + a1.substr(0, 10), "2 5 7 ", is_short},
      {a3, "7 2 ", is_short},
      {a3 + port(5).substr(0, 231), "7 2 ", is_short},
      {a3 + liar, "7 2 ", is_short},
      {group(nexus_a, ~0U) + port(7) + port(2), "7 2 ", is_short},
      {a1 + port(7) + a1 + port(3).substr(0, 47), "", is_short},
      {a1 + port(7) + group(nowhere, ~0U) + port(3), "7 ", is_short},
      {a1 + port(7) + group(nowhere, 1) + liar + group(nexus_b, 1) + port(3), "7 ", is_short},
  };
  for (const auto &[channels, ports, cut] : cases) {
    kernel.table(channel_list, channels);
    const run_result result = run();
    EXPECT_EQ(values(result.out, "port"), ports) << &channels - &cases[0].channels;
    EXPECT_EQ(complained(result.err, result.status), complained(cut ? too_short : "")) << ports;
    EXPECT_TRUE(result.out.ends_with("\n]\n}\n")) << result.out;
  }
}

TEST_F(tree, FlowsHangUnderTheChannelOfTheirPort) {
  const std::string orphan = "orphan flow orphan nx_uuid";
  kernel.table(channel_list, group(nexus_a, 1) + port(3) + group(nexus_a, 2) + port(2) + port(3) +
                                 group(nexus_b, 1) + port(4));
  kernel.table(flow_list, flow_of(nexus_a, 3, 2, 1) + flow_of(nowhere, 2, 2, 2) + flow_of(nexus_a, 2, 2, 3) +
                              flow_of(nexus_a, 4, 2, 4) + flow_of(nexus_a, 3, 2, 5) +
                              flow_of(provider_p, 2, 2, 6) + flow_of(channel_c, 2, 2, 7) +
                              flow_of(null_uuid, 2, 2, 8) + flow_of(nowhere, 3, 2, 9));
  run_result result = run();
  EXPECT_EQ(values(result.out, "remote_port"), "3 1 5 ");
  EXPECT_EQ(complained(result.err, result.status), complained(orphan + orphan));
  kernel.table(channel_list, group(null_uuid, 1) + port(2));
  result = run();
  EXPECT_EQ(values(result.out, "remote_port"), "8 ");
  EXPECT_EQ(count_of(result.err, orphan), 7U);
}

TEST_F(tree, IndentStopsGrowingAtLevel7) {
  std::string channels;
  std::string parent = nexus_a;
  for (char letter = '1'; letter <= '9'; ++letter) {
    std::string child = channel_c;
    child.back() = letter;
    channels += group(parent.c_str(), 1) + port(static_cast<std::uint32_t>(letter - '0'), child.c_str());
    parent = child;
  }
  kernel.table(channel_list, channels);
  const std::string out = run().out;
  for (std::size_t port = 1; port <= 9; ++port) {
    std::string line = "\n";
    line += at(std::min<std::size_t>(port + 2, 7), "\"port\":" + std::to_string(port) + ",");
    EXPECT_EQ(count_of(out, line), 1U) << out;
  }
  EXPECT_EQ(count_of(out, "\n                     } \n"), 5U) << out;
}

TEST_F(tree, TablesThatAreMissingLeaveTheRest) {
  remove(kernel.table_path(channel_list));
  remove(kernel.table_path(flow_list));
  run_result result = run();
  EXPECT_EQ(count_of(result.out, "\"type\":\"nexus\""), 2U);
  EXPECT_EQ(complained(result.err, result.status), complained(missing + missing));
  kernel.table(provider_list, "").table(flow_list, flow_of(nexus_a, 2, 2));
  const std::string root =
      R"({|"uuid":"00000000-0000-0000-0000-000000000000",|"type":"root",|"children": []|})";
  EXPECT_EQ(run(), complained(missing + "orphan flow orphan nx_uuid", 0, at(0, root)));
}

const std::string shown_a = "flow-switch AAAAAAAA-0000-0000-0000-00000000000A ";

TEST_F(show, ShowsPortsAndFlowsOfMultistackFlowSwitches) {
  std::string name(64, 'n');
  name[1] = '\033';
  std::string name_on_terminal = name;
  name_on_terminal[1] = '?';
  kernel.table(provider_list, listed("bridge", 3, 0, {nowhere}) + listed("other", 3, 2, {channel_c}) +
                                  listed("none", 3, 1, {}) + listed(name, 0, 1, {nexus_b, nexus_a}));
  kernel.table(channel_list, group(nexus_a, 6) + port(12, channel_c, 0x80000000) + port(2, mixed_uuid) +
                                 port(3).u32(20, 77) + port(1) + port(~0U) + port(0) + group(nowhere, 1) +
                                 port(2) + group(mixed_uuid, 1) + port(9));
  kernel.table(flow_list,
               flow_of(nexus_a, 2, 30, 53) + flow_of(nexus_a, 1, 9) + flow_of(nexus_a, 2, 2, 65535));
  const auto report = [](const std::string &shown, const std::string &defunct) {
    return printed("flow-switch BBBBBBBB-0000-0000-0000-00000000000B " + shown + "\n" + shown_a + shown +
                   "\n\tPort[4294967295] curl.42               \n"
                   "\tPort[ 2] curl.42               \n"
                   "\t\t fe80::1.443 <-> ::.53\n"
                   "\t\t 10.0.0.1.443 <-> 0.0.0.0.65535\n"
                   "\tPort[ 3] <unknown>.77          \n"
                   "\tPort[12] curl.42               " +
                   defunct + "\n");
  };
  for (const char *line : {"show", "channel-stats", "show -x ignored"}) {
    EXPECT_EQ(run(line), report(name, "defunct")) << line;
    EXPECT_EQ(run(line, {.terminal = true}), report(name_on_terminal, "\033[31mdefunct\033[0m")) << line;
  }
}

TEST_F(show, FlowsOfOtherFamiliesAbort) {
  make_one_of_each();
  const std::string shown = shown_a +
                            "wifi\n\tPort[ 2] curl.42               defunct\n"
                            "\t\t 10.0.0.1.443 <-> 0.0.0.0.51000\n\t\t fe80::1.443 <-> ::.0\n";
  const run_result result = inconsistent("cmd_show", 2030, "0", shown);
  EXPECT_EQ(run("show"), result);
  EXPECT_EQ(run("channel-stats", {.stdout_path = "/dev/full"}),
            complained("write error: No space left on device\n" + result.err, -SIGABRT));
}

}  // namespace
