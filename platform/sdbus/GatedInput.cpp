#include "platform/sdbus/GatedInput.h"

#include <sys/socket.h>

#include <array>
#include <cerrno>
#include <cstring>
#include <utility>

namespace qv::platform::sdbus {
namespace {

UserQuota::Time now() { return UserQuota::Time::clock::now(); }

template <typename Each>
void forEachDescriptor(const cmsghdr* item, const Each& each) {
  for (size_t at = CMSG_LEN(0); at + sizeof(int) <= item->cmsg_len; at += sizeof(int)) {
    int fd = -1;
    std::memcpy(&fd, reinterpret_cast<const char*>(item) + at, sizeof fd);
    each(fd);
  }
}

}  // namespace

/// What one read of a socket brings.
struct GatedInput::Chunk {
  explicit Chunk(std::span<uint8_t> room) : data{room.data(), room.size()} {
    header.msg_iov = &data;
    header.msg_iovlen = 1;
    header.msg_control = control.data();
    header.msg_controllen = control.size();
  }

  ssize_t read(int socket) {
    ssize_t size = 0;
    do {
      size = ::recvmsg(socket, &header, MSG_DONTWAIT | MSG_CMSG_CLOEXEC);
    } while (size < 0 && errno == EINTR);
    if (size < 0) return size;
    for (cmsghdr* item = CMSG_FIRSTHDR(&header); item; item = CMSG_NXTHDR(&header, item)) take(item);
    return size;
  }

  std::vector<FileDescriptor> descriptors;
  std::optional<ucred> sender;
  [[nodiscard]] bool isCut() const { return header.msg_flags & MSG_CTRUNC; }

 private:
  void take(const cmsghdr* item) {
    if (item->cmsg_level != SOL_SOCKET) return;
    if (item->cmsg_type == SCM_RIGHTS) forEachDescriptor(item, [this](int fd) { descriptors.emplace_back(fd); });
    if (item->cmsg_type == SCM_CREDENTIALS) std::memcpy(&sender.emplace(), CMSG_DATA(item), sizeof(ucred));
  }

  iovec data;
  msghdr header{};
  // What does not fit, the kernel closes.
  static constexpr size_t kRoom = CMSG_SPACE(sizeof(int) * kMaximumWireDescriptors) + CMSG_SPACE(sizeof(ucred));
  alignas(cmsghdr) std::array<char, kRoom> control;
};

GatedInput::GatedInput(int socket, std::unique_ptr<WireAuthentication> authentication, PeerGuard guard)
    : socket_(socket), guard_(std::move(guard)), gate_(std::move(authentication)) {}

Result<FileDescriptor> GatedInput::open() {
  int ends[2];
  if (::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0, ends) != 0) {
    return Error::posix(errno, "gate");
  }
  output_.reset(ends[0]);
  return FileDescriptor(ends[1]);
}

GatedInput::Progress GatedInput::advance(bool isBusReady) {
  if (!refusal_.empty()) return Progress::Refused;
  if (!leaving_) {
    if (hasEnded_) return Progress::Idle;
    const Progress progress = readUnit();
    if (!leaving_) return progress;
  }
  if (leaving_->isMessage && !isBusReady) return Progress::Idle;
  return handOn();
}

GatedInput::Progress GatedInput::readUnit() {
  while (!gate_.hasUnit()) {
    if (!mayBeginMessage()) return Progress::Paused;
    Chunk chunk(gate_.room());
    const ssize_t size = chunk.read(socket_);
    if (size < 0 && (errno == EAGAIN || errno == EWOULDBLOCK)) return Progress::Idle;
    if (size <= 0) return end();
    if (take(chunk, static_cast<size_t>(size)) == Progress::Refused) return Progress::Refused;
  }
  finished();
  return Progress::Moved;
}

GatedInput::Progress GatedInput::take(Chunk& chunk, size_t size) {
  if (guard_.sender) {
    const bool isPeer =
        chunk.sender && chunk.sender->pid == guard_.sender->process && chunk.sender->uid == guard_.sender->user;
    if (!isPeer) return refuse("dropped: another process than the one that connected uses its connection");
  }
  if (chunk.isCut()) return refuse("dropped: more descriptors than can be taken");
  gate_.filled(size, std::move(chunk.descriptors));
  if (gate_.fault()) return refuse(std::string("dropped: ") + gate_.fault());
  if (!guard_.share->holdBytes(gate_.heldBytes())) return refuse("dropped: too much that is unfinished");
  return Progress::Moved;
}

bool GatedInput::mayBeginMessage() {
  return !gate_.isAuthenticated() || gate_.heldBytes() > 0 || isForgiven_ || guard_.share->quota().mayCall(now());
}

void GatedInput::finished() {
  leaving_ = gate_.takeUnit();
  written_ = 0;
  ++finishedUnits_;
  if (!leaving_->isMessage) return;
  isForgiven_ = false;
  guard_.share->quota().countCall(now());
}

std::chrono::milliseconds GatedInput::beginPause() {
  isForgiven_ = true;
  return guard_.share->quota().pause(now());
}

GatedInput::Progress GatedInput::handOn() {
  const size_t before = written_;
  while (written_ < leaving_->bytes.size()) {
    const ssize_t size = write();
    if (size < 0 && errno == EINTR) continue;
    if (size < 0 && (errno == EAGAIN || errno == EWOULDBLOCK)) break;
    if (size < 0) return end();  // sd-bus has given the connection up
    written_ += static_cast<size_t>(size);
    leaving_->descriptors.clear();
  }
  if (written_ == leaving_->bytes.size()) {
    leaving_.reset();
    (void)guard_.share->holdBytes(0);
  }
  return written_ > before ? Progress::Moved : Progress::Idle;
}

/// The descriptors go with the first byte.
ssize_t GatedInput::write() {
  const auto rest = std::span(leaving_->bytes).subspan(written_);
  iovec data{rest.data(), rest.size()};
  alignas(cmsghdr) char control[CMSG_SPACE(sizeof(int) * kMaximumWireDescriptors)] = {};
  msghdr header{};
  header.msg_iov = &data;
  header.msg_iovlen = 1;
  if (const size_t bytes = leaving_->descriptors.size() * sizeof(int); bytes > 0) {
    header.msg_control = control;
    header.msg_controllen = CMSG_SPACE(bytes);
    cmsghdr* item = CMSG_FIRSTHDR(&header);
    *item = {CMSG_LEN(bytes), SOL_SOCKET, SCM_RIGHTS};
    for (size_t i = 0; i < leaving_->descriptors.size(); ++i) {
      const int fd = leaving_->descriptors[i].get();
      std::memcpy(CMSG_DATA(item) + i * sizeof fd, &fd, sizeof fd);
    }
  }
  return ::sendmsg(output_.get(), &header, MSG_DONTWAIT | MSG_NOSIGNAL);
}

GatedInput::Progress GatedInput::refuse(const std::string& why) {
  refusal_ = why;
  leaving_.reset();
  return Progress::Refused;
}

GatedInput::Progress GatedInput::end() {
  hasEnded_ = true;
  leaving_.reset();
  output_.reset();
  return Progress::Moved;
}

bool GatedInput::isUnfinished() const {
  return !hasEnded_ && (!gate_.isAuthenticated() || gate_.heldBytes() > 0 || leaving_);
}

}  // namespace qv::platform::sdbus
