#include "platform/sdbus/Sockets.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

#include <algorithm>
#include <vector>

#include "tests/kit/ScratchFolder.h"
#include "tests/kit/SocketMessage.h"

namespace qv::platform::sdbus {
namespace {

using Pair = std::pair<FileDescriptor, FileDescriptor>;

Pair pairOf(int type) {
  int ends[2];
  EXPECT_EQ(::socketpair(AF_UNIX, type | SOCK_CLOEXEC, 0, ends), 0);
  return {FileDescriptor(ends[0]), FileDescriptor(ends[1])};
}

bool isClosedOnExec(const FileDescriptor& fd) { return ::fcntl(fd.get(), F_GETFD) == FD_CLOEXEC; }

template <typename T>
int64_t codeOf(const Result<T>& result) {
  return result ? 0 : result.error().code;
}

class SocketsTest : public testing::Test {
 protected:
  /// Whether a listener takes what is sent to it in one message.
  bool accepts(const std::vector<int>& fds) {
    EXPECT_EQ(kit::sendMessage(rendezvous_.second.get(), "c", fds), 1);
    const auto accepted = acceptFrom(rendezvous_.first.get());
    EXPECT_FALSE(acceptFrom(rendezvous_.first.get())) << "nothing is left";
    return accepted.value().isValid();
  }
  const kit::ScratchFolder folder_;
  const std::string path_ = folder_.path() + "/service";
  Pair rendezvous_ = std::move(*createRendezvous());
};

TEST_F(SocketsTest, AServiceIsReachedUnderAPathThatFitsAnAddress) {
  const std::string longest = path_ + std::string(sizeof(sockaddr_un::sun_path) - 1 - path_.size(), 'x');
  EXPECT_EQ(codeOf(connectTo(longest)), ENOENT);
  {
    auto served = listenAt(longest, "");
    ASSERT_TRUE(served);
    EXPECT_TRUE(isClosedOnExec(served->socket) && isClosedOnExec(served->lock));
    EXPECT_EQ(codeOf(listenAt(longest, "")), EADDRINUSE);
    struct stat lock {};
    EXPECT_EQ(::fstat(served->lock.get(), &lock), 0);
    EXPECT_EQ(lock.st_mode & 07777, 0600u);
    auto client = connectTo(longest);
    EXPECT_TRUE(client && isClosedOnExec(*client));
  }
  EXPECT_EQ(codeOf(connectTo(longest)), ECONNREFUSED) << "it is dead";
  EXPECT_TRUE(listenAt(longest, ""));
  for (const std::string& impossible : {longest + "x", std::string()}) {
    EXPECT_EQ(codeOf(connectTo(impossible)), ENAMETOOLONG);
    EXPECT_EQ(codeOf(listenAt(impossible, "")), ENAMETOOLONG);
  }
  EXPECT_EQ(codeOf(listenAt(folder_.path() + "/none/service", "")), ENOENT);
  ASSERT_EQ(::mkdir(path_.c_str(), 0700), 0);
  EXPECT_EQ(codeOf(listenAt(path_, "")), EEXIST) << "no socket";
}

/// In a process of its own: the descriptors have fixed places.
[[noreturn]] void adopt(const std::string& path, int wanted, int other) {
  const int high = ::fcntl(wanted, F_DUPFD, 20);
  ::dup2(::fcntl(other, F_DUPFD, 20), 3);
  ::dup2(high, 4);
  ::fcntl(4, F_SETFL, 0);
  ::setenv("LISTEN_PID", std::to_string(::getpid()).c_str(), 1);
  ::setenv("LISTEN_FDS", "2", 1);
  const auto first = adoptActivatedSocket(path), again = adoptActivatedSocket(path);
  const bool isSet = first && again && isClosedOnExec(*first) && (::fcntl(first->get(), F_GETFL) & O_NONBLOCK);
  const bool isIt = ::fcntl(4, F_GETFL) & O_NONBLOCK;  // which copies share
  ::_exit(isSet && isIt && !adoptActivatedSocket(path + "x") ? 0 : 1);
}

TEST_F(SocketsTest, TheSocketThatTheServiceManagerOpenedIsTakenByItsPath) {
  EXPECT_FALSE(adoptActivatedSocket(path_));
  auto other = listenAt(path_ + "other", ""), wanted = listenAt(path_, "");
  EXPECT_EXIT(adopt(path_, wanted->socket.get(), other->socket.get()), testing::ExitedWithCode(0), "");
}

TEST_F(SocketsTest, OnlyOneEndOfAStreamPairComesThroughARendezvous) {
  const Pair pair = pairOf(SOCK_STREAM), packets = pairOf(SOCK_SEQPACKET);
  EXPECT_TRUE(accepts({pair.first.get()}));
  EXPECT_FALSE(accepts({}));
  EXPECT_FALSE(accepts({pair.first.get(), pair.second.get()}));
  EXPECT_FALSE(accepts({packets.first.get()}));
  auto named = listenAt(path_, "");
  auto client = connectTo(path_);
  const FileDescriptor accepted(::accept4(named->socket.get(), nullptr, nullptr, SOCK_CLOEXEC));
  const FileDescriptor unconnected(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  const FileDescriptor internet(::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0));
  for (const int wrong : {named->socket.get(), client->get(), accepted.get(), unconnected.get(), internet.get()}) {
    EXPECT_FALSE(accepts({wrong})) << wrong;
  }
  EXPECT_EQ(::send(rendezvous_.second.get(), "", 0, 0), 0);
  EXPECT_FALSE(acceptFrom(rendezvous_.first.get())->isValid());
}

TEST_F(SocketsTest, ConnectingThroughARendezvousWaitsForRoom) {
  using namespace std::chrono_literals;
  const int listener = rendezvous_.first.get(), endpoint = rendezvous_.second.get();
  auto ours = connectThrough(endpoint);
  const auto theirs = acceptFrom(listener);
  ASSERT_TRUE(ours && theirs->isValid());
  EXPECT_TRUE(isClosedOnExec(*ours) && isClosedOnExec(*theirs));
  char byte = 0;
  EXPECT_EQ(::write(ours->get(), "x", 1), 1);
  EXPECT_TRUE(::read(theirs->get(), &byte, 1) == 1 && byte == 'x');
  int64_t code = 0;
  while (code == 0) code = codeOf(connectThrough(endpoint, 0ms));
  EXPECT_EQ(code, ETIMEDOUT);
  EXPECT_TRUE(acceptFrom(listener)->isValid());
  EXPECT_TRUE(connectThrough(endpoint, 0ms));
  rendezvous_.first.reset();
  code = codeOf(connectThrough(endpoint));
  EXPECT_TRUE(code == EPIPE || code == ECONNRESET) << code;
  EXPECT_EQ(codeOf(connectThrough(ours->get())), ENOTSOCK);
}

TEST_F(SocketsTest, PeersArePinnedWithoutTheKernelsHelpToo) {
  Pair pair = pairOf(SOCK_STREAM);
  EXPECT_EQ(::write(pair.second.get(), "x", 1), 1) << "what waits to be read is no end";
  EXPECT_TRUE(openPeerProcess(pair.first.get(), ::getpid()));
  EXPECT_FALSE(openPeerProcess(pair.first.get(), 0));
  pair.second.reset();
  EXPECT_FALSE(openPeerProcess(pair.first.get(), ::getpid())) << "another process may have its pid";
  const FileDescriptor file(::open("/dev/null", O_RDONLY | O_CLOEXEC));
  EXPECT_EQ(peerOf(file.get()).userIdentifier, static_cast<uid_t>(-1));
  EXPECT_FALSE(peerOf(file.get()).processHandle);
}

TEST(DescriptorLimitTest, IsRaisedAsFarAsItMay) {
  rlimit limit{};
  ASSERT_EQ(::getrlimit(RLIMIT_NOFILE, &limit), 0);
  const rlimit low{100, limit.rlim_max};
  ASSERT_EQ(::setrlimit(RLIMIT_NOFILE, &low), 0);
  for (int round = 0; round < 2; ++round) {
    raiseDescriptorLimit();
    ASSERT_EQ(::getrlimit(RLIMIT_NOFILE, &limit), 0);
    EXPECT_EQ(limit.rlim_cur, std::min<rlim_t>(limit.rlim_max, 65536));
  }
}

}  // namespace
}  // namespace qv::platform::sdbus
