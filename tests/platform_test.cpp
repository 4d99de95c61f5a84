// Kernel variables and process names as files.

#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <limits.h>
#include <stdarg.h>
#include <sys/mman.h>
#include <sys/prctl.h>
#include <unistd.h>

#include <cstring>

#include "platform/descriptor.h"
#include "platform/memory.h"
#include "platform/process.h"
#include "platform/sysctl.h"
#include "tests/support/kernel_dir.h"

// Files of the live kernel that fail or are long, under names of variables, and a machine without /proc.
static bool has_proc = true;

extern "C" int __real_open(const char *path, int flags, ...);
extern "C" int __wrap_open(const char *path, int flags, ...) {
  va_list more;
  va_start(more, flags);
  const mode_t mode = flags & O_CREAT ? va_arg(more, mode_t) : 0;
  va_end(more);
  const std::string_view name(path);
  if (name == "/proc/sys/kern/broken") path = "/proc/self/mem";
  if (name == "/proc/sys/kern/long") path = "/proc/self/maps";
  if (!has_proc && name.starts_with("/proc/")) path = "/none";
  return __real_open(path, flags, mode);
}

namespace {

constexpr char node[] = "kern.tarvel.stats.flow";

class platform_test : public testing::Test {
 protected:
  platform_test() { setenv("TARVEL_ROOT", kernel.root().c_str(), 1); }
  ~platform_test() override { unsetenv("TARVEL_ROOT"); }

  // What a call left behind: the error number or 0, and the length.
  using answer = std::pair<int, std::size_t>;

  static answer measure(const std::string &name) {
    answer result{0, 12345};
    if (sysctlbyname(name.c_str(), nullptr, &result.second, nullptr, 0) != 0) result.first = errno;
    return result;
  }

  // Reads into a buffer of `size` bytes. Nothing behind them may change.
  answer read(const char *name, std::size_t size) {
    data = std::string(size + 64, '#');
    answer result{0, size};
    if (sysctlbyname(name, data.data(), &result.second, nullptr, 0) != 0) result.first = errno;
    EXPECT_EQ(data.substr(size), std::string(64, '#'));
    data.resize(result.first ? 0 : result.second);
    return result;
  }

  static std::string process_name(int pid) {
    char name[platform::process_name_size];
    std::memset(name, '#', sizeof name);
    return platform::query_process_name(pid, name) ? name : "(none)";
  }

  kernel_dir kernel;
  std::string data;
};

using sysctl_test = platform_test;
using process_test = platform_test;

TEST_F(sysctl_test, DeliversTheFileWhereItFits) {
  kernel.table(node, "ten bytes.");
  EXPECT_EQ(measure(node), (answer{0, 10}));
  EXPECT_EQ(read(node, 10), (answer{0, 10}));
  EXPECT_EQ(data, "ten bytes.");
  for (const std::size_t size : {0U, 1U, 9U}) EXPECT_EQ(read(node, size).first, ENOMEM) << size;
  kernel.table(node, "short");
  EXPECT_EQ(read(node, 10), (answer{0, 5}));
  EXPECT_EQ(data, "short");
  kernel.table(node, "");
  EXPECT_EQ(measure(node), (answer{0, 0}));
  EXPECT_EQ(read(node, 0), (answer{0, 0}));
  kernel.table(node, std::string(100'000, 'x'));
  EXPECT_EQ(read(node, 99'999).first, ENOMEM);
  EXPECT_EQ(read(node, 100'000), (answer{0, 100'000}));
}

TEST_F(sysctl_test, NamesThatNoVariableHasAreENOENT) {
  kernel.table("a.b", "x");
  write_file(kernel.root() / "proc/secret", "x");
  for (const std::string &name : {std::string(), std::string("a/b"), std::string("a.b/../../../secret"),
                                  std::string("../secret"), std::string(5000, 'x'), std::string(node)}) {
    EXPECT_EQ(measure(name).first, ENOENT) << name.substr(0, 40);
  }
  EXPECT_EQ(read(node, 10).first, ENOENT);
  const std::string long_name = "kern." + std::string(200, 'x') + ".y";
  kernel.table(long_name, "found");
  EXPECT_EQ(measure(long_name), (answer{0, 5}));
}

TEST_F(sysctl_test, WhatIsNoReadableFileIsRefused) {
  kernel.table(node, "x").table("kern.open", "y").table("kern.pipe", "");
  EXPECT_EQ(measure("kern.tarvel.stats").first, EISDIR);
  EXPECT_EQ(read("kern.tarvel", 10).first, EISDIR);
  remove(kernel.table_path("kern.pipe"));
  ASSERT_EQ(mkfifo(kernel.table_path("kern.pipe").c_str(), 0666), 0);
  EXPECT_NE(measure("kern.pipe").first, 0);
  EXPECT_NE(read("kern.pipe", 10).first, 0);

  chmod(kernel.table_path(node).c_str(), 0);
  const bool root = geteuid() == 0;  // who may read everything
  ASSERT_TRUE(!root || seteuid(65534) == 0);
  const answer open = measure("kern.open");
  const answer closed = measure(node);
  ASSERT_TRUE(!root || seteuid(0) == 0);
  if (open.first == EACCES) GTEST_SKIP() << "the way to the temporary directory is closed to others";
  EXPECT_EQ(open, (answer{0, 1}));
  EXPECT_EQ(closed.first, EACCES);
}

TEST_F(sysctl_test, SwitchThatIsAskedForAgainAnswersAnew) {
  kernel.table("kern.one", "1").table("kern.two", "2");
  for (const std::string value : {"a", "b", "c"}) {
    write_file(kernel.table_path("kern.one"), value);
    EXPECT_EQ(read("kern.one", 1), (answer{0, 1}));
    EXPECT_EQ(data, value);
    EXPECT_EQ(read("kern.two", 1), (answer{0, 1}));
    EXPECT_EQ(data, "2");
  }
  kernel.table("kern.two", "3");
  EXPECT_EQ(measure("kern.one"), (answer{0, 1}));
  EXPECT_EQ(read("kern.two", 1), (answer{0, 1}));
  EXPECT_EQ(data, "3");
  kernel.table("kern.two", "too long");
  EXPECT_EQ(read("kern.one", 1), (answer{0, 1}));
  EXPECT_EQ(read("kern.two", 1).first, ENOMEM);
  remove(kernel.table_path("kern.two"));
  EXPECT_EQ(read("kern.two", 1).first, ENOENT);
  EXPECT_EQ(read("kern.two", 1).first, ENOENT);
}

TEST_F(sysctl_test, NewValueIsEPERM) {
  kernel.table(node, "x");
  std::size_t length = 0;
  EXPECT_EQ(sysctlbyname(node, nullptr, &length, "y", 1) == -1 ? errno : 0, EPERM);
  EXPECT_EQ(sysctlbyname(node, nullptr, &length, nullptr, 1) == -1 ? errno : 0, EPERM);
  EXPECT_EQ(contents_of(kernel.table_path(node)), "x");
}

TEST_F(sysctl_test, WithoutALengthTellsWhetherThereIsSuchAVariable) {
  kernel.table(node, "x");
  EXPECT_EQ(sysctlbyname(node, nullptr, nullptr, nullptr, 0), 0);
  char untouched;
  EXPECT_EQ(sysctlbyname(node, &untouched, nullptr, nullptr, 0), 0);
  EXPECT_EQ(sysctlbyname("kern.none", nullptr, nullptr, nullptr, 0) == -1 ? errno : 0, ENOENT);
}

// What is below a root was made by whoever made the root.
TEST_F(sysctl_test, BelowARootNothingButItsOwnFilesIsOpened) {
  kernel.table(node, "inside").table("kern.other", "x");
  std::filesystem::create_symlink("other", kernel.table_path("kern.link"));
  std::filesystem::create_symlink("tarvel", kernel.table_path("kern.led"));
  const auto link = kernel.file("link");
  std::filesystem::create_symlink(kernel.root(), link);
  for (const auto &root : {kernel.root(), link}) {  // a link to the root is its caller's choice
    setenv("TARVEL_ROOT", root.c_str(), 1);
    EXPECT_EQ(read(node, 10), (answer{0, 6}));
    for (const bool there : {false, true}) {
      has_proc = there;
      EXPECT_EQ(measure("kern.other"), (answer{0, 1}));
      EXPECT_EQ(measure("kern.none").first, ENOENT);
      EXPECT_EQ(measure("kern.other.none").first, ENOTDIR);
      EXPECT_EQ(measure("kern.link").first, ELOOP);
      EXPECT_EQ(measure("kern.led.stats.flow").first, ENOTDIR);
    }
  }
  setenv("TARVEL_ROOT", "/", 1);
  EXPECT_EQ(process_name(getpid()), "(none)");
  EXPECT_EQ(measure("kernel.ostype").first, EPERM);
}

// What cannot be read at its front: no process has memory there.
TEST_F(sysctl_test, ErrorsOfReadsArePassedOn) {
  unsetenv("TARVEL_ROOT");
  EXPECT_EQ(measure("kern.broken").first, EIO);
  for (const std::size_t size : {0U, 1U, 100U}) EXPECT_EQ(read("kern.broken", size).first, EIO) << size;
}

TEST_F(sysctl_test, LargeFilesNeedNotStateTheirSize) {
  char *const pages =
      static_cast<char *>(mmap(nullptr, 800 * 4096, PROT_READ, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0));
  for (int i = 0; i < 800; i += 2) mprotect(pages + 4096 * i, 4096, PROT_NONE);
  unsetenv("TARVEL_ROOT");
  const std::size_t size = measure("kern.long").second;  // a line for each of them
  EXPECT_GT(size, 800 * 40U);
  EXPECT_EQ(read("kern.long", size / 2).first, ENOMEM);
  EXPECT_EQ(read("kern.long", 2 * size).first, 0);
  EXPECT_GT(data.size(), 800 * 40U);
  munmap(pages, 800 * 4096);
}

TEST_F(sysctl_test, RootThatNoPathHasIsRefused) {
  setenv("TARVEL_ROOT", std::string(PATH_MAX, '/').c_str(), 1);
  EXPECT_EQ(measure(node).first, ENAMETOOLONG);
}

TEST(descriptor_test, ClosedOneStaysAsItIs) {
  const int fd = memfd_create("closed", 0);
  close(fd);
  EXPECT_FALSE(platform::make_writes_nonblocking(fd));
  EXPECT_EQ(fcntl(fd, F_GETFD), -1);
}

TEST(memory_test, HintsLeaveBlockAndErrnoAlone) {
  constexpr std::size_t size = 8 << 20;
  const std::string before(size, 'x');
  std::string block = before;
  for (const auto hint : {platform::prefer_large_pages, platform::provide_pages}) {
    for (const std::size_t hinted : {std::size_t{100}, size}) {
      errno = 77;
      hint(block.data(), hinted);
      EXPECT_EQ(errno, 77);
      EXPECT_TRUE(block == before);
    }
  }
}

TEST(memory_test, ProvidedPagesAreThoseOfTheBlock) {
  const auto page = static_cast<std::size_t>(sysconf(_SC_PAGESIZE));
  auto *const pages = static_cast<char *>(
      mmap(nullptr, 4 * page, PROT_READ | PROT_WRITE, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0));
  ASSERT_NE(pages, MAP_FAILED);
  if (madvise(pages, page, MADV_POPULATE_WRITE) != 0) GTEST_SKIP() << "the system cannot";
  ASSERT_EQ(madvise(pages, page, MADV_DONTNEED), 0);
  platform::provide_pages(pages + 1, 3 * page);  // the first and the last one hold other things too
  unsigned char resident[4] = {};
  ASSERT_EQ(mincore(pages, 4 * page, resident), 0);
  EXPECT_THAT(resident, testing::ElementsAre(0, 1, 1, 0));
  munmap(pages, 4 * page);
}

TEST_F(platform_test, LiveMachineIsSeenOnlyWithoutAnotherRoot) {
  EXPECT_EQ(measure("kernel.ostype").first, ENOENT);
  EXPECT_EQ(process_name(getpid()), "(none)");
  unsetenv("TARVEL_ROOT");
  prctl(PR_SET_NAME, "a tarvel test");
  EXPECT_EQ(process_name(getpid()), "a tarvel test");
  const std::string expected = contents_of("/proc/sys/kernel/ostype");  // which does not state its size
  if (expected.empty()) GTEST_SKIP() << "no kernel variables here";
  EXPECT_EQ(measure("kernel").first, EISDIR);
  EXPECT_EQ(measure("kernel.ostype"), (answer{0, expected.size()}));
  EXPECT_EQ(read("kernel.ostype", expected.size() - 1).first, ENOMEM);
  EXPECT_EQ(read("kernel.ostype", expected.size()), (answer{0, expected.size()}));
  EXPECT_EQ(data, expected);
}

TEST_F(platform_test, DescriptorsAreGivenBack) {
  kernel.table(node, "ten bytes.").table("kern.switch", "1").process(25, "init\n");
  const auto count = [] {
    return std::distance(std::filesystem::directory_iterator("/proc/self/fd"),
                         std::filesystem::directory_iterator());
  };
  const auto before = count();
  for (int round = 0; round < 3; ++round) {
    EXPECT_EQ(read("kern.switch", 1), (answer{0, 1}));
    EXPECT_EQ(read(node, 10), (answer{0, 10}));
    EXPECT_EQ(measure("kern.tarvel.stats").first, EISDIR);
    EXPECT_EQ(process_name(25), "init");
  }
  EXPECT_EQ(count(), before);
}

TEST_F(process_test, NameIsTheTextUpToItsLineEndCutAt15Bytes) {
  const std::pair<std::string, const char *> cases[] = {
      {"init\n", "init"},
      {"no line end", "no line end"},
      {" two  words \n", " two  words "},
      {"two\nlines\n", "two\nlines"},
      {"exactly-fifteen\n", "exactly-fifteen"},
      {"exactly-fifteen", "exactly-fifteen"},
      {"sixteen-letters!\n", "sixteen-letters"},
      {std::string(200, 'x') + "\n", "xxxxxxxxxxxxxxx"},
  };
  for (const auto &[comm, name] : cases) {
    kernel.process(1, comm);
    EXPECT_EQ(process_name(1), name);
  }
  kernel.process(0, "zero\n").process(-1, "negative\n").process(3, "");
  for (const int pid : {0, -1, -2147483647 - 1, 2, 3}) EXPECT_EQ(process_name(pid), "(none)") << pid;
}

}  // namespace
