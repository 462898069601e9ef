// What a peer sends over a connection that it has opened: bytes for sd-bus, and the values in its messages.
#include <sys/socket.h>
#include <unistd.h>

#include <cstring>

#include "fuzz/Target.h"
#include "platform/base/FileDescriptor.h"
#include "platform/base/KeyedArchive.h"
#include "platform/sdbus/BusCoding.h"
#include "platform/sdbus/Handles.h"
#include "tests/sdbus/RawCall.h"

namespace {

using namespace qv::platform;
using Signatures = std::vector<std::string>;

constexpr const char kInterface[] = "com.tarnwick.quorveld.Test";

/// Each kind of signature that the interfaces have.
const Signatures* signaturesOf(sd_bus_message* message) {
  static const Signatures kKnown[] = {
      {"v"}, {"a{sv}", "s"}, {"(hhuuuu)", "ay"}, {"aa{sv}", "a{sv}"}, {"au", "(dd)", "b", "ah", "i", "x", "t", "d"}};
  for (const Signatures& known : kKnown) {
    std::string signature;
    for (const std::string& type : known) signature += type;
    if (sd_bus_message_has_signature(message, signature.c_str()) > 0) return &known;
  }
  return nullptr;
}

/// The contents without descriptors, so that they can be compared; a number may be none.
Data contentsOf(const IPCArguments& values) { return encodeKeyedArchive("", {{"values", Value(Array(values))}}); }

void sendOn(sd_bus_message* received, const Signatures& signatures, const IPCArguments& values) {
  sd_bus_message* message = nullptr;
  sd_bus* bus = sd_bus_message_get_bus(received);
  if (sd_bus_message_new_method_call(bus, &message, nullptr, "/x", kInterface, "again") < 0) return;
  const sdbus::MessageHandle handle(message);
  const int r = sdbus::encodeArguments(message, signatures, values);
  // A list takes a level more in a variant of its own kind.
  qv::fuzz::require(r >= 0 || r == -ELOOP, "what was received can be sent");
  if (r < 0) return;
  IPCArguments again;
  qv::fuzz::require(sd_bus_message_seal(message, 1, 0) >= 0, "a message of values is complete");
  qv::fuzz::require(sdbus::decodeArguments(message, signatures, again) == 0, "what can be sent can be received");
  qv::fuzz::require(contentsOf(again) == contentsOf(values), "values keep their contents");
}

int receive(sd_bus_message* message, void*, sd_bus_error*) {
  const Signatures* signatures = signaturesOf(message);
  IPCArguments values;
  if (signatures && sdbus::decodeArguments(message, *signatures, values) == 0) sendOn(message, *signatures, values);
  return 1;
}

void sendBytes(int socket, const void* bytes, size_t size, bool withDescriptor) {
  iovec data{const_cast<void*>(bytes), size};
  alignas(cmsghdr) char control[CMSG_SPACE(sizeof(int))] = {};
  msghdr header{};
  header.msg_iov = &data;
  header.msg_iovlen = 1;
  if (withDescriptor) {
    header.msg_control = control;
    header.msg_controllen = sizeof control;
    cmsghdr* item = CMSG_FIRSTHDR(&header);
    *item = {CMSG_LEN(sizeof(int)), SOL_SOCKET, SCM_RIGHTS};
    std::memcpy(CMSG_DATA(item), &socket, sizeof socket);
  }
  (void)!::sendmsg(socket, &header, MSG_NOSIGNAL | MSG_DONTWAIT);
}

int processAll(sd_bus* bus) {
  int r = 1;
  while (r > 0) r = sd_bus_process(bus, nullptr);
  return r;
}

sdbus::BusHandle makeBus(FileDescriptor socket) {
  sd_bus* bus = nullptr;
  qv::fuzz::require(sd_bus_new(&bus) >= 0, "memory");
  sdbus::BusHandle handle(bus);
  const int fd = socket.release();
  sd_id128_t id{};
  const bool made = sd_bus_set_fd(bus, fd, fd) >= 0 && sd_bus_negotiate_fds(bus, 1) >= 0 &&
                    sd_bus_set_server(bus, 1, id) >= 0 && sd_bus_add_filter(bus, nullptr, &receive, nullptr) >= 0 &&
                    sd_bus_start(bus) >= 0;
  qv::fuzz::require(made, "a bus");
  return handle;
}

}  // namespace

/// The first byte tells whether a descriptor goes with the message.
std::vector<std::string> qv::fuzz::seeds() {
  using namespace std::string_literals;
  using test::rawCall;
  const std::string dictionary =
      "\x25\0\0\0\0\0\0\0\1\0\0\0a\0\1u\0\0\0\0\7\0\0\0\1\0\0\0b\0\1s\0\0\0\0\4\0\0\0text\0"s;
  return {"0" + rawCall(kInterface, "echo", "v", "\1s\0\0\4\0\0\0text\0"s),
          "0" + rawCall(kInterface, "echo", "v", "\3(d)\0\0\0\0\0\0\0\0\0\0\xE0\x3F"s),
          "0" + rawCall(kInterface, "echo", "v", "\2av\0\x12\0\0\0\1u\0\0\7\0\0\0\1s\0\0\1\0\0\0x\0"s),
          "0" + rawCall(kInterface, "echo", "v", "\5a{sv}\0\0"s + dictionary),
          "0" + rawCall(kInterface, "echo", "v", "\2aq\0\4\0\0\0\1\0\2\0"s),
          "0" + rawCall(kInterface, "stopped", "a{sv}s", dictionary + "\0\0\0\1\0\0\0x\0"s),
          "0" + rawCall(kInterface, "many", "au(dd)bahixtd",
                        "\4\0\0\0\7\0\0\0"s + std::string(16, '\0') + "\1\0\0\0\0\0\0\0\1\0\0\0\0\0\0\0"s +
                            std::string(24, '\1')),
          "1" + rawCall(kInterface, "frame", "(hhuuuu)ay", std::string(24, '\0') + "\4\0\0\0data"s, 0,
                        "/com/tarnwick/quorveld", 1)};
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  if (size == 0) return 0;
  int ends[2];
  qv::fuzz::require(::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0, ends) == 0, "sockets");
  const FileDescriptor peer(ends[0]);
  const sdbus::BusHandle bus = makeBus(FileDescriptor(ends[1]));
  std::string uid;
  for (const char digit : std::to_string(::getuid())) uid += {'3', digit};
  using namespace std::string_literals;
  const std::string hello = "\0AUTH EXTERNAL "s + uid + "\r\nNEGOTIATE_UNIX_FD\r\nBEGIN\r\n";
  sendBytes(peer.get(), hello.data(), hello.size(), false);
  qv::fuzz::require(processAll(bus.get()) == 0 && sd_bus_is_ready(bus.get()) > 0, "an authenticated bus");
  sendBytes(peer.get(), data + 1, size - 1, (data[0] & 1) != 0);
  processAll(bus.get());
  return 0;
}
