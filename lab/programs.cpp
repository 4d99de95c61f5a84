#include "lab/programs.h"

namespace lab {

namespace {

constexpr service browser[] = {
    {tcp_protocol, 443, best_effort, false, {180, 1300}, 300},
    {udp_protocol, 443, best_effort, false, {140, 1250}, 400},
    {tcp_protocol, 80, best_effort, false, {220, 1100}, 40},
};
constexpr service shell[] = {
    {tcp_protocol, 22, management, true, {210, 120}, 30},
    {udp_protocol, 60001, management, true, {180, 110}, 20},
};
constexpr service softphone[] = {
    {udp_protocol, 5004, voice, false, {200, 200}, 50},
    {tcp_protocol, 5061, control, true, {400, 380}, 2},
};
constexpr service videocall[] = {
    {udp_protocol, 3478, video, false, {1050, 1100}, 220},
    {tcp_protocol, 443, responsive, false, {300, 600}, 15},
};
constexpr service syncd[] = {
    {tcp_protocol, 443, background, false, {1350, 80}, 150},
    {tcp_protocol, 873, background_system, false, {90, 1400}, 200},
    {udp_protocol, 443, background, false, {1200, 90}, 80},
};
constexpr service player[] = {
    {tcp_protocol, 443, audio_video, false, {70, 1400}, 350},
    {udp_protocol, 5004, responsive_video, false, {100, 1200}, 280},
};
constexpr service resolver[] = {
    {udp_protocol, 53, control, false, {75, 150}, 20},
    {tcp_protocol, 53, control, true, {190, 80}, 5},
    {tcp_protocol, 853, control, false, {120, 230}, 10},
};
constexpr service mailer[] = {
    {tcp_protocol, 993, best_effort, false, {110, 800}, 25},
    {tcp_protocol, 587, best_effort, false, {1100, 90}, 20},
    {udp_protocol, 443, best_effort, false, {120, 900}, 30},
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
