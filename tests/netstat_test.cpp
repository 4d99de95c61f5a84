// netstat and its counter reports, interface, flow-switch.

#include <gtest/gtest.h>

#include <map>
#include <sstream>

#include "tests/support/records.h"

namespace {

constexpr char other_nexus[] = "00112233-4455-6677-8899-AABBCCDDEEFF";
const std::string prefix = "kern.tarvel.stats.";
constexpr std::uint64_t most = 0xFFFFFFFFFFFFFFFF;

const std::string usage_text =
    "Usage:\n"
    "tarvelctl netstat arguments\n"
    "\t-a              all flows\n"
    "\t--flow-adv      flow advisory\n"
    "\t--flow-owner    flow owner\n"
    "\t-n              numerical display\n"
    "\t--netif         netif statistics\n"
    "\t--flowswitch    flowswitch statistics\n"
    "\t-p <protocol>   show protocol statistics (tcp, udp, ip, ip6)\n"
    "\t-s              protocol statistics\n"
    "\t--global        fold statistics into single global one\n"
    "\t--pid <pid>     filter statistics based on process <pid>\n"
    "\t--uuid <uuid>   filter statistics based on nexus <uuid>\n"
    "\t--show-zeros    print out zero fields in statistics\n";

// What stands around the counters is not for us.
bytes stack(std::int32_t pid, const char *uuid = mixed_uuid) {
  bytes record = bytes(2496).uuid(0, uuid).text(16, "en0").u32(32, static_cast<std::uint32_t>(pid));
  return record.text(36, std::string(12, '\xEE')).u64(392, most).u64(2312, most);
}

std::string stack_heading(const std::string &process, const std::string &uuid = mixed_uuid) {
  return " - " + process + "\n\tNexus UUID: " + uuid + "\n\tNetif     : en0\n";
}

const std::string titles = "\tip:\n\tip6:\n\ttcp:\n\tudp:\n";
const std::string closed_stack = stack_heading("<Closed Port Stats>") + titles;

run_result run(const std::string &table, const std::string &contents, const words &line) {
  return run_on(prefix + table, contents, line);
}
run_result stacks(const std::string &contents, const words &line) {
  return run("userstack", contents, line);
}

TEST(netstat, WithoutAReportPrintsItsUsage) {
  for (const char *line : {"netstat", "NETSTAT -n", "netstat --global", "netstat --pid 5",
                           "netstat --show-zeros", "netstat -p tcp", "netstat --wait -s", "netstat a -- -s",
                           "netstat --uuid FEDCBA98-7654-3210-0123-456789ABCDEF"}) {
    EXPECT_EQ(run_tarvelctl(kernel_dir(), line, {.program_name = "tv"}), complained(usage_text)) << line;
  }
}

TEST(netstat, WrongOptionsAreReportedAndSkipped) {
  const std::pair<const char *, std::string> cases[] = {
      {"netstat -w1", "netstat: invalid option -- 'w'\nnetstat: invalid option -- '1'\n"},
      {"netstat -p", "netstat: option requires an argument -- 'p'\n"},
      {"netstat --pid", "netstat: option '--pid' requires an argument\n"},
      {"netstat --netif=1", "netstat: option '--netif' doesn't allow an argument\n"}};
  for (const auto &[line, diagnostic] : cases)
    EXPECT_EQ(stacks("", line), complained(diagnostic + usage_text));
}

TEST(netstat, WrongValuesStopItBeforeAnyReport) {
  for (const std::string name : {"icmp", "TCP", "tcp6", ""}) {
    EXPECT_EQ(stacks(stack(0), {"netstat", "-s", "-p", "tcp", "-p", name, "-x"}),
              complained("Unsupported protocol \"" + name + "\"\n"));
  }
  const std::string id = mixed_uuid;
  for (const std::string &text : {id + "0", id.substr(1), std::string("G").append(id, 1), std::string()}) {
    EXPECT_EQ(stacks(stack(0), {"netstat", "-s", "--uuid", text, "-x"}), complained("Bad UUID\n")) << text;
  }
  EXPECT_EQ(hide_times(stacks(stack(0), "netstat -s -p icmp -w 60").out), "\n<time>\n");
}

// The reports that are in `out`, in their order, each by a letter; "?" for one that does not appear just
// once.
std::string reports_in(const std::string &out) {
  std::map<std::size_t, char> found;
  for (const auto &[letter, heading] : {std::pair('f', "Proto Local"),
                                        {'s', "<Closed Port"},
                                        {'i', "netif:"},
                                        {'a', "FlowAdvIdx"},
                                        {'o', "NetIf     Port"},
                                        {'w', "flowswitch:"}}) {
    const std::size_t times = count_of(out, heading);
    if (times > 0) found[out.find(heading)] = times == 1 ? letter : '?';
  }
  std::string letters;
  for (const auto &[at, letter] : found) letters += letter;
  return letters;
}

TEST(netstat, ReportsRunOnceInAFixedOrderWhateverFails) {
  kernel_dir kernel;
  const std::pair<const char *, bytes> tables[] = {{"flow", bytes(320)},       {"userstack", stack(0)},
                                                   {"net_if", bytes(320)},     {"flow_adv", bytes(40)},
                                                   {"flow_owner", bytes(128)}, {"flow_switch", bytes(448)}};
  for (const auto &[name, contents] : tables) kernel.table(prefix + name, contents);
  const std::pair<const char *, std::string> cases[] = {
      {"f", "-an"},
      {"f", "--flow"},
      {"s", "--pro"},
      {"i", "-n --net --wait 9"},
      {"a", "--flow-adv"},
      {"o", "--flow-o"},
      {"w", "--flowswitch"},
      {"fs", "-sna"},
      {"fi", "x -a y --netif -- -s"},
      {"fsiaow", "--flowswitch --flow-owner --flow-adv --netif -s -a --flow -s"}};
  for (const auto &[expected, options] : cases) {
    const run_result result = run_tarvelctl(kernel, "netstat " + options);
    EXPECT_EQ(complained(result.err, result.status, reports_in(result.out)), printed(expected)) << options;
  }
  for (const char *name : {"flow", "net_if"}) remove(kernel.table_path(prefix + name));
  const run_result result = run_tarvelctl(kernel, "netstat -as --netif --flow-adv --flow-owner --flowswitch");
  EXPECT_EQ(complained(result.err, result.status, reports_in(result.out)),
            complained(missing + missing, 0, "saow"));
}

// Counters

// Each counter in [from, to) holds its own offset.
void number(bytes &record, std::size_t from, std::size_t to) {
  for (; from < to; from += 8) record.u64(from, from);
}

std::string counter_line(std::string name, std::uint64_t value) {
  if (name.size() < 16) name.resize(16, ' ');
  return "\t\t" + name + ": " + std::to_string(value) + "\n";
}

// Expects the counters of `number` and nothing else, some of them by "offset name offset name...".
void expect_numbered(const std::string &report, std::size_t from, std::size_t to, const char *names) {
  std::istringstream lines(report), named(names);
  for (std::string line; std::getline(lines, line);) {
    if (!line.starts_with("\t\t")) continue;
    EXPECT_TRUE(line.ends_with(": " + std::to_string(from))) << line;
    from += 8;
  }
  EXPECT_EQ(from, to) << report;
  std::string name;
  for (std::size_t at; named >> at >> name;) EXPECT_EQ(count_of(report, counter_line(name, at)), 1U) << name;
}

const struct {
  std::string protocol;
  std::size_t from, to;
  const char *names;
} sections[] = {{"ip", 48, 392, "48 TotalRcvd 72 DataTooSmall 128 FastFwd 384 SAppndFail"},
                {"ip6", 400, 688, "400 TotalRcvd 424 FrafRcvd 632 Fwd$Miss 680 DADLoop"},
                {"tcp", 688, 2312,
                 "688 ConnInit 1088 Pcb$Miss 1320 HCAdd 1560 MsgSndW8HPrio 1992 ECNLOSSSYN 2136 TDOSYNDataAck"
                 " 2296 TmrDriftLE1000Ms 2304 TmrDriftGT1000Ms"},
                {"udp", 2320, 2496, "2320 InPkt 2400 FastOut 2480 Send6SWCsum 2488 Send6SWCsumBytes"}};

TEST(netstat_stacks, CountersAreNamedByPosition) {
  bytes record = stack(42);
  for (const auto &each : sections) number(record, each.from, each.to);
  for (const auto &[protocol, from, to, names] : sections) {
    const std::string line = "netstat -s -p " + protocol;
    const std::string report = stacks(record, line).out;
    EXPECT_TRUE(report.starts_with(stack_heading("curl.42") + "\t" + protocol + ":\n\t\t"));
    expect_numbered(report, from, to, names);
    EXPECT_EQ(count_of(stacks(stack(0), line + " --show-zeros").out, ": 0\n"), (to - from) / 8);
  }
}

TEST(netstat_stacks, AreChosenByProtocolProcessAndNexus) {
  const std::pair<const char *, const char *> cases[] = {
      {"netstat -sptcp", "\ttcp:\n"},
      {"netstat --per-protocol udp -p ip -s", "\tip:\n\tudp:\n"},
      {"netstat -s --pe=ip6 -p ip6", "\tip6:\n"}};
  for (const auto &[line, expected] : cases)
    EXPECT_EQ(stacks(stack(43), line), printed(stack_heading("<unknown>.43") + expected)) << line;

  const std::string table = stack(0) + stack(42) + stack(-1) + stack(42, other_nexus);
  const std::string first = stack_heading("curl.42") + titles;
  const std::string last = stack_heading("curl.42", other_nexus) + titles;
  const std::pair<std::string, std::string> filters[] = {
      {"--pid abc", closed_stack},
      {"--pid 42", first + last},
      {"--pid -1", stack_heading("<unknown>.-1") + titles},
      {"--pid 43", ""},
      {"--uuid 00112233-4455-6677-8899-aabbccddeeff", last},
      {std::string("--pid 42 --uuid ") + mixed_uuid, first}};
  for (const auto &[options, expected] : filters)
    EXPECT_EQ(stacks(table, "netstat -s " + options), printed(expected));
}

TEST(netstat_stacks, FiltersSelectWhatIsFolded) {
  const std::string table = stack(42).u64(48, 1).u64(2488, 2) +
                            stack(42, other_nexus).u64(48, 2).u64(400, 5) +
                            stack(43).u64(48, most).u64(688, most) + stack(0).u64(688, most);
  const auto total = [](std::uint64_t ip, std::uint64_t ip6, std::uint64_t tcp, std::uint64_t udp) {
    const auto line = [](const char *name, std::uint64_t value) {
      return value ? counter_line(name, value) : "";
    };
    return printed("\tip:\n" + line("TotalRcvd", ip) + "\tip6:\n" + line("TotalRcvd", ip6) + "\ttcp:\n" +
                   line("ConnInit", tcp) + "\tudp:\n" + line("Send6SWCsumBytes", udp));
  };
  const std::string fold = "netstat -s --global", by_nexus = fold + " --uuid " + other_nexus;
  EXPECT_EQ(stacks(table, fold), total(2, 5, most - 1, 2));
  EXPECT_EQ(stacks(table, fold + " --pid 42"), total(3, 5, 0, 2));
  EXPECT_EQ(stacks(table, by_nexus), total(2, 5, 0, 0));
  EXPECT_EQ(stacks(table, by_nexus + " --pid 43"), printed(titles));
}

// interface and flow-switch, which are the same but for this.
struct nexus_report {
  std::string command, option, table, title;
  std::size_t size, end;  // of the record and of its counters
  const char *names, *first, *last;

  bytes record(std::string_view name, const char *uuid = mixed_uuid) const {
    return bytes(size).uuid(0, uuid).text(16, name);
  }
};

const nexus_report nexus_reports[] = {
    {"interface", "netstat --netif", "net_if", "netif:\n", 320, 264,
     "104 Dropped 184 RxCopyAttach 216 RxIRQBusy", "TxIRQ", "TxEnqueueDrop"},
    {"flow-switch", "netstat --flowswitch", "flow_switch", "flowswitch:\n", 448, 448,
     "128 TxLookupTrackErr 144 TxLookupNonviable 288 DestNexusPortInactive 424 FragHitPerQueueLimit",
     "Dropped", "ChanErrUppAlloc"}};

TEST(nexus_counters, AreNamedByPosition) {
  for (const nexus_report &the : nexus_reports) {
    bytes record = the.record("en0");
    number(unread(record, the.end, the.size - the.end), 32, the.end);
    expect_numbered(run(the.table, record, the.command + " x --nope").out, 32, the.end, the.names);
    const std::string zeros = run(the.table, the.record("en0"), the.option + " --show-zeros").out;
    EXPECT_EQ(count_of(zeros, ": 0\n"), (the.end - 32) / 8);
  }
}

TEST(nexus_counters, AreSortedByName) {
  for (const nexus_report &the : nexus_reports) {
    std::string table, report = the.title;
    for (const char *name : {"en1", "\xc3\xa9", "en0", "en", "EN0", "0123456789abcdef", "bridge10"}) {
      table += the.record(name).u64(32, most);
    }
    for (const char *name :
         {"0123456789abcdef", "EN0     ", "bridge10", "en      ", "en0     ", "en1     ", "\xc3\xa9      "}) {
      report += std::string(" - ") + name + " " + mixed_uuid + "\n" + counter_line(the.first, most);
    }
    EXPECT_EQ(run(the.table, table, the.command), printed(report));
  }
}

TEST(nexus_counters, AreFilteredByNexusOrAllFolded) {
  for (const nexus_report &the : nexus_reports) {
    const std::string table = the.record("en0").u64(32, most).u64(the.end - 8, 1) +
                              the.record("en1", other_nexus).u64(32, 3).u64(the.end - 8, 4);
    const auto report = [&the](const std::string &heading, std::uint64_t first, std::uint64_t last) {
      return printed(the.title + heading + counter_line(the.first, first) + counter_line(the.last, last));
    };
    const std::string by_nexus = the.option + " --pid 7 --uuid " + mixed_uuid;
    EXPECT_EQ(run(the.table, table, the.option + " --global"), report("", 2, 5));
    EXPECT_EQ(run(the.table, table, by_nexus + " --global"), report("", 2, 5));
    EXPECT_EQ(run(the.table, table, by_nexus),
              report(std::string(" - en0      ") + mixed_uuid + "\n", most, 1));
    EXPECT_EQ(run(the.table, table, the.option + " --uuid " + null_uuid), printed(the.title));
  }
}

}  // namespace
