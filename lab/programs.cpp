#include "lab/programs.h"

namespace lab {

namespace {

// By the label that reports give it.
consteval std::int32_t of_class(std::string_view label) {
  return static_cast<std::int32_t>(service_classes.number(label));
}

constexpr service browser[] = {
    {tcp_protocol, 443, of_class("BE"), false, {180, 1300}, 300},
    {udp_protocol, 443, of_class("BE"), false, {140, 1250}, 400},
    {tcp_protocol, 80, of_class("BE"), false, {220, 1100}, 40},
};
constexpr service shell[] = {
    {tcp_protocol, 22, of_class("OAM"), true, {210, 120}, 30},
    {udp_protocol, 60001, of_class("OAM"), true, {180, 110}, 20},
};
constexpr service softphone[] = {
    {udp_protocol, 5004, of_class("VO"), false, {200, 200}, 50},
    {tcp_protocol, 5061, of_class("CTL"), true, {400, 380}, 2},
};
constexpr service videocall[] = {
    {udp_protocol, 3478, of_class("VI"), false, {1050, 1100}, 220},
    {tcp_protocol, 443, of_class("RD"), false, {300, 600}, 15},
};
constexpr service syncd[] = {
    {tcp_protocol, 443, of_class("BK"), false, {1350, 80}, 150},
    {tcp_protocol, 873, of_class("BKS"), false, {90, 1400}, 200},
    {udp_protocol, 443, of_class("BK"), false, {1200, 90}, 80},
};
constexpr service player[] = {
    {tcp_protocol, 443, of_class("AV"), false, {70, 1400}, 350},
    {udp_protocol, 5004, of_class("RV"), false, {100, 1200}, 280},
};
constexpr service resolver[] = {
    {udp_protocol, 53, of_class("CTL"), true, {150, 75}, 20},
    {tcp_protocol, 53, of_class("CTL"), true, {190, 80}, 5},
    {tcp_protocol, 853, of_class("CTL"), false, {120, 230}, 10},
};
constexpr service mailer[] = {
    {tcp_protocol, 993, of_class("BE"), false, {110, 800}, 25},
    {tcp_protocol, 587, of_class("BE"), false, {1100, 90}, 20},
    {udp_protocol, 443, of_class("BE"), false, {120, 900}, 30},
};

constexpr program all_programs[] = {
    {"browser", browser},     {"sshd", shell},    {"softphone", softphone},
    {"videocall", videocall}, {"syncd", syncd},   {"player", player},
    {"resolver", resolver},   {"mailer", mailer}, {"netd", {}},
    {"tunneld", {}},          {"vmd", {}},        {"packetd", {}},
};

}  // namespace

const std::span<const program> programs = all_programs;

}  // namespace lab
