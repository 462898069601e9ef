#include <fcntl.h>
#include <signal.h>
#include <spawn.h>
#include <sys/wait.h>

#include <future>

#include "tests/sdbus/RawPeer.h"
#include "tests/sdbus/SdBusTest.h"

namespace qv::platform::test {
namespace {

SdBusIPCOptions smallBounds() {
  SdBusIPCOptions options;
  options.maximumQueuedMediaBytes = 256 << 10;
  options.maximumQueuedBytes = 2 << 20;
  options.maximumFramesInFlight = 4;
  options.maximumUnhandledMessages = 32;
  options.maximumUnansweredCalls = 8;
  return options;
}

/// A process that ends with the test at the latest.
class PeerProcess {
 public:
  PeerProcess(const std::string& directory, const char* mode) {
    int ends[2];
    EXPECT_EQ(::pipe2(ends, O_CLOEXEC), 0);
    output_ = FileDescriptor(ends[0]);
    const FileDescriptor writing(ends[1]);
    posix_spawn_file_actions_t actions;
    posix_spawn_file_actions_init(&actions);
    posix_spawn_file_actions_adddup2(&actions, writing.get(), STDOUT_FILENO);
    std::string path = SDBUS_TEST_PEER;
    std::string folder = directory;
    std::string role = mode;
    char* arguments[] = {path.data(), folder.data(), role.data(), nullptr};
    EXPECT_EQ(::posix_spawn(&pid, path.c_str(), &actions, nullptr, arguments, environ), 0);
    posix_spawn_file_actions_destroy(&actions);
  }
  ~PeerProcess() { kill(); }
  void awaitReady() {
    char line[6];
    EXPECT_EQ(::read(output_.get(), line, sizeof line), 6);
  }
  void kill() {
    if (pid <= 0) return;
    ::kill(pid, SIGKILL);
    ::waitpid(std::exchange(pid, -1), nullptr, 0);
  }
  pid_t pid = -1;

 private:
  FileDescriptor output_;
};

class PeersTest : public SdBusTest {
 protected:
  PeersTest() : SdBusTest(smallBounds()) {}
  std::string socketPath() const { return directory_ + "/test.service"; }
  /// A raw client past its authentication, and our connection to it.
  std::shared_ptr<IPCConnection> admit(RawPeer& peer) {
    peer.authenticate();
    EXPECT_TRUE(peer.readUntil("AGREE_UNIX_FD\r\n"));
    return delegate_.connections.next();
  }
  void sendNumbered(IPCConnection& connection, const char* member, uint32_t number, Events<int64_t>& failures) {
    IPCArguments arguments{Value(number)};
    if (std::string_view(member) == "sample") arguments.push_back(Value(Data(60000)));
    connection.call(member, std::move(arguments), {}, [&failures](const Error& error) { failures.add(error.code); });
  }
};

TEST_F(PeersTest, AKilledClientIsOneInvalidation) {
  listen();
  PeerProcess peer(directory_, "client");
  const auto server = delegate_.connections.next();
  EXPECT_EQ(server->processIdentifier(), peer.pid);
  EXPECT_EQ(delegate_.object->calls.next().arguments, IPCArguments{Value(uint32_t{42})});
  peer.kill();
  EXPECT_EQ(delegate_.ended.next(), "invalidated");
  Events<int64_t> failures;
  sendNumbered(*server, "notify", 1, failures);
  EXPECT_EQ(failures.next(), code(IPCErrorCode::ConnectionInvalid));
  EXPECT_TRUE(delegate_.ended.isEmpty());
}

TEST_F(PeersTest, AKilledDaemonFailsOpenCallsThenInterrupts) {
  PeerProcess peer(directory_, "server");
  peer.awaitReady();
  const auto client = connectClient();
  Events<std::string> order;
  client->call("nothing", {}, {}, [&](const Error&) { order.add("failed"); });
  EXPECT_EQ(clientObject_->calls.next().member, "notify");
  client->setInterruptionHandler([&] { order.add("interrupted"); });
  peer.kill();
  EXPECT_EQ(order.next(), "failed");
  EXPECT_EQ(order.next(), "interrupted");
  EXPECT_TRUE(order.isEmpty());
  EXPECT_TRUE(clientEnded_.isEmpty());
}

TEST_F(PeersTest, APeerThatNeverReadsLosesMediaFirstAndIsThenCutOff) {
  listen();
  RawPeer peer(socketPath());
  const auto server = admit(peer);
  Events<int64_t> failures;
  for (uint32_t i = 0; i < 100; ++i) sendNumbered(*server, "sample", i, failures);
  // All but what the socket's buffer and the media bound take, about a dozen, however fast it is sent.
  for (int i = 0; i < 80; ++i) EXPECT_EQ(failures.next(), code(IPCErrorCode::MessageDropped));
  EXPECT_TRUE(delegate_.ended.isEmpty());
  Events<int64_t> controlFailures;
  constexpr uint32_t kFarBeyondTheBound = 20000;
  for (uint32_t i = 0; i < kFarBeyondTheBound; ++i) sendNumbered(*server, "notify", i, controlFailures);
  EXPECT_EQ(delegate_.ended.next(), "invalidated");
  for (uint32_t i = 0; i < kFarBeyondTheBound; ++i) {
    ASSERT_EQ(controlFailures.next(), code(IPCErrorCode::ConnectionInvalid));
  }
  EXPECT_TRUE(delegate_.ended.isEmpty());
}

TEST_F(PeersTest, AFrameThatWasAnsweredMakesRoomForAnother) {
  clientObject_->serve = [](const Call&) {};
  listen();
  const auto client = connectClient();
  const auto server = delegate_.connections.next();
  const auto memory = shareFileDescriptor(FileDescriptor(::open("/dev/null", O_RDONLY | O_CLOEXEC)));
  const Value one(uint32_t{1});
  const IPCArguments frame{Value(Array{Value(memory), Value(memory), one, one, one, one}), Value(Data(72))};
  for (int i = 0; i < 6; ++i) EXPECT_EQ(valuesOf(call(*server, "frame", frame)), IPCArguments{});
}

TEST_F(PeersTest, APeerThatAsksWithoutEndIsNotReadFurtherThanItIsServed) {
  std::promise<void> opened;
  const auto gate = opened.get_future().share();
  std::atomic<size_t> handled{0};
  delegate_.object->serve = [&handled, gate](const Call&) {
    gate.wait();
    ++handled;
  };
  listen();
  constexpr size_t kMost = 64 << 20;
  constexpr std::chrono::seconds kPatience{1};
  constexpr uint8_t kNoReplyExpected = 1;
  const std::string notify = rawCall(testInterface().name, "notify", "u", std::string("\1\0\0\0", 4), kNoReplyExpected);
  RawPeer asking(socketPath());
  const auto server = admit(asking);
  EXPECT_LT(asking.flood(notify, kMost, kPatience), 4u << 20);
  // Answers that nobody reads: sd-bus gives these by itself.
  RawPeer deaf(socketPath());
  const auto second = admit(deaf);
  const std::string ping = rawCall("org.freedesktop.DBus.Peer", "Ping", "", "");
  EXPECT_LT(deaf.flood(ping, kMost, kPatience), 4u << 20);
  opened.set_value();
  // Reading goes on where it stopped.
  EXPECT_GE(asking.flood(notify, 1 << 20, kNever), 1u << 20);
  EXPECT_GT(handled, 0u);
  EXPECT_TRUE(delegate_.ended.isEmpty());
}

TEST_F(PeersTest, CallsBeyondTheBoundOfUnansweredOnesAreRefused) {
  listen();
  const auto client = connectClient();
  Events<int64_t> failures;
  std::vector<Call> open;
  for (int i = 0; i < 9; ++i) {
    client->call("nothing", {}, {}, [&](const Error& error) { failures.add(error.code); });
  }
  EXPECT_EQ(failures.next(), code(IPCErrorCode::RemoteError));
  for (int i = 0; i < 8; ++i) open.push_back(delegate_.object->calls.next());
  EXPECT_TRUE(failures.isEmpty());
  client->invalidate();
  for (int i = 0; i < 8; ++i) EXPECT_EQ(failures.next(), code(IPCErrorCode::ConnectionInvalid));
}

TEST_F(PeersTest, GarbageEndsItsConnectionOnly) {
  delegate_.object->serve = echo();
  listen();
  const auto client = connectClient();
  const auto honest = delegate_.connections.next();
  using namespace std::string_literals;
  {
    RawPeer peer(socketPath());
    const auto server = delegate_.connections.next();
    peer.send("GET / HTTP/1.1\r\n\r\n");
    EXPECT_EQ(delegate_.ended.next(), "invalidated");
  }
  const std::string bodies[] = {
      "\0\0\0\0"s + std::string(400, '\xFF'),                                  // no message at all
      rawCall(testInterface().name, "echo", "v", "\1s\0\0\xFF\xFF\xFF\x7F"s),  // a text longer than the body
      rawCall(testInterface().name, "everything", "biuxtdsaya{sv}au(dd)aa{sv}ah", std::string(8, '\xFF')),
      rawCall(testInterface().name, "echo", "v", "\1h\0\0\0\0\0\0"s),  // a descriptor that was not sent
  };
  for (const std::string& body : bodies) {
    RawPeer peer(socketPath());
    const auto server = admit(peer);
    peer.send(body);
    EXPECT_EQ(delegate_.ended.next(), "invalidated");
  }
  EXPECT_EQ(valuesOf(call(*client, "nothing", {})), IPCArguments{});
}

TEST_F(PeersTest, TypesWithoutMeaningAreAnErrorReply) {
  listen();
  RawPeer peer(socketPath());
  const auto server = admit(peer);
  using namespace std::string_literals;
  peer.send(rawCall(testInterface().name, "echo", "v", "\6a{us}\0\0\0\0\0\0\0\0"s.replace(0, 1, "\5"s)));
  EXPECT_TRUE(peer.readUntil("org.freedesktop.DBus.Error.InvalidArgs"));
  peer.send(rawCall(testInterface().name, "unheardOf", "", ""));
  EXPECT_TRUE(peer.readUntil("org.freedesktop.DBus.Error.UnknownMethod"));
  EXPECT_TRUE(delegate_.ended.isEmpty());
}

}  // namespace
}  // namespace qv::platform::test
