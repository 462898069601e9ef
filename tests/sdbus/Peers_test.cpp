#include <fcntl.h>

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
  options.drainMilliseconds = 200;
  // It is the bounds of a peer that are reached here, not those of its user.
  options.quotas.callsPerSecond = options.quotas.callsAtOnce = 1e6;
  return options;
}

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
    connection.call(member, std::move(arguments), {}, into(failures));
  }
};

TEST_F(PeersTest, AClientThatDiesIsOneInvalidation) {
  listen();
  auto peer = std::make_unique<RawPeer>(socketPath());
  const auto server = admit(*peer);
  Events<int64_t> failures;
  sendNumbered(*server, "notify", 1, failures);
  EXPECT_TRUE(peer->readUntil("notify"));
  peer.reset();
  EXPECT_EQ(delegate_.ended.next(), "invalidated");
  EXPECT_EQ(failures.next(), code(IPCErrorCode::ConnectionInvalid));
  sendNumbered(*server, "notify", 2, failures);
  EXPECT_EQ(failures.next(), code(IPCErrorCode::ConnectionInvalid));
  EXPECT_TRUE(delegate_.ended.isEmpty());
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

TEST_F(PeersTest, FramesThatThePeerHasNotAnsweredAreBounded) {
  clientObject_->answer = [](const Call&) {};
  listen();
  const auto memory = shareFileDescriptor(FileDescriptor(::open("/dev/null", O_RDONLY | O_CLOEXEC)));
  const Value one(uint32_t{1});
  const IPCArguments frame{Value(Array{Value(memory), Value(memory), one, one, one, one}), Value(Data(72))};
  const auto client = connectClient();
  const auto answered = delegate_.connections.next();
  for (int i = 0; i < 6; ++i) EXPECT_EQ(valuesOf(call(*answered, "frame", frame)), IPCArguments{});
  RawPeer deaf(socketPath());
  const auto unanswered = admit(deaf);
  Events<int64_t> failures;
  for (int i = 0; i < 5; ++i) {
    unanswered->call("frame", frame, {}, into(failures));
  }
  EXPECT_EQ(failures.next(), code(IPCErrorCode::MessageDropped));
  unanswered->invalidate();
  for (int i = 0; i < 4; ++i) EXPECT_EQ(failures.next(), code(IPCErrorCode::ConnectionInvalid));
}

TEST_F(PeersTest, APeerThatAsksWithoutEndIsNotReadFurtherThanItIsServed) {
  std::promise<void> opened;
  const auto gate = opened.get_future().share();
  std::atomic<size_t> handled{0};
  delegate_.object->answer = [&handled, gate](const Call&) {
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

TEST_F(PeersTest, APeerThatTakesNothingIsNotWaitedFor) {
  listen();
  RawPeer first(socketPath()), second(socketPath());
  Events<int64_t> failures;
  for (RawPeer* deaf : {&first, &second}) sendNumbered(*admit(*deaf), "notify", 1, failures);
  for (int i = 0; i < 2; ++i) {
    EXPECT_EQ(failures.next(), code(IPCErrorCode::ConnectionInvalid)) << "its last reference has gone";
  }
  EXPECT_FALSE(first.readUntil("an end")) << "it is closed";
  listener_.reset();
  server_.reset();
  EXPECT_FALSE(second.readUntil("an end"));
}

TEST_F(PeersTest, CallsBeyondTheBoundOfUnansweredOnesAreRefused) {
  listen();
  const auto client = connectClient();
  Events<int64_t> failures;
  std::vector<Call> open;
  for (int i = 0; i < 9; ++i) {
    client->call("nothing", {}, {}, into(failures));
  }
  EXPECT_EQ(failures.next(), code(IPCErrorCode::RemoteError));
  for (int i = 0; i < 8; ++i) open.push_back(delegate_.object->takeCall());
  EXPECT_TRUE(failures.isEmpty());
  client->invalidate();
  for (int i = 0; i < 8; ++i) EXPECT_EQ(failures.next(), code(IPCErrorCode::ConnectionInvalid));
}

TEST_F(PeersTest, GarbageEndsItsConnectionOnly) {
  const auto client = connectEcho();
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
  RawPeer peer(socketPath());
  const auto server = admit(peer);
  Events<int64_t> failures;
  server->call("echo", {Value(1.0)}, {}, into(failures));
  EXPECT_TRUE(peer.readUntil("echo"));
  peer.send(rawReply("\1s\0\0\xFF\xFF\xFF\x7F"s));
  EXPECT_EQ(failures.next(), code(IPCErrorCode::RemoteError));
  EXPECT_EQ(delegate_.ended.next(), "invalidated");
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
