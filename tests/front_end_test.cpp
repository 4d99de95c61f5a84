// The command line: usage, global options, the watch loop, the ways out.

#include <gtest/gtest.h>

#include <csignal>

#include "tests/support/bytes.h"
#include "tests/support/kernel_dir.h"
#include "tests/support/run.h"

namespace {

constexpr char provider_list[] = "kern.tarvel.nexus_provider_list";

// All commands, in the order of the usage text.
const std::vector<std::string> command_names = {
    "channel", "flow",     "flow-adv", "flow-owner", "flow-route",    "flow-switch",    "interface", "memory",
    "netns",   "provider", "show",     "tree",       "channel-stats", "list-providers", "netstat",
};

std::string usage_text(const std::string &program = "tarvelctl") {
  std::string text = "usage: " + program +
                     " [global options] <command> [args]\n"
                     "\n"
                     "Global options:\n"
                     "\t-f <output_file>\tWrite output to <file>\n"
                     "\t-w <seconds>    \tRefresh every <seconds>\n"
                     "\n"
                     "Command:\n";
  for (const std::string &name : command_names) text += "\t" + name + "\n";
  return text;
}

const run_result usage_error = complained(usage_text(), 64);

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
};

using watch_loop = front_end;
using write_error = front_end;

TEST_F(front_end, NoArgumentsPrintUsage) {
  EXPECT_EQ(run(words{}), usage_error);
}

TEST_F(front_end, UsageNamesTheProgramAsInvoked) {
  EXPECT_EQ(run("nope", {.program_name = "/opt/net/tv"}), complained(usage_text("tv"), 64));
  EXPECT_EQ(run("nope", {.program_name = "tv"}), complained(usage_text("tv"), 64));
}

TEST_F(front_end, UnknownCommandsPrintUsage) {
  for (const words &line :
       {words{"nope"}, words{"provide"}, words{"providers"}, words{""}, words{"-D", "provider"}}) {
    EXPECT_EQ(run(line), usage_error);
  }
}

TEST_F(front_end, EveryCommandIsFoundWhateverItsCase) {
  for (std::string name : command_names) {
    EXPECT_NE(run(name), usage_error) << name;
    for (char &letter : name) letter = static_cast<char>(std::toupper(letter));
    EXPECT_NE(run(name), usage_error) << name;
  }
  EXPECT_EQ(run("PROVIDER"), report);
  EXPECT_EQ(run("List-Providers"), report);
}

TEST_F(front_end, GlobalOptionsAreTakenFromAnywhere) {
  const std::string path = kernel.file("out");
  for (const char *line :
       {"-w 0 provider -D", "provider -w 0 -D", "provider -D -w 0", "provider ignored -w 0"}) {
    EXPECT_EQ(run(line), report) << line;
  }
  for (const std::string &line : {"-f " + path + " provider -D", "provider -f " + path + " -D",
                                  "provider -D -f " + path, "-w 0 -f " + path + " provider"}) {
    write_file(path, "something else");
    EXPECT_EQ(run(line), printed("")) << line;
    EXPECT_EQ(contents_of(path), report.out) << line;
  }
}

TEST_F(front_end, OnlyWholeEntriesAreGlobalOptions) {
  EXPECT_EQ(run("-w0 provider"), usage_error);
  EXPECT_EQ(run("-W 0 provider"), usage_error);
  EXPECT_EQ(run("-fout provider"), usage_error);
  EXPECT_EQ(run("provider -w1"), complained("provider: invalid option -- 'w'\n\t[--details, -D ]\n"));
}

TEST_F(front_end, GlobalOptionWithoutValueIsAUsageError) {
  for (const char *line : {"-w", "-f", "provider -w", "provider -f", "-w 0 provider -w"}) {
    EXPECT_EQ(run(line), usage_error) << line;
  }
}

TEST_F(front_end, GlobalOptionsAloneAreAUsageError) {
  EXPECT_EQ(run("-w 1"), usage_error);
  EXPECT_EQ(run("-f " + kernel.file("out").string()), usage_error);
  EXPECT_TRUE(exists(kernel.file("out")));
}

TEST_F(front_end, ValueIsNeverTakenForAnOption) {
  const run_options here{.directory = kernel.root()};
  EXPECT_EQ(run("-f -w provider", here), printed(""));
  EXPECT_EQ(contents_of(kernel.file("-w")), report.out);
  EXPECT_EQ(run("provider -f -f", here), printed(""));
  EXPECT_EQ(contents_of(kernel.file("-f")), report.out);
  EXPECT_EQ(run("-w -f provider", here), usage_error);
}

TEST_F(front_end, IntervalsThatAreNoIntervalAreUsageErrors) {
  for (const char *value : {"2x", "x", "", " ", "-1", "1 ", "0x1", "1.5", "2147483648", "4294967296",
                            "9223372036854775808", "99999999999999999999", "-99999999999999999999"}) {
    EXPECT_EQ(run({"provider", "-w", value}), usage_error) << "'" << value << "'";
  }
}

// The option error ends the loop after one run, which the timestamp in front of it tells from a single run.
TEST_F(front_end, IntervalsAreDecimalNumbers) {
  for (const char *value : {"1", "+1", " 1", "010", "2147483647"}) {
    EXPECT_EQ(hide_times(run({"provider", "-x", "-w", value}).out), "\n<time>\n") << "'" << value << "'";
  }
  for (const char *value : {"0", "00", "-0", "+0"}) EXPECT_EQ(run({"provider", "-w", value}), report);
}

TEST_F(front_end, LastIntervalWins) {
  EXPECT_EQ(run("-w 7 provider -w 0"), report);
  EXPECT_NE(run("-w 0 provider -x -w 7").out, "");
}

TEST_F(front_end, LastOutputFileWinsAndAllAreEmptied) {
  const std::string first = kernel.file("first");
  const std::string last = kernel.file("last");
  write_file(first, "old");
  write_file(last, "older and longer than the report");
  EXPECT_EQ(run("-f " + first + " provider -f " + last), printed(""));
  EXPECT_EQ(contents_of(first), "");
  EXPECT_EQ(contents_of(last), report.out);
}

TEST_F(front_end, OutputFileThatCannotBeOpenedIsNamed) {
  const std::string path = kernel.file("no/such/dir/out");
  EXPECT_EQ(run("provider -f " + path),
            complained("Couldn't open file " + path + ":No such file or directory\n", 64));
  const std::string folder = kernel.root();
  EXPECT_EQ(run("-f " + folder + " provider"),
            complained("Couldn't open file " + folder + ":Is a directory\n", 64));
}

TEST_F(front_end, OutputFileIsEmptiedBeforeALaterUsageError) {
  const std::string path = kernel.file("out");
  for (const char *rest : {" nope", " provider -w", " provider -w x", ""}) {
    write_file(path, "old");
    EXPECT_EQ(run("-f " + path + rest), usage_error) << rest;
    EXPECT_EQ(contents_of(path), "") << rest;
  }
}

TEST_F(front_end, OptionErrorsAreTheLibrarysWordsAndLeaveStatus0) {
  const std::string options = "\t[--details, -D ]\n";
  EXPECT_EQ(run("provider -x"), complained("provider: invalid option -- 'x'\n" + options));
  EXPECT_EQ(run("Provider -Dx"), complained("Provider: invalid option -- 'x'\n" + options));
  EXPECT_EQ(run("list-providers --nope"),
            complained("list-providers: unrecognized option '--nope'\n" + options));
  EXPECT_EQ(run("provider --details=2"),
            complained("provider: option '--details' doesn't allow an argument\n" + options));
}

TEST_F(front_end, DiagnosticsStayOutOfTheOutputFile) {
  const std::string path = kernel.file("out");
  EXPECT_EQ(run("provider -x -f " + path).err, "provider: invalid option -- 'x'\n\t[--details, -D ]\n");
  EXPECT_EQ(run("provider -x -f " + path, {.closed = {2}}), printed(""));
  EXPECT_EQ(contents_of(path), "");
}

TEST_F(watch_loop, PutsAPlainTimestampBeforeEachRunInAPipe) {
  const run_result result = run("provider -w 1", {.meanwhile = interrupt_after(2, report.out)});
  EXPECT_EQ(hide_times(result.out), "\n<time>\n" + report.out + "\n<time>\n" + report.out);
  EXPECT_EQ(complained(result.err, result.status), printed(""));
}

TEST_F(watch_loop, PutsAPlainTimestampIntoAFileAlsoOnATerminal) {
  const std::string path = kernel.file("out");
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
  EXPECT_EQ(hide_times(result.out), "\n\033[36m<time>\033[0m\n" + report.out);
  EXPECT_EQ(result.status, 0);
}

TEST_F(watch_loop, ReadsOptionsAndTableAfreshInEveryRun) {
  const std::string second = bytes(264).text(64, "second").u32(128, 6);
  kernel.table(provider_list, bytes(264).text(64, "first").u32(128, 5));
  const auto interrupt =
      interrupt_after(2, "\trings: tx 0 rx 0 slots: tx 0 rx 0 bufsize 0 metasize 0 mhints 0\n");
  const auto meanwhile = [&](const running &run) {
    if (run.out.find("first") != std::string::npos) kernel.table(provider_list, second);
    interrupt(run);
  };
  const run_result result = run("provider ignored -D -w 1", {.meanwhile = meanwhile});
  EXPECT_EQ(result.status, 0);
  EXPECT_EQ(count_of(result.out, "user-pipe first"), 1U);
  EXPECT_EQ(count_of(result.out, "user-pipe second"), 1U);
  EXPECT_EQ(count_of(result.out, "\trings: "), 2U) << result.out;
}

TEST_F(watch_loop, EndsWithStatus0AfterAUsageErrorOfTheCommand) {
  const run_result result = run("provider -x -w 60");
  EXPECT_EQ(result.err, "provider: invalid option -- 'x'\n\t[--details, -D ]\n");
  EXPECT_EQ(hide_times(result.out), "\n<time>\n");
  EXPECT_EQ(result.status, 0);
}

TEST_F(watch_loop, GoesOnAfterAFailedFetch) {
  remove(kernel.table_path(provider_list));
  const std::string failure = "failed to retrieve nexus provider list, No such file or directory\n";
  const run_result result = run("provider -w 1", {.meanwhile = interrupt_after(2, failure)});
  const std::string once = "sysctl for len failed, No such file or directory\n" + failure;
  EXPECT_EQ(complained(result.err, result.status), complained(once + once));
}

TEST_F(front_end, DiagnosticsFollowTheReportTheyBelongTo) {
  kernel.table(provider_list, bytes(264).text(64, "en0").u32(128, 3) + bytes(1));
  EXPECT_EQ(run("provider", {.merged = true}),
            printed("user-pipe en0 00000000-0000-0000-0000-000000000000\nBuffer too short\n"));
}

TEST_F(write_error, FullDeviceIsReported) {
  const run_result full = complained("write error: No space left on device\n", 74);
  EXPECT_EQ(run("provider", {.stdout_path = "/dev/full"}), full);
  EXPECT_EQ(run("provider -f /dev/full"), full);
  EXPECT_EQ(run("provider -w 1", {.stdout_path = "/dev/full"}), full);
  make_long_report();
  EXPECT_EQ(run("provider -D -f /dev/full"), full);
}

TEST_F(write_error, ClosedStandardOutputIsReported) {
  const run_result closed = complained("write error: Bad file descriptor\n", 74);
  EXPECT_EQ(run("provider", {.closed = {1}}), closed);
  EXPECT_EQ(run("provider", {.closed = {0, 1}}), closed);
  EXPECT_EQ(run("provider", {.closed = {0, 1, 2}}).status, 74);
}

TEST_F(write_error, ClosedStandardOutputDoesNotMatterWithAnOutputFile) {
  EXPECT_EQ(run("provider -f " + kernel.file("out").string(), {.closed = {0, 1, 2}}), printed(""));
  EXPECT_EQ(contents_of(kernel.file("out")), report.out);
}

TEST_F(write_error, ReaderThatLeavesEndsTheProcessQuietly) {
  make_long_report();
  for (const std::vector<int> &ignored : {std::vector<int>{}, std::vector<int>{SIGPIPE}}) {
    const run_result result = run("provider", {.reader_leaves = true, .ignored = ignored});
    EXPECT_EQ(complained(result.err, result.status), complained("", -SIGPIPE));
  }
}

}  // namespace
