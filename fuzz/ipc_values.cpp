// What a peer sends over a connection that it has opened: bytes for sd-bus, and the values in its messages.
#include <unistd.h>

#include "fuzz/ServerBus.h"
#include "platform/base/KeyedArchive.h"
#include "platform/sdbus/BusCoding.h"
#include "tests/kit/SocketMessage.h"
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

namespace {

void receiveAll(std::string_view input) {
  const qv::fuzz::ServerBus bus(&receive, nullptr);
  const auto sendBytes = [&bus](std::string_view bytes, bool withDescriptor) {
    const std::vector<int> descriptors(withDescriptor ? 1 : 0, bus.peer.get());
    (void)qv::kit::sendMessage(bus.peer.get(), bytes, descriptors, MSG_NOSIGNAL | MSG_DONTWAIT);
  };
  sendBytes(test::rawHello(), false);
  qv::fuzz::require(bus.processAll() == 0 && bus.isReady(), "an authenticated bus");
  sendBytes(input.substr(1), (input[0] & 1) != 0);
  bus.processAll();
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  if (size == 0) return 0;
  const int first = FileDescriptor(::dup(STDERR_FILENO)).get();
  receiveAll({reinterpret_cast<const char*>(data), size});
  // libsystemd 252 loses those of a message whose head is damaged. In the service the gate keeps such from it.
  (void)::close_range(static_cast<unsigned>(first), ~0U, 0);
  return 0;
}
