// provider, also called list-providers.

#include <gtest/gtest.h>

#include "tests/support/records.h"

namespace {

constexpr char first_instance[] = "01000000-0000-0000-0000-00000000000A";

std::string heading(const std::string &type_and_name) {
  return type_and_name + " FEDCBA98-7654-3210-0123-456789ABCDEF\n";
}

const std::string wifi = provider(provider("wifi", 3, 1).u32(144, 2), {first_instance, mixed_uuid});
const std::string wifi_heading = heading("flow-switch (multistack) wifi");
const std::string wifi_rings =
    "\trings: tx 152 rx 156 slots: tx 160 rx 164 bufsize 168 metasize 172 mhints 188\n";
const std::string wifi_instances =
    "\tinstance 01000000-0000-0000-0000-00000000000A\n"
    "\tinstance FEDCBA98-7654-3210-0123-456789ABCDEF\n";
const std::string wifi_listing = wifi_heading + wifi_instances;
const run_result cut_off = complained(too_short, 0, wifi_listing);

run_result list(const std::string &table, const words &line = "provider", const run_options &options = {}) {
  return run_on(provider_list, table, line, options);
}

TEST(provider, ListsInTheOrderOfTheTable) {
  EXPECT_EQ(list(provider("z") + wifi + provider("a") + provider("z")),
            printed(heading("user-pipe z") + wifi_listing + heading("user-pipe a") + heading("user-pipe z")));
  EXPECT_EQ(list(wifi, "provider -- -D"), printed(wifi_listing));
}

TEST(provider, DetailsStandBetweenHeadingAndInstances) {
  const run_result detailed = printed(wifi_heading + wifi_rings + wifi_instances);
  for (const char *line : {"provider -D", "provider -DD", "provider --d", "provider x -D", "provider -D x",
                           "LIST-PROVIDERS --details"}) {
    EXPECT_EQ(list(wifi, line), detailed) << line;
  }
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

TEST(provider, HeadingNamesTypeAndAnonymity) {
  const struct {
    std::uint32_t type, subtype, flags;
    const char *name, *anonymous = "";
  } cases[] = {
      {0, 1, 0, "user-pipe"},
      {1, 1, 1, "kernel-pipe", " [anon]"},
      {2, 1, ~0U, "net-if", " [anon]"},
      {3, 0, ~1U, "flow-switch (bridge)"},
      {3, 2, 0, "flow-switch (unknown type))"},
      {3, ~0U, 0, "flow-switch (unknown type))"},
      {4, 0, 0, "unknown"},
      {~0U, 1, 0, "unknown"},
  };
  for (const auto &[type, subtype, flags, name, anonymous] : cases) {
    EXPECT_EQ(list(provider("p", type, subtype).u32(144, flags)),
              printed(name + std::string(" p ") + mixed_uuid + anonymous + "\n"));
  }
}

TEST(provider, NameEndsAtItsLengthItsNulOrItsField) {
  const std::string full(64, 'n');
  const struct {
    std::string field;
    std::uint32_t length;
    std::string shown;
  } cases[] = {{"utun", 2, "ut"},        {"utun", 0, ""},   {"utun", 64, "utun"},
               {{"ut\0un", 5}, 5, "ut"}, {full, 64, full},  {full, 65, full},
               {full, 0x7FFFFFFF, full}, {full, ~0U, full}, {full, 0x80000000, full}};
  for (const auto &[field, length, shown] : cases)
    EXPECT_EQ(list(provider(field, 2).u32(128, length)), printed(heading("net-if " + shown))) << length;
}

TEST(provider, NamesAreWholeOnATerminalOfTheirCharacterSetButCannotDriveIt) {
  const std::string name = "\u00c4nderung, gr\u00f6\u00dfe\u20ac\033[31m\x7f\u202e\xc2\x9b\xc0\xaf";
  const bytes record = provider(name + "\u20ac").u32(128, static_cast<std::uint32_t>(name.size() + 2));
  const std::string by_bytes = "\xc3?nderung, gr\xc3\xb6\xc3?e\xe2?\xac?[31m?\xe2?\xae\xc2?\xc0\xaf\xe2?";
  const std::pair<const char *, std::string> locales[] = {
      {"C.UTF-8", "\u00c4nderung, gr\u00f6\u00dfe\u20ac?[31m" + std::string(10, '?')},
      {"C", by_bytes},
      {"no_WHERE.UTF-8", by_bytes}};
  for (const auto &[locale, shown] : locales) {
    run_options options{.environment = {{"LC_ALL", locale}}};
    EXPECT_EQ(list(record, "provider", options), printed(heading("user-pipe " + name + "\xe2\x82")));
    options.terminal = true;
    EXPECT_EQ(list(record, "provider", options), printed(heading("user-pipe " + shown))) << locale;
  }
}

TEST(provider, InstanceCountsThatLieAreNotFollowed) {
  const std::string instance = bytes(16).uuid(0, first_instance);
  EXPECT_EQ(list(wifi + provider("p").u32(256, 0) + instance),
            complained(too_short, 0, wifi_listing + heading("user-pipe p")));
  for (const std::uint32_t count : {2U, 0x0FFFFFFFU, 0x10000000U, 0x10000001U, 0x80000000U, 0xFFFFFFFFU})
    EXPECT_EQ(list(std::string(wifi).append(provider("p").u32(256, count)).append(instance)), cut_off)
        << count;
}

}  // namespace
