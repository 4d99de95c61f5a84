// The command line: usage, global options, the watch loop, the ways out; and what the commands have in
// common.

#include <gtest/gtest.h>
#include <sched.h>
#include <sys/mount.h>

#include <csignal>

#include "tests/support/records.h"

namespace {

// All commands, in the order of the usage text.
const std::vector<std::string> command_names = {
    "channel", "flow",     "flow-adv", "flow-owner", "flow-route",    "flow-switch",    "interface", "memory",
    "netns",   "provider", "show",     "tree",       "channel-stats", "list-providers", "netstat",
};

run_result usage_error_of(const std::string &program) {
  std::string text = "usage: " + program +
                     " [global options] <command> [args]\n\nGlobal options:\n"
                     "\t-f <output_file>\tWrite output to <file>\n"
                     "\t-w <seconds>    \tRefresh every <seconds>\n\nCommand:\n";
  for (const std::string &name : command_names) text += "\t" + name + "\n";
  return complained(text, 64);
}
const run_result usage_error = usage_error_of("tarvelctl");

// A kernel without providers: the shortest report there is.
class front_end : public testing::Test {
 protected:
  front_end() { kernel.table(provider_list, ""); }

  run_result run(const words &line, const run_options &options = {}) {
    return run_tarvelctl(kernel, line, options);
  }

  // A provider table whose report fills any pipe.
  void make_long_report() {
    std::string table;
    for (int i = 0; i < 5000; ++i) table += bytes(264);
    kernel.table(provider_list, table);
  }

  kernel_dir kernel;
  const run_result report = printed("No providers\n");
  const std::string path = kernel.file("out");
};

using watch_loop = front_end;
using write_error = front_end;

TEST_F(front_end, WhatIsNoCommandLinePrintsUsage) {
  for (const char *line :
       {"", "nope", "provide", "providers", "-D provider", "-w 1", "-w0 provider", "-W 0 provider",
        "-fout provider", "-w", "-f", "provider -w", "provider -f", "-w 0 provider -w", "-w -f provider"}) {
    EXPECT_EQ(run(line), usage_error) << line;
  }
  EXPECT_EQ(run({""}), usage_error);
  EXPECT_EQ(run("nope", {.program_name = "/opt/net/tv"}), usage_error_of("tv"));
  EXPECT_EQ(run("nope", {.program_name = "tv"}), usage_error_of("tv"));
}

TEST_F(front_end, EveryCommandIsFoundWhateverItsCase) {
  for (std::string name : command_names) {
    EXPECT_NE(run(name), usage_error) << name;
    for (char &letter : name) letter = static_cast<char>(std::toupper(letter));
    EXPECT_NE(run(name), usage_error) << name;
  }
  EXPECT_EQ(run("List-Providers"), report);
}

TEST_F(front_end, GlobalOptionsAreTakenFromAnywhere) {
  for (const char *line :
       {"-w 0 provider -D", "provider -w 0 -D", "provider ignored -w 0", "-w 7 provider -w 0"})
    EXPECT_EQ(run(line), report) << line;
  const std::string to_file = "-f " + path;
  for (const std::string &line : {to_file + " provider -D", "provider " + to_file + " -D",
                                  "provider -D " + to_file, "-w 0 " + to_file + " provider"}) {
    write_file(path, "older and longer than the report");
    EXPECT_EQ(run(line), printed("")) << line;
    EXPECT_EQ(contents_of(path), report.out) << line;
  }
}

TEST_F(front_end, ValueIsNeverTakenForAnOption) {
  for (const std::string name : {"-w", "-f"}) {
    EXPECT_EQ(run("provider -f " + name, {.directory = kernel.root()}), printed(""));
    EXPECT_EQ(contents_of(kernel.file(name)), report.out);
  }
}

// The option error ends the loop after one run, which the timestamp in front of it tells from a single run.
TEST_F(front_end, IntervalsAreDecimalNumbers) {
  for (const char *value : {"1", "+1", " 1", "010", "2147483647"})
    EXPECT_EQ(hide_times(run({"provider", "-x", "-w", value}).out), "\n<time>\n") << value;
  for (const char *value : {"0", "00", "-0", "+0"}) EXPECT_EQ(run({"provider", "-w", value}), report);
  for (const char *value : {"2x", "x", "", " ", "-1", "1 ", "0x1", "1.5", "2147483648", "4294967296",
                            "9223372036854775808", "99999999999999999999", "-99999999999999999999"})
    EXPECT_EQ(run({"provider", "-w", value}), usage_error) << value;
}

TEST_F(front_end, OutputFilesAreEmptiedAndTheLastOneWins) {
  const std::string last = kernel.file("last");
  write_file(path, "old");
  EXPECT_EQ(run("-f " + path + " provider -f " + last), printed(""));
  EXPECT_EQ(contents_of(path), "");
  EXPECT_EQ(contents_of(last), report.out);
  for (const char *rest : {" nope", " provider -w", " provider -w x", ""}) {
    write_file(path, "old");
    EXPECT_EQ(run("-f " + path + rest), usage_error) << rest;
    EXPECT_EQ(contents_of(path), "") << rest;
  }
}

TEST_F(front_end, OutputFileThatCannotBeOpenedIsNamed) {
  const std::string nowhere = kernel.file("no/such/dir/out"), folder = kernel.root();
  EXPECT_EQ(run("provider -f " + nowhere),
            complained("Couldn't open file " + nowhere + ":No such file or directory\n", 64));
  EXPECT_EQ(run("-f " + folder + " provider"),
            complained("Couldn't open file " + folder + ":Is a directory\n", 64));
}

TEST_F(front_end, OptionErrorsAreTheLibrarysWordsAndLeaveStatus0) {
  const std::string options = "\t[--details, -D ]\n";
  const std::pair<const char *, std::string> cases[] = {
      {"Provider -Dx", "Provider: invalid option -- 'x'\n" + options},
      {"provider -w1", "provider: invalid option -- 'w'\n" + options},
      {"list-providers --nope", "list-providers: unrecognized option '--nope'\n" + options},
      {"provider --details=2", "provider: option '--details' doesn't allow an argument\n" + options},
      {"channel -x", "channel: invalid option -- 'x'\n"},
      {"channel x --all", "channel: unrecognized option '--all'\n"}};
  for (const auto &[line, diagnostic] : cases) {
    EXPECT_EQ(run(line), complained(diagnostic));
    const run_result watched = run(std::string(line) + " -w 60");
    EXPECT_EQ(complained(watched.err, watched.status, hide_times(watched.out)),
              complained(diagnostic, 0, "\n<time>\n"));
    EXPECT_EQ(run(line + std::string(" -f ") + path).err, diagnostic);
    EXPECT_EQ(run(line + std::string(" -f ") + path, {.closed = {2}}), printed(""));
    EXPECT_EQ(contents_of(path), "");
  }
}

TEST_F(front_end, SomeCommandsSkipWrongOptions) {
  kernel.table("kern.tarvel.stats.arena", "").table(flow_list, "").table("kern.tarvel.stats.flow_route", "");
  kernel.table("kern.tarvel.stats.flow_adv", "").table("kern.tarvel.stats.net_if", "");
  const std::pair<const char *, const char *> cases[] = {
      {"memory ignored -xy", "memory: invalid option -- 'x'\nmemory: invalid option -- 'y'\n"},
      {"flow -xn --no", "flow: invalid option -- 'x'\nflow: unrecognized option '--no'\n"},
      {"flow-route x -an", "flow-route: invalid option -- 'a'\n"},
      {"netstat -xa", "netstat: invalid option -- 'x'\n"},
      {"netstat --nope -a", "netstat: unrecognized option '--nope'\n"},
      {"flow-adv -x", ""},
      {"interface -x --nope", ""}};
  for (const auto &[line, diagnostic] : cases) EXPECT_EQ(run(line), complained(diagnostic)) << line;
}

TEST_F(front_end, TableThatIsMissingOrEmptyIsReportedIfAtAll) {
  const struct {
    const char *line, *table;
    std::string error = missing, out{};
  } cases[] = {
      {"list-providers -D", "nexus_provider_list",
       missing + "failed to retrieve nexus provider list, No such file or directory\n", "No providers\n"},
      {"channel", "nexus_channel_list", missing, "No channels\n"},
      {"memory", "stats.arena"},
      {"netns -a", "stats.netns"},
      {"flow", "stats.flow"},
      {"flow-adv", "stats.flow_adv"},
      {"flow-owner", "stats.flow_owner"},
      {"flow-route", "stats.flow_route"},
      {"interface", "stats.net_if"},
      {"flow-switch", "stats.flow_switch"},
      {"netstat -s --global", "stats.userstack"},
  };
  for (const auto &[line, table, error, out] : cases) {
    EXPECT_EQ(run_on(std::string("kern.tarvel.") + table, "", line), printed(out)) << line;
    EXPECT_EQ(run_tarvelctl(kernel_dir(), line).err, error) << line;
  }
  EXPECT_EQ(run_tarvelctl(kernel_dir(), "provider").out + run_tarvelctl(kernel_dir(), "channel").out,
            "No channels\n");
  for (const std::string line :
       {"tree", "tree AAAAAAAA-0000-0000-0000-00000000000A", "show", "channel-stats"})
    EXPECT_EQ(run_tarvelctl(kernel_dir(), line), complained(missing)) << line;
  for (const char *ends_the_loop : {"-w 60 tree", "-w 60 netns -a", "-w 60 netns -i global -p tcp"})
    EXPECT_EQ(run_tarvelctl(kernel_dir(), ends_the_loop).err, missing);
}

TEST_F(front_end, DiagnosticsFollowTheReportTheyBelongTo) {
  kernel.table(provider_list, provider("en0") + bytes(1));
  EXPECT_EQ(run("provider", {.merged = true}),
            printed(std::string("user-pipe en0 ") + mixed_uuid + "\nBuffer too short\n"));
}

TEST_F(watch_loop, PutsAPlainTimestampIntoAFileAlsoOnATerminal) {
  const auto interrupt_when_reported = [&](const running &run) {
    if (contents_of(path).ends_with(report.out)) kill(run.pid, SIGINT);
  };
  EXPECT_EQ(run("-w 60 provider -f " + path, {.terminal = true, .meanwhile = interrupt_when_reported}),
            printed(""));
  EXPECT_EQ(hide_times(contents_of(path)), "\n<time>\n" + report.out);
}

TEST_F(watch_loop, PutsACyanTimestampOnATerminal) {
  const run_result result =
      run("-w 60 provider", {.terminal = true, .meanwhile = interrupt_after(1, report.out)});
  EXPECT_EQ(complained(result.err, result.status, hide_times(result.out)),
            printed("\n\033[36m<time>\033[0m\n" + report.out));
}

TEST_F(watch_loop, FollowsTheSystemsTimeZone) {
  bytes zone = bytes(54).text(0, "TZif").u8(39, 1).u8(43, 4).text(50, "ABC");
  kernel.table("etc.localtime", zone);
  const auto enter = [etc = kernel.table_path("etc")] {
    unsetenv("TZ");
    if (unshare(CLONE_NEWUSER | CLONE_NEWNS) != 0) _exit(126);
    if (mount(etc.c_str(), "/etc", nullptr, MS_BIND, nullptr) != 0) _exit(126);
  };
  const auto meanwhile = [&, interrupt = interrupt_after(2, report.out)](const running &run) {
    if (!run.out.empty()) kernel.table("etc.localtime", zone.u8(44, 0x40));  // 34 years later
    interrupt(run);
  };
  const std::string out = run("provider -w 1", {.prepare = enter, .meanwhile = meanwhile}).out;
  if (out.empty()) GTEST_SKIP() << "there can be no other /etc here";
  EXPECT_NE(out.substr(1, 4), out.substr(out.rfind("\n2") + 1, 4)) << out;
}

TEST_F(watch_loop, ReadsOptionsAndTableAfreshInEveryRun) {
  kernel.table(provider_list, provider("first"));
  const auto meanwhile = [&, interrupt = interrupt_after(2, "mhints 188\n")](const running &run) {
    if (run.out.find("first") != std::string::npos) kernel.table(provider_list, provider("second"));
    interrupt(run);
  };
  const run_result result = run("provider ignored -D -w 1", {.meanwhile = meanwhile});
  EXPECT_EQ(result.status, 0);
  for (const char *name : {"user-pipe first", "user-pipe second"}) EXPECT_EQ(count_of(result.out, name), 1U);
  EXPECT_EQ(count_of(result.out, "\trings: "), 2U) << result.out;
}

TEST_F(watch_loop, GoesOnAfterAFailedFetch) {
  remove(kernel.table_path(provider_list));
  const std::string failure = "failed to retrieve nexus provider list, No such file or directory\n";
  const run_result result = run("provider -w 1", {.meanwhile = interrupt_after(2, failure)});
  EXPECT_EQ(complained(result.err, result.status), complained(missing + failure + missing + failure));
}

TEST_F(write_error, IsReportedUnlessAnOutputFileTakesTheReport) {
  const run_result full = complained("write error: No space left on device\n", 74);
  EXPECT_EQ(run("provider", {.stdout_path = "/dev/full"}), full);
  EXPECT_EQ(run("provider -w 1", {.stdout_path = "/dev/full"}), full);
  EXPECT_EQ(run("provider -f /dev/full"), full);
  const run_result closed = complained("write error: Bad file descriptor\n", 74);
  EXPECT_EQ(run("provider", {.closed = {1}}), closed);
  EXPECT_EQ(run("provider", {.closed = {0, 1}}), closed);
  EXPECT_EQ(run("provider", {.closed = {0, 1, 2}}).status, 74);
  EXPECT_EQ(run("provider -f " + path, {.closed = {0, 1, 2}}), printed(""));
  EXPECT_EQ(contents_of(path), report.out);
  make_long_report();
  EXPECT_EQ(run("provider -D -f /dev/full"), full);
}

TEST_F(write_error, ReaderThatLeavesEndsTheProcessQuietly) {
  make_long_report();
  for (const std::vector<int> &ignored : {std::vector<int>{}, std::vector<int>{SIGPIPE}}) {
    const run_result result = run("provider", {.reader_leaves = true, .ignored = ignored});
    EXPECT_EQ(complained(result.err, result.status), complained("", -SIGPIPE));
  }
}

}  // namespace
