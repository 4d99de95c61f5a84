// Kernel variables and process names as files.

#include <fcntl.h>
#include <gtest/gtest.h>
#include <stdlib.h>
#include <sys/prctl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "platform/process.h"
#include "platform/sysctl.h"
#include "tests/support/kernel_dir.h"

namespace {

constexpr char node[] = "kern.tarvel.stats.flow";

class platform_test : public testing::Test {
 protected:
  platform_test() { setenv("TARVEL_ROOT", kernel.root().c_str(), 1); }
  ~platform_test() override { unsetenv("TARVEL_ROOT"); }

  // What a call left behind: the error number or 0, and the length.
  struct answer {
    int error;
    std::size_t length;
    bool operator==(const answer &) const = default;
  };

  static answer measure(const char *name) {
    answer result{0, 12345};
    if (sysctlbyname(name, nullptr, &result.length, nullptr, 0) != 0) result.error = errno;
    return result;
  }

  // Reads into a buffer of `size` bytes. Nothing behind them may change.
  answer read(const char *name, std::size_t size) {
    data = std::string(size + 64, '#');
    answer result{0, size};
    if (sysctlbyname(name, data.data(), &result.length, nullptr, 0) != 0) result.error = errno;
    EXPECT_EQ(data.substr(size), std::string(64, '#'));
    data.resize(result.error ? 0 : result.length);
    return result;
  }

  kernel_dir kernel;
  std::string data;
};

using sysctl_test = platform_test;
using process_test = platform_test;

TEST_F(sysctl_test, DeliversTheFile) {
  kernel.table(node, "ten bytes.");
  EXPECT_EQ(measure(node), (answer{0, 10}));
  EXPECT_EQ(read(node, 10), (answer{0, 10}));
  EXPECT_EQ(data, "ten bytes.");
}

TEST_F(sysctl_test, DeliversLessWhereTheTableShrank) {
  kernel.table(node, "ten bytes.");
  EXPECT_EQ(measure(node), (answer{0, 10}));
  kernel.table(node, "short");
  EXPECT_EQ(read(node, 10), (answer{0, 5}));
  EXPECT_EQ(data, "short");
  kernel.table(node, "");
  EXPECT_EQ(read(node, 10), (answer{0, 0}));
}

TEST_F(sysctl_test, TableLargerThanTheBufferIsENOMEM) {
  kernel.table(node, "ten bytes.");
  for (const std::size_t size : {0U, 1U, 9U}) EXPECT_EQ(read(node, size).error, ENOMEM) << size;
  kernel.table(node, std::string(100'000, 'x'));
  EXPECT_EQ(read(node, 99'999).error, ENOMEM);
  EXPECT_EQ(read(node, 100'000), (answer{0, 100'000}));
}

TEST_F(sysctl_test, EmptyTableHasLength0) {
  kernel.table(node, "");
  EXPECT_EQ(measure(node), (answer{0, 0}));
  EXPECT_EQ(read(node, 0), (answer{0, 0}));
}

TEST_F(sysctl_test, MissingVariableIsENOENT) {
  EXPECT_EQ(measure(node).error, ENOENT);
  EXPECT_EQ(read(node, 10).error, ENOENT);
}

TEST_F(sysctl_test, NamesThatNoVariableHasAreENOENT) {
  kernel.table("a.b", "x");
  write_file(kernel.root() / "proc/secret", "x");
  for (const std::string &name :
       {std::string(), std::string("a/b"), std::string("a.b/../../../secret"), std::string("../secret"),
        std::string(5000, 'x'), "a." + std::string(255, 'b')}) {
    EXPECT_EQ(measure(name.c_str()).error, ENOENT) << name.substr(0, 40);
  }
}

TEST_F(sysctl_test, LongNamesAreFound) {
  const std::string name = "kern." + std::string(200, 'x') + ".y";
  kernel.table(name, "found");
  EXPECT_EQ(measure(name.c_str()), (answer{0, 5}));
}

TEST_F(sysctl_test, GroupOfVariablesIsEISDIR) {
  kernel.table(node, "x");
  EXPECT_EQ(measure("kern.tarvel.stats").error, EISDIR);
  EXPECT_EQ(read("kern.tarvel", 10).error, EISDIR);
}

TEST_F(sysctl_test, VariableThatMayNotBeReadIsEACCES) {
  kernel.table(node, "x").table("kern.open", "y");
  chmod(kernel.table_path(node).c_str(), 0);
  const bool root = geteuid() == 0;  // who may read everything
  ASSERT_TRUE(!root || seteuid(65534) == 0);
  const answer open = measure("kern.open");
  const answer closed = measure(node);
  ASSERT_TRUE(!root || seteuid(0) == 0);
  if (open.error == EACCES) GTEST_SKIP() << "the way to the temporary directory is closed to others";
  EXPECT_EQ(open, (answer{0, 1}));
  EXPECT_EQ(closed.error, EACCES);
}

TEST_F(sysctl_test, NewValueIsEPERM) {
  kernel.table(node, "x");
  std::size_t length = 0;
  errno = 0;
  EXPECT_EQ(sysctlbyname(node, nullptr, &length, "y", 1), -1);
  EXPECT_EQ(errno, EPERM);
  EXPECT_EQ(contents_of(kernel.table_path(node)), "x");
}

TEST_F(sysctl_test, PipeInPlaceOfATableIsRefused) {
  kernel.table(node, "x");
  remove(kernel.table_path(node));
  ASSERT_EQ(mkfifo(kernel.table_path(node).c_str(), 0666), 0);
  EXPECT_NE(measure(node).error, 0);
  EXPECT_NE(read(node, 10).error, 0);
}

TEST_F(sysctl_test, FilesThatDoNotStateTheirSizeAreMeasured) {
  const std::string expected = contents_of("/proc/sys/kernel/ostype");
  if (expected.empty()) GTEST_SKIP() << "no kernel variables here";
  unsetenv("TARVEL_ROOT");
  EXPECT_EQ(measure("kernel.ostype"), (answer{0, expected.size()}));
  EXPECT_EQ(read("kernel.ostype", expected.size()), (answer{0, expected.size()}));
  EXPECT_EQ(data, expected);
}

TEST_F(sysctl_test, NothingFallsBackToTheLiveMachine) {
  EXPECT_EQ(measure("kernel.ostype").error, ENOENT);
  char name[platform::process_name_size] = "untouched";
  EXPECT_FALSE(platform::query_process_name(getpid(), name));
  EXPECT_STREQ(name, "untouched");
}

std::string process_name(int pid) {
  char name[platform::process_name_size];
  std::memset(name, '#', sizeof name);
  return platform::query_process_name(pid, name) ? name : "(none)";
}

TEST_F(process_test, NameIsTheTextUpToItsLineEnd) {
  kernel.process(1, "init\n")
      .process(2, "no line end")
      .process(3, " two  words \n")
      .process(4, "two\nlines\n");
  EXPECT_EQ(process_name(1), "init");
  EXPECT_EQ(process_name(2), "no line end");
  EXPECT_EQ(process_name(3), " two  words ");
  EXPECT_EQ(process_name(4), "two\nlines");
}

TEST_F(process_test, NameIsCutAt15Bytes) {
  kernel.process(1, "exactly-fifteen\n")
      .process(2, "sixteen-letters!\n")
      .process(3, std::string(200, 'x') + "\n");
  kernel.process(4, "exactly-fifteen");
  EXPECT_EQ(process_name(1), "exactly-fifteen");
  EXPECT_EQ(process_name(2), "sixteen-letters");
  EXPECT_EQ(process_name(3), std::string(15, 'x'));
  EXPECT_EQ(process_name(4), "exactly-fifteen");
}

TEST_F(process_test, ProcessesWithoutNameAreUnknown) {
  kernel.process(0, "zero\n").process(-1, "negative\n").process(3, "");
  for (const int pid : {0, -1, -2147483647 - 1, 2, 3}) EXPECT_EQ(process_name(pid), "(none)") << pid;
}

TEST_F(process_test, LiveProcessIsFound) {
  unsetenv("TARVEL_ROOT");
  prctl(PR_SET_NAME, "a tarvel test");
  EXPECT_EQ(process_name(getpid()), "a tarvel test");
}

}  // namespace
