// What a peer sends to the gate in front of sd-bus. The gate takes anything; of what it passes, sd-bus makes one
// message each, and loses no descriptor.
#include <fcntl.h>
#include <unistd.h>

#include <algorithm>

#include "fuzz/ServerBus.h"
#include "platform/sdbus/WireGate.h"
#include "tests/kit/SocketMessage.h"
#include "tests/sdbus/RawCall.h"

namespace {

using namespace qv::platform;
using namespace std::string_literals;

constexpr uid_t kPeer = 1000;
const std::string kHello = "\0AUTH EXTERNAL 31303030\r\nNEGOTIATE_UNIX_FD\r\nBEGIN\r\n"s;

int open() { return ::open("/dev/null", O_RDONLY | O_CLOEXEC); }

/// The number that the next descriptor gets: it rises when one was lost.
int nextNumber() { return FileDescriptor(open()).get(); }

/// A bus of this process, that something passed is written to.
class Bus {
 public:
  void take(sdbus::WireUnit unit) {
    send(unit);
    unit.descriptors.clear();
    qv::fuzz::require(server_.processAll() == 0, "sd-bus keeps the connection");
  }
  [[nodiscard]] bool isReady() const { return server_.isReady(); }
  [[nodiscard]] size_t received() const { return received_; }

 private:
  static int count(sd_bus_message*, void* bus, sd_bus_error*) {
    ++static_cast<Bus*>(bus)->received_;
    return 1;
  }

  void send(const sdbus::WireUnit& unit) const {
    std::vector<int> descriptors;
    for (const FileDescriptor& each : unit.descriptors) descriptors.push_back(each.get());
    const std::string_view bytes(reinterpret_cast<const char*>(unit.bytes.data()), unit.bytes.size());
    const ssize_t sent = qv::kit::sendMessage(server_.peer.get(), bytes, descriptors);
    qv::fuzz::require(sent == static_cast<ssize_t>(bytes.size()), "room in a socket");
  }

  size_t received_ = 0;
  const qv::fuzz::ServerBus server_{&count, this};
};

void run(std::string_view bytes, size_t most, size_t descriptors) {
  Bus bus;
  sdbus::WireGate gate(sdbus::authenticationOfClient(kPeer, ::getuid()));
  size_t messages = 0;
  while (!bytes.empty() && !gate.fault()) {
    const auto room = gate.room();
    qv::fuzz::require(!room.empty(), "a gate that wants something");
    const size_t size = std::min({room.size(), bytes.size(), most});
    std::copy_n(bytes.begin(), size, room.begin());
    bytes.remove_prefix(size);
    std::vector<FileDescriptor> with;
    if (gate.isAuthenticated()) {
      for (; descriptors > 0; --descriptors) with.emplace_back(open());
    }
    gate.filled(size, std::move(with));
    qv::fuzz::require(gate.heldBytes() <= sdbus::kMaximumWireMessage, "a bound of what is held");
    if (!gate.hasUnit()) continue;
    auto unit = gate.takeUnit();
    messages += unit.isMessage;
    bus.take(std::move(unit));
    qv::fuzz::require(bus.isReady() == gate.isAuthenticated(), "sd-bus has authenticated whom the gate has");
    qv::fuzz::require(bus.received() == messages, "sd-bus takes what passed, and nothing else");
  }
}

}  // namespace

/// The first byte: how many descriptors come with the first message (0 to 7), and in what pieces. The second: whether
/// there is an authentication before the rest, or the rest is one.
std::vector<std::string> qv::fuzz::seeds() {
  using test::rawCall;
  const std::string plain = rawCall("a.b", "c", "u", "\1\0\0\0"s);
  const std::string frame = rawCall("a.b", "frame", "(hh)", std::string(8, '\0'), 0, "/x", 2);
  std::string answer = rawCall("a.b", "c", "s", "\1\0\0\0x\0"s);
  answer[1] = '\2';
  answer[16] = '\5';  // not quite one
  return {"\x00m"s + plain + plain,
          "\x02m"s + frame + plain,
          "\x09m"s + rawCall("a.b", "c", "a{sv}", std::string(8, '\0'), 0, "/x", 1),
          "\x00m"s + answer,
          "\x00m"s + rawCall("org.freedesktop.DBus.Peer", "Ping", "", ""),
          "\x00"s + "a" + kHello + plain,
          "\x00"s + "a" + "\0AUTH\r\nAUTH EXTERNAL\r\nDATA 31303030\r\nBEGIN\r\n"s + plain};
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  if (size < 2) return 0;
  static constexpr size_t kPieces[] = {size_t{1} << 20, 1, 3, 17};
  const std::string rest(reinterpret_cast<const char*>(data + 2), size - 2);
  const int before = nextNumber();
  run(data[1] == 'a' ? rest : kHello + rest, kPieces[(data[0] >> 3) & 3], data[0] & 7);
  qv::fuzz::require(nextNumber() == before, "no descriptor is lost");
  return 0;
}
