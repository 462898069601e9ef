#include <fcntl.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/stat.h>

#include <fstream>

#include "platform/threads/Log.h"
#include "tests/sdbus/RawPeer.h"
#include "tests/sdbus/SdBusTest.h"

namespace qv::platform::test {
namespace {

constexpr size_t kMostConnections = 1000;

class ListenerTest : public SdBusTest {
 protected:
  ListenerTest() : SdBusTest(options()) {}
  static SdBusIPCOptions options() {
    SdBusIPCOptions bounded;
    bounded.maximumConnections = kMostConnections;
    bounded.quotas.connections = 2 * kMostConnections;  // of one user
    return bounded;
  }
};

TEST_F(ListenerTest, PeersAreIdentifiedWhenTheyAreAccepted) {
  listen();
  const auto client = connectClient();
  const auto server = delegate_.connections.next();
  EXPECT_EQ(server->processIdentifier(), ::getpid());
  EXPECT_EQ(server->peer().userIdentifier, ::getuid());
  EXPECT_EQ(server->peer().bundleIdentifier, "com.example.pid" + std::to_string(::getpid()));
  EXPECT_TRUE(server->valueForEntitlement("com.example.allowed").asBool());
  EXPECT_TRUE(server->valueForEntitlement("com.example.other").isNone());
  ASSERT_TRUE(server->peer().processHandle);
  // A pidfd: its description in /proc names the process.
  std::ifstream info("/proc/self/fdinfo/" + std::to_string(server->peer().processHandle->get()));
  const std::string text((std::istreambuf_iterator<char>(info)), {});
  EXPECT_NE(text.find("Pid:\t" + std::to_string(::getpid())), std::string::npos) << text;
}

TEST_F(ListenerTest, ASecondDaemonIsRefusedUntilTheFirstEnds) {
  listen();
  EXPECT_FALSE(listener_->endpoint().isValid()) << "it has a name";
  struct stat status {};
  ASSERT_EQ(::stat((directory_ + "/test.service").c_str(), &status), 0);
  EXPECT_EQ(status.st_mode & 0777, 0660u);
  const auto second = client_->createListener("test.service");
  const auto error = second->resume();
  ASSERT_TRUE(error);
  EXPECT_EQ(error->code, EADDRINUSE);
  listener_->invalidate();
  EXPECT_FALSE(second->resume());
  second->invalidate();
  EXPECT_FALSE(client_->connect("test.service").hasValue());
}

TEST_F(ListenerTest, AnythingButAServedSocketIsAConnectError) {
  EXPECT_FALSE(client_->connect("test.service").hasValue());
  EXPECT_FALSE(client_->connect(ListenerEndpoint()).hasValue());
}

TEST_F(ListenerTest, ARefusedClientLosesItsConnection) {
  delegate_.accepts = false;
  listen();
  const auto client = connectClient();
  EXPECT_EQ(codeOf(call(*client, "nothing", {})), code(IPCErrorCode::ConnectionInvalid));
  EXPECT_EQ(clientEnded_.next(), "interrupted");
  EXPECT_TRUE(delegate_.ended.isEmpty());
}

TEST_F(ListenerTest, AnEndpointTravelsInAMessageAndLeadsBack) {
  listen();
  const auto client = connectClient();
  fakes::AcceptingDelegate extension(testInterface(), testInterface());
  extension.object->answer = echo;
  auto anonymous = client_->createAnonymousListener();
  anonymous->setDelegate(&extension, *queue_);
  ASSERT_FALSE(anonymous->resume());
  ASSERT_FALSE(anonymous->resume()) << "it is open";
  EXPECT_EQ(::send(anonymous->endpoint().rendezvous()->get(), "", 0, 0), 0) << "no connection, and in nobody's way";
  client->call("echo", {Value(Array{Value(anonymous->endpoint().rendezvous())})}, {}, {});
  const Call received = delegate_.object->takeCall();
  const Array items = received.arguments[0].asArray();
  ASSERT_EQ(items.size(), 1u);
  auto connection = server_->connect(ListenerEndpoint(*items[0].getIf<SharedFileDescriptor>()));
  ASSERT_TRUE(connection);
  EXPECT_EQ((*connection)->processIdentifier(), ::getpid());
  configure(**connection);
  (*connection)->resume();
  EXPECT_EQ(valuesOf(call(**connection, "echo", {Value("through")})), IPCArguments{Value("through")});
  // No name stands behind an endpoint: its loss is final.
  extension.connections.next()->invalidate();
  EXPECT_EQ(clientEnded_.next(), "invalidated");
  EXPECT_EQ(extension.connections.count(), 0u);
  received.reply({Value(true)});
  anonymous->invalidate();
  EXPECT_FALSE(anonymous->endpoint().isValid());
  EXPECT_TRUE(anonymous->resume()) << "it has ended";
  // Too late: refused at once, or lost when the listener's end closes.
  const auto late = server_->connect(ListenerEndpoint(*items[0].getIf<SharedFileDescriptor>()));
  if (!late) return;
  late.value()->setRemoteInterface(testInterface());
  late.value()->resume();
  EXPECT_EQ(codeOf(call(*late.value(), "nothing", {})), code(IPCErrorCode::ConnectionInvalid));
}

TEST_F(ListenerTest, AThousandClientsAreServedAndNoMore) {
  delegate_.object->answer = echo;
  listen();
  std::vector<std::shared_ptr<IPCConnection>> clients;
  Events<bool> answered;
  for (size_t i = 0; i < kMostConnections; ++i) {
    clients.push_back(connectClient());
    clients.back()->call("nothing", {}, [&](const IPCArguments&) { answered.add(true); }, {});
  }
  for (size_t i = 0; i < clients.size(); ++i) ASSERT_TRUE(answered.next());
  EXPECT_EQ(codeOf(call(*connectClient(), "nothing", {})), code(IPCErrorCode::ConnectionInvalid));
  clients.pop_back();
  EXPECT_EQ(delegate_.ended.next(), "invalidated");
  EXPECT_EQ(valuesOf(call(*connectClient(), "nothing", {})), IPCArguments{}) << "one has gone";
}

TEST_F(ListenerTest, WithoutDescriptorsConnectionsAreRefusedAndTheListenerLivesOn) {
  const auto client = connectEcho();
  // Its thread is begun with the first line, and a sanitizer that looks at a new thread needs descriptors.
  QV_LOG(logs::kIPC, "the log has begun");
  rlimit limit{};
  ASSERT_EQ(::getrlimit(RLIMIT_NOFILE, &limit), 0);
  for (int round = 0; round < 2; ++round) {
    EXPECT_EQ(valuesOf(call(*client, "nothing", {})), IPCArguments{}) << "and nobody opens anything now";
    rlimit exhausted = limit;
    exhausted.rlim_cur = static_cast<rlim_t>(FileDescriptor(::open("/dev/null", O_RDONLY | O_CLOEXEC)).get()) + 1;
    ASSERT_EQ(::setrlimit(RLIMIT_NOFILE, &exhausted), 0);
    RawPeer refused(directory_ + "/test.service");
    EXPECT_FALSE(refused.readUntil("anything"));
    ASSERT_EQ(::setrlimit(RLIMIT_NOFILE, &limit), 0);
  }
  EXPECT_EQ(valuesOf(call(*connectClient(), "nothing", {})), IPCArguments{});
}

}  // namespace
}  // namespace qv::platform::test
