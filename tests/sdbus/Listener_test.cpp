#include <fcntl.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>

#include <cstring>
#include <fstream>

#include "tests/sdbus/SdBusTest.h"

namespace qv::platform::test {
namespace {

class ListenerTest : public SdBusTest {};

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
  struct stat status {};
  ASSERT_EQ(::stat((directory_ + "/test.service").c_str(), &status), 0);
  EXPECT_EQ(status.st_mode & 0777, 0666u);
  const auto second = client_->createListener("test.service");
  const auto error = second->resume();
  ASSERT_TRUE(error);
  EXPECT_EQ(error->code, EADDRINUSE);
  listener_->invalidate();
  EXPECT_FALSE(second->resume());
  second->invalidate();
  EXPECT_FALSE(client_->connect("test.service").hasValue());
}

TEST_F(ListenerTest, ASocketThatADeadDaemonLeftIsReplacedButNoOtherFile) {
  const std::string path = directory_ + "/test.service";
  {
    const FileDescriptor stale(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    path.copy(address.sun_path, sizeof address.sun_path - 1);
    ASSERT_EQ(::bind(stale.get(), reinterpret_cast<sockaddr*>(&address), sizeof address), 0);
  }
  EXPECT_EQ(valuesOf(call(*connectEcho(), "nothing", {})), IPCArguments{});
  std::ofstream(directory_ + "/other.service") << "precious";
  EXPECT_TRUE(server_->createListener("other.service")->resume());
  EXPECT_TRUE(std::filesystem::exists(directory_ + "/other.service"));
}

TEST_F(ListenerTest, AnythingButAServedSocketIsAConnectError) {
  EXPECT_FALSE(client_->connect("test.service").hasValue());
  EXPECT_FALSE(client_->connect(std::string(200, 'x')).hasValue());
  EXPECT_TRUE(server_->createListener(std::string(200, 'x'))->resume());
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
  received.reply({Value(true)});
  anonymous.reset();
  // Too late: refused at once, or lost when the listener's end closes.
  const auto late = server_->connect(ListenerEndpoint(*items[0].getIf<SharedFileDescriptor>()));
  if (!late) return;
  late.value()->setRemoteInterface(testInterface());
  late.value()->resume();
  EXPECT_EQ(codeOf(call(*late.value(), "nothing", {})), code(IPCErrorCode::ConnectionInvalid));
}

TEST_F(ListenerTest, WhatComesThroughARendezvousMustBeAStreamPair) {
  fakes::AcceptingDelegate extension(testInterface(), testInterface());
  extension.object->answer = echo;
  auto anonymous = server_->createAnonymousListener();
  anonymous->setDelegate(&extension, *queue_);
  ASSERT_FALSE(anonymous->resume());
  const int rendezvous = anonymous->endpoint().rendezvous()->get();
  // No descriptor, an empty message, a file, a listening socket.
  EXPECT_EQ(::send(rendezvous, "c", 1, 0), 1);
  EXPECT_EQ(::send(rendezvous, "", 0, 0), 0);
  const FileDescriptor file(::open("/dev/null", O_RDONLY | O_CLOEXEC));
  const FileDescriptor listening(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  for (const int fd : {file.get(), listening.get()}) {
    char byte = 'c';
    iovec data{&byte, 1};
    alignas(cmsghdr) char control[CMSG_SPACE(sizeof(int))] = {};
    msghdr header{};
    header.msg_iov = &data;
    header.msg_iovlen = 1;
    header.msg_control = control;
    header.msg_controllen = sizeof control;
    cmsghdr* item = CMSG_FIRSTHDR(&header);
    *item = {CMSG_LEN(sizeof(int)), SOL_SOCKET, SCM_RIGHTS};
    std::memcpy(CMSG_DATA(item), &fd, sizeof fd);
    EXPECT_EQ(::sendmsg(rendezvous, &header, 0), 1);
  }
  auto connection = client_->connect(anonymous->endpoint());
  ASSERT_TRUE(connection);
  configure(**connection);
  (*connection)->resume();
  EXPECT_EQ(valuesOf(call(**connection, "echo", {Value("fine")})), IPCArguments{Value("fine")});
  EXPECT_EQ(extension.connections.count(), 1u);
  anonymous.reset();
}

TEST_F(ListenerTest, AThousandClientsAreServed) {
  delegate_.object->answer = echo;
  listen();
  std::vector<std::shared_ptr<IPCConnection>> clients;
  Events<bool> answered;
  for (int i = 0; i < 1000; ++i) {
    clients.push_back(connectClient());
    clients.back()->call("nothing", {}, [&](const IPCArguments&) { answered.add(true); }, {});
  }
  for (size_t i = 0; i < clients.size(); ++i) ASSERT_TRUE(answered.next());
}

}  // namespace
}  // namespace qv::platform::test
