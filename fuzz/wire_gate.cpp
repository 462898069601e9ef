// What a peer sends to the gate in front of sd-bus. The gate takes anything; of what it passes, sd-bus makes one
// message each, and loses no descriptor.
#include <fcntl.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <cstring>

#include "fuzz/Target.h"
#include "platform/sdbus/Handles.h"
#include "platform/sdbus/WireGate.h"
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
  Bus() {
    int ends[2];
    qv::fuzz::require(::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0, ends) == 0, "sockets");
    peer_.reset(ends[0]);
    sd_bus* bus = nullptr;
    qv::fuzz::require(sd_bus_new(&bus) >= 0, "memory");
    bus_.reset(bus);
    const bool isMade = sd_bus_set_fd(bus, ends[1], ends[1]) >= 0 && sd_bus_negotiate_fds(bus, 1) >= 0 &&
                        sd_bus_set_server(bus, 1, {}) >= 0 && sd_bus_add_filter(bus, nullptr, &count, this) >= 0 &&
                        sd_bus_start(bus) >= 0;
    qv::fuzz::require(isMade, "a bus");
  }

  void take(sdbus::WireUnit unit) {
    send(unit);
    unit.descriptors.clear();
    int r = 1;
    while (r > 0) r = sd_bus_process(bus_.get(), nullptr);
    qv::fuzz::require(r == 0, "sd-bus keeps the connection");
  }
  [[nodiscard]] bool isReady() const { return sd_bus_is_ready(bus_.get()) > 0; }
  [[nodiscard]] size_t received() const { return received_; }

 private:
  static int count(sd_bus_message*, void* bus, sd_bus_error*) {
    ++static_cast<Bus*>(bus)->received_;
    return 1;
  }

  void send(const sdbus::WireUnit& unit) const {
    iovec data{const_cast<uint8_t*>(unit.bytes.data()), unit.bytes.size()};
    alignas(cmsghdr) char control[CMSG_SPACE(sizeof(int) * sdbus::kMaximumWireDescriptors)] = {};
    msghdr header{};
    header.msg_iov = &data;
    header.msg_iovlen = 1;
    if (const size_t bytes = unit.descriptors.size() * sizeof(int); bytes > 0) {
      header.msg_control = control;
      header.msg_controllen = CMSG_SPACE(bytes);
      cmsghdr* item = CMSG_FIRSTHDR(&header);
      *item = {CMSG_LEN(bytes), SOL_SOCKET, SCM_RIGHTS};
      for (size_t i = 0; i < unit.descriptors.size(); ++i) {
        const int fd = unit.descriptors[i].get();
        std::memcpy(CMSG_DATA(item) + i * sizeof fd, &fd, sizeof fd);
      }
    }
    const ssize_t sent = ::sendmsg(peer_.get(), &header, MSG_NOSIGNAL);
    qv::fuzz::require(sent == static_cast<ssize_t>(unit.bytes.size()), "room in a socket");
  }

  FileDescriptor peer_;
  sdbus::BusHandle bus_;
  size_t received_ = 0;
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
