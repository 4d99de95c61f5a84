// Kernel variables and process names as files; what else the system is asked for.

#include <sys/prctl.h>
#include <sys/resource.h>
#include <sys/stat.h>

#include "common/channel_snapshot.h"
#include "common/text/output_helpers.h"
#include "platform/root.h"
#include "tests/units/units.h"

// Files of the live kernel that fail or are long, under names of variables, and a machine without /proc.
extern "C" int __real_open(const char *path, int flags);
extern "C" int __wrap_open(const char *path, int flags) {
  const std::string_view name(path);
  if (name == "/proc/sys/kern/broken") path = "/proc/self/mem";
  if (name == "/proc/sys/kern/long") path = "/proc/self/smaps";
  return __real_open(!has_proc && name.starts_with("/proc/") ? "/none" : path, flags);
}

namespace {

constexpr std::size_t no_buffer = SIZE_MAX;

// The answer: an error's name, a size, or what a buffer holds, behind which nothing may change.
std::string ask(const std::string &name, std::size_t size = no_buffer) {
  const bool is_read = size != no_buffer;
  std::string data(is_read ? size + 8 : 0, '#');
  std::size_t length = size;
  const int result = sysctlbyname(name.c_str(), is_read ? data.data() : nullptr, &length, nullptr, 0);
  EXPECT_TRUE(!is_read || data.ends_with("########"));
  if (result) return strerrorname_np(errno);
  return is_read ? data.substr(0, length) : std::to_string(length);
}

TEST_F(kernel_files, VariableIsDeliveredWhereItFits) {
  for (const std::string &text : {"ten bytes."s, std::string(100'000, 'x'), ""s}) {
    put("sys/a", text);
    EXPECT_EQ(ask("a"), std::to_string(text.size()));
    for (const std::size_t more : {0U, 5U}) EXPECT_EQ(ask("a", text.size() + more), text);
    for (const std::size_t size : {0U, 1U, 9U}) EXPECT_EQ(ask("a", size), text.empty() ? "" : "ENOMEM");
  }
  char none = 'n';
  EXPECT_EQ(sysctlbyname("a", &none, nullptr, nullptr, 0) + none, 'n');
  EXPECT_EQ(sysctlbyname("none", nullptr, nullptr, nullptr, 0), -1);
  const capture said(diagnostics);
  void *buffer;
  std::size_t length;
  EXPECT_EQ(sysctl_fetch("a", &buffer, &length, "new", 0), EPERM);
  EXPECT_EQ(sysctl_fetch("a", &buffer, &length, nullptr, 1), EPERM);
}

// As many searches as would take minutes if each of them looked at every nexus.
TEST_F(kernel_files, NexusesWithoutChannelsAreLookedAtOnce) {
  constexpr std::uint32_t count = 1'000'000;
  put("sys/kern/tarvel/nexus_channel_list", std::string(24 * count, '\0'));
  channel_snapshot snapshot;
  EXPECT_TRUE(channel_snapshot_fetch(snapshot));
  ASSERT_EQ(snapshot.ref_count(), count);
  for (std::uint32_t i = 0; i < count; ++i) ASSERT_EQ(channel_snapshot_find(snapshot, {}), nullptr);
}

// What is below a root was made by whoever made the root.
TEST_F(kernel_files, BelowARootNothingButItsOwnFilesIsOpened) {
  put("secret", "x");
  put("sys/kern/flow", "inside");
  fs::create_symlink("kern/flow", root + "/proc/sys/link");
  fs::create_symlink("kern", root + "/proc/sys/led");
  fs::create_symlink(root, root + "/root");  // a link to the root is its caller's choice
  mkfifo((root + "/proc/sys/pipe").c_str(), 0666);
  const std::string long_name(200, 'x');
  put("sys/" + long_name + "/a", "found");
  for (const char *of : {"", "/", "/root"}) {
    setenv("TARVEL_ROOT", (root + of).c_str(), 1);
    has_proc = *of;
    std::istringstream words(
        "kern/flow ENOENT kern.flow/../../../secret ENOENT ../secret ENOENT none ENOENT kern EISDIR"
        " pipe EINVAL kern.flow.none ENOTDIR link ELOOP led.flow ENOTDIR kern.flow inside");
    for (std::string name, told; words >> name >> told;) EXPECT_EQ(ask(name, 10), told) << name << of;
    EXPECT_EQ(ask("") + ask(std::string(5000, 'x')) + ask(long_name + ".a"), "ENOENTENOENT5");
  }
  setenv("TARVEL_ROOT", root.c_str(), 1);
  rlimit all{};
  getrlimit(RLIMIT_NOFILE, &all);
  const int free = dup(STDERR_FILENO);
  close(free);
  const rlimit one{static_cast<rlim_t>(free) + 1, all.rlim_max};
  setrlimit(RLIMIT_NOFILE, &one);
  EXPECT_EQ(ask("kern.flow"), "EMFILE");  // found, but not opened
  setrlimit(RLIMIT_NOFILE, &all);
  setenv("TARVEL_ROOT", std::string(PATH_MAX, '/').c_str(), 1);
  EXPECT_EQ(ask("kern.flow"), "ENAMETOOLONG");
  setenv("TARVEL_ROOT", "/", 1);
  EXPECT_EQ(ask("kernel.ostype"), "EPERM");
}

TEST_F(kernel_files, SwitchThatIsAskedForAgainAnswersAnew) {
  std::istringstream steps(
      "one=a two=2 one one two two- one two two one=b one one=c one two=22 two two=3 two one");
  std::string told;
  for (std::string step; steps >> step;) {
    const std::string name = step.substr(0, 3);
    if (step == name) told += ask(name, 1) + " ";
    if (step[3] == '=') put("sys/" + name, step.substr(4));
    if (step[3] == '-') fs::remove(root + "/proc/sys/" + name);
  }
  EXPECT_EQ(told, "a a 2 a ENOENT ENOENT b c ENOMEM 3 c ");
}

// The name of a process, or its cut form, in a buffer behind which nothing may change.
std::string name_of(int pid, std::size_t size = 32, bool with_pid = false) {
  std::string buffer(size + 8, '#');
  const foreign_text name = pid_to_name(pid, buffer.data(), size, with_pid);
  EXPECT_TRUE(buffer.ends_with("########"));
  return std::string(name.text);
}

TEST_F(kernel_files, LiveMachineIsSeenOnlyWithoutARoot) {
  EXPECT_EQ(ask("kernel.ostype"), "ENOENT");
  EXPECT_EQ(name_of(getpid()), "<unknown>." + std::to_string(getpid()));
  unsetenv("TARVEL_ROOT");
  EXPECT_EQ(platform::given_root(), "");
  prctl(PR_SET_NAME, "a tarvel test");
  EXPECT_EQ(name_of(getpid()), "a tarvel test");
  EXPECT_EQ(ask("kernel.ostype") + ask("kernel.ostype", 6) + ask("kernel.ostype", 5), "6Linux\nENOMEM");
  for (const std::size_t size : {0U, 1U, 100U}) EXPECT_EQ(ask("kern.broken", size), "EIO");
  EXPECT_EQ(ask("kern.broken") + ask("kernel"), "EIOEISDIR");
  const std::size_t size = std::stoul(ask("kern.long"));
  EXPECT_GT(size, 20'000U);
  EXPECT_EQ(ask("kern.long", size / 2), "ENOMEM");
  EXPECT_GT(ask("kern.long", 2 * size).size(), 20'000U);
}

TEST_F(kernel_files, NameOfAProcessIsItsTextUpToTheLineEndCutToTheBuffer) {
  std::string names, cut;
  for (int pid = -1; const char *comm : {"x\n", "x\n", "init\n", "no end", " two  words \n", "two\nlines\n",
                                         "exactly-fifteen", "exactly-fifteen\n", "sixteen-letters!\n", ""}) {
    put(std::to_string(pid) + "/comm", comm);
    names += name_of(pid++) + ",";
  }
  EXPECT_EQ(names,
            "<unknown>.-1,<unknown>.0,init,no end, two  words ,two\nlines,exactly-fifteen,"
            "exactly-fifteen,sixteen-letters,<unknown>.8,");
  for (std::size_t size = 1; size < 8; ++size) cut += name_of(1, size, true) + "," + name_of(1, size) + " ";
  EXPECT_EQ(cut, ", i,i in,in ini,ini init,init init.,init init.1,init ");
  EXPECT_EQ(name_of(9, 11, true) + name_of(9, 12, true), "<unknown>.<unknown>.9");
}

}  // namespace
