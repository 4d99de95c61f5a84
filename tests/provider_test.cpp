// provider, also called list-providers.

#include <gtest/gtest.h>

#include "tests/support/bytes.h"
#include "tests/support/kernel_dir.h"
#include "tests/support/run.h"

namespace {

constexpr char provider_list[] = "kern.tarvel.nexus_provider_list";
constexpr std::size_t fixed_size = 264;

constexpr char wifi_uuid[] = "00112233-4455-6677-8899-AABBCCDDEEFF";
constexpr char first_instance[] = "01000000-0000-0000-0000-00000000000A";
constexpr char second_instance[] = "FEDCBA98-7654-3210-0123-456789ABCDEF";

// A provider without instances that is of type user pipe.
bytes provider(std::string_view name, std::uint32_t name_length) {
  return bytes(fixed_size).uuid(0, wifi_uuid).text(64, name).u32(128, name_length);
}
bytes provider(std::string_view name) {
  return provider(name, static_cast<std::uint32_t>(name.size()));
}

// A multistack flow switch with two instances and something different in each member.
std::string wifi() {
  return provider("wifi")
             .u32(132, 3)
             .u32(144, 2)
             .u32(148, 999)
             .u32(152, 4)
             .u32(156, 8)
             .u32(160, 256)
             .u32(164, 512)
             .u32(168, 2048)
             .u32(172, 64)
             .u32(180, 999)
             .u32(184, 1)
             .u32(188, 3)
             .u32(192, 999)
             .u32(256, 2) +
         bytes(16).uuid(0, first_instance) + bytes(16).uuid(0, second_instance);
}

std::string heading(const std::string &type_and_name) {
  return type_and_name + " " + wifi_uuid + "\n";
}

const std::string wifi_heading = heading("flow-switch (multistack) wifi");
const std::string wifi_rings = "\trings: tx 4 rx 8 slots: tx 256 rx 512 bufsize 2048 metasize 64 mhints 3\n";
const std::string wifi_instances =
    "\tinstance 01000000-0000-0000-0000-00000000000A\n"
    "\tinstance FEDCBA98-7654-3210-0123-456789ABCDEF\n";
const std::string wifi_listing = wifi_heading + wifi_instances;

const run_result cut_off = complained("Buffer too short\n", 0, wifi_listing);

run_result list(const std::string &table, const words &line = "provider", const run_options &options = {}) {
  kernel_dir kernel;
  kernel.table(provider_list, table);
  return run_tarvelctl(kernel, line, options);
}

TEST(provider, ListsHeadingAndInstances) {
  EXPECT_EQ(list(wifi()), printed(wifi_listing));
}

TEST(provider, DetailsStandBetweenHeadingAndInstances) {
  const run_result detailed = printed(wifi_heading + wifi_rings + wifi_instances);
  for (const char *line :
       {"provider -D", "provider --details", "provider -DD", "provider --d", "provider x -D", "provider -D x",
        "list-providers -D", "LIST-PROVIDERS --details"}) {
    EXPECT_EQ(list(wifi(), line), detailed) << line;
  }
}

TEST(provider, WordsBehindADoubleDashAreNoOptions) {
  EXPECT_EQ(list(wifi(), "provider -- -D"), printed(wifi_listing));
}

TEST(provider, KeepsTheOrderOfTheTable) {
  EXPECT_EQ(list(provider("z") + wifi() + provider("a") + provider("z")),
            printed(heading("user-pipe z") + wifi_listing + heading("user-pipe a") + heading("user-pipe z")));
}

TEST(provider, WithoutInstancesHasOnlyItsHeadingAndRings) {
  EXPECT_EQ(list(provider("p")), printed(heading("user-pipe p")));
  EXPECT_EQ(list(provider("p"), "provider -D"),
            printed(heading("user-pipe p") +
                    "\trings: tx 0 rx 0 slots: tx 0 rx 0 bufsize 0 metasize 0 mhints 0\n"));
}

TEST(provider, ParametersAreSigned) {
  bytes record = provider("p");
  for (const std::uint32_t at : {152U, 156U, 160U, 164U, 168U, 172U, 188U})
    record.u32(at, 0x80000000U + (at - 152));
  EXPECT_EQ(list(record, "provider -D"),
            printed(heading("user-pipe p") +
                    "\trings: tx -2147483648 rx -2147483644 slots: tx -2147483640 rx -2147483636"
                    " bufsize -2147483632 metasize -2147483628 mhints -2147483612\n"));
}

TEST(provider, OnlyFlagBit0MeansAnonymous) {
  const std::string anonymous = std::string("user-pipe p ") + wifi_uuid + " [anon]\n";
  EXPECT_EQ(list(provider("p").u32(144, 1)), printed(anonymous));
  EXPECT_EQ(list(provider("p").u32(144, 0xFFFFFFFF)), printed(anonymous));
  EXPECT_EQ(list(provider("p").u32(144, 0xFFFFFFFE)), printed(heading("user-pipe p")));
}

TEST(provider, TypesAreNamed) {
  struct {
    std::uint32_t type, subtype;
    const char *name;
  } const cases[] = {
      {0, 1, "user-pipe"},
      {1, 1, "kernel-pipe"},
      {2, 1, "net-if"},
      {3, 0, "flow-switch (bridge)"},
      {3, 1, "flow-switch (multistack)"},
      {3, 2, "flow-switch (unknown type))"},
      {3, 0xFFFFFFFF, "flow-switch (unknown type))"},
      {4, 0, "unknown"},
      {0xFFFFFFFF, 1, "unknown"},
  };
  for (const auto &[type, subtype, name] : cases) {
    EXPECT_EQ(list(provider("p").u32(132, type).u32(184, subtype)),
              printed(heading(std::string(name) + " p")));
  }
}

TEST(provider, NameIsCutAtItsLength) {
  EXPECT_EQ(list(provider("utun", 2)), printed(heading("user-pipe ut")));
  EXPECT_EQ(list(provider("utun", 0)), printed(heading("user-pipe ")));
}

TEST(provider, NameEndsAtItsFirstNul) {
  EXPECT_EQ(list(provider(std::string_view("ut\0un", 5))), printed(heading("user-pipe ut")));
  EXPECT_EQ(list(provider("utun", 64)), printed(heading("user-pipe utun")));
}

TEST(provider, NameEndsWithItsField) {
  const std::string name(64, 'n');
  for (const std::uint32_t length : {64U, 65U, 0x7FFFFFFFU, 0x80000000U, 0xFFFFFFFFU}) {
    EXPECT_EQ(list(provider(name, length).u32(132, 2)), printed(heading("net-if " + name))) << length;
  }
}

TEST(provider, ControlCharactersReachFilesUnchanged) {
  const std::string name = "a\033[31m\x7f\x9b\r\nb";
  EXPECT_EQ(list(provider(name)), printed(heading("user-pipe " + name)));
}

TEST(provider, ControlCharactersShowAsQuestionMarksOnATerminal) {
  EXPECT_EQ(list(provider("a\001\033[31m\x7f\x9b\r\nb\x1f\x20\xa0"), "provider", {.terminal = true}),
            printed(heading("user-pipe a??[31m????b?\x20\xa0")));
}

TEST(provider, EmptyTableIsReported) {
  EXPECT_EQ(list(""), printed("No providers\n"));
  EXPECT_EQ(list("", "list-providers -D"), printed("No providers\n"));
}

TEST(provider, MissingTableIsDiagnosed) {
  EXPECT_EQ(run_tarvelctl(kernel_dir(), "provider"),
            complained("sysctl for len failed, No such file or directory\n"
                       "failed to retrieve nexus provider list, No such file or directory\n"));
}

TEST(provider, TruncatedTrailingRecordIsNotRead) {
  const std::string last = wifi();
  for (std::size_t length = 1; length < last.size(); ++length) {
    EXPECT_EQ(list(wifi() + last.substr(0, length)), cut_off) << "last record cut at " << length;
  }
}

TEST(provider, InstanceCountsThatLieAreNotFollowed) {
  const std::string instance = bytes(16).uuid(0, first_instance);
  EXPECT_EQ(list(wifi() + provider("p").u32(256, 0) + instance),
            complained("Buffer too short\n", 0, wifi_listing + heading("user-pipe p")));
  EXPECT_EQ(list(wifi() + provider("p").u32(256, 1)), cut_off);
  for (const std::uint32_t count : {2U, 0x0FFFFFFFU, 0x10000000U, 0x10000001U, 0x80000000U, 0xFFFFFFFFU}) {
    EXPECT_EQ(list(wifi() + provider("p").u32(256, count) + instance), cut_off) << count;
  }
}

}  // namespace
