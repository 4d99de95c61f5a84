// The flows as JSON lines, as one would write them first with a library: the whole table is read, each value
// handed to its Writer. Arguments: the root, and the time and the host that the lines have.

#include <arpa/inet.h>
#include <rapidjson/filewritestream.h>
#include <rapidjson/writer.h>

#include <string>

extern "C" {
#include "obvious.h"
}

namespace {

char buffer[1 << 16];
rapidjson::FileWriteStream out(stdout, buffer, sizeof buffer);
rapidjson::Writer<rapidjson::FileWriteStream> json(out);

struct named {
  uint32_t number;
  const char *name;
};
constexpr named classes[] = {{0, "BE"},         {0x80090, "BKS"}, {0x100080, "BK"}, {0x180010, "RD"},
                             {0x200020, "OAM"}, {0x280120, "AV"}, {0x300110, "RV"}, {0x380100, "VI"},
                             {0x400180, "VO"},  {0x480190, "CTL"}};
constexpr named letters[] = {{4, "t"},  {5, "c"},  {6, "l"},  {8, "q"},  {9, "b"},  {12, "w"}, {13, "e"},
                             {24, "a"}, {25, "n"}, {26, "d"}, {27, "o"}, {30, "x"}, {31, "r"}};

void put(const char *name, uint64_t value) {
  json.Key(name);
  json.Uint64(value);
}

void put_unless(const char *name, uint32_t value, uint32_t none) {
  json.Key(name);
  if (value == none) {
    json.Null();
  } else {
    json.Uint(value);
  }
}

void put(const char *name, const char *text, size_t size) {
  json.Key(name);
  json.String(text, static_cast<rapidjson::SizeType>(strnlen(text, size)));
}

void put_name(const char *name, const char *known, int64_t number) {
  json.Key(name);
  json.String(known ? known : ("unknown(" + std::to_string(number) + ")").c_str());
}

void put_class(int32_t number) {
  const char *known = nullptr;
  for (const named &each : classes) {
    if (each.number == static_cast<uint32_t>(number)) known = each.name;
  }
  put_name("service_class", known, number);
}

void put_flags(uint32_t flags) {
  json.Key("flags");
  json.StartArray();
  for (uint32_t bit = 0; bit < 32; ++bit) {
    if (!(flags >> bit & 1)) continue;
    const char *known = nullptr;
    for (const named &each : letters) {
      if (each.number == bit) known = each.name;
    }
    json.String(known ? known : ("bit(" + std::to_string(bit) + ")").c_str());
  }
  json.EndArray();
}

void put_end(const char *name, const endpoint_address &end, uint8_t family) {
  char text[INET6_ADDRSTRLEN];
  uint8_t address[16];
  unsigned scope = 0;
  memcpy(address, end.ipv6, sizeof address);
  if ((address[0] == 0xfe && (address[1] & 0xc0) == 0x80) ||
      (address[0] == 0xff && ((address[1] & 15) == 1 || (address[1] & 15) == 2))) {
    scope = static_cast<unsigned>(address[2] << 8 | address[3]);
    address[2] = address[3] = 0;
  }
  json.Key(name);
  json.StartObject();
  json.Key("address");
  if (family == 2) {
    json.String(inet_ntop(AF_INET, end.ipv4, text, sizeof text));
  } else if (family == 30) {
    json.String(inet_ntop(AF_INET6, address, text, sizeof text));
  } else {
    json.Null();
  }
  put_unless("scope", family == 30 ? scope : 0, 0);
  put_unless("port", family == 2 || family == 30 ? ntohs(end.port) : UINT32_MAX, UINT32_MAX);
  json.EndObject();
}

void put_stats(const char *name, const endpoint_stats &stats) {
  const char *state = state_name(stats.state);
  json.Key(name);
  json.StartObject();
  put("bytes", stats.bytes);
  put("packets", stats.packets);
  put_name("state", strcmp(state, "UNKNOWN") == 0 ? nullptr : state, stats.state);
  put_unless("rtt_us", stats.rtt, 0);
  json.EndObject();
}

void put_flow(const flow &each, const char *time, const char *host) {
  const char *protocol = protocol_name(each.protocol);
  json.StartObject();
  put("schema", 1);
  put("kind", "flow", 4);
  put("time", time, SIZE_MAX);
  put("host", host, SIZE_MAX);
  put("nexus", uuid_text(each.nexus), SIZE_MAX);
  put("interface", each.interface, sizeof each.interface);
  put_unless("bucket", each.bucket, UINT32_MAX);
  put("process", each.process, sizeof each.process);
  json.Key("pid");
  json.Int(each.pid);
  put_flags(each.flags);
  put_unless("port", each.port, UINT32_MAX);
  put_name("protocol", strcmp(protocol, "unk.") == 0 ? nullptr : protocol, each.protocol);
  put_class(each.service_class);
  put_unless("advisory", each.advisory, UINT32_MAX);
  put_end("local", each.local, each.local.family);
  put_end("remote", each.remote, each.local.family);
  put_stats("tx", each.local_stats);
  put_stats("rx", each.remote_stats);
  json.EndObject();
}

}  // namespace

int main(int argc, char **argv) {
  size_t size = 0;
  if (argc < 4) return 64;
  const auto *flows = static_cast<const flow *>(read_table(argv[1], "stats/flow", &size));
  for (size_t i = 0; i < size / sizeof *flows; ++i) {
    put_flow(flows[i], argv[2], argv[3]);
    out.Put('\n');
    json.Reset(out);
  }
  out.Flush();
  return ferror(stdout) != 0;
}
