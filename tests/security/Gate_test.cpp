#include <signal.h>
#include <sys/wait.h>

#include "tests/security/AttackTest.h"

namespace qv::security {
namespace {

using platform::FileDescriptor;

class GateTest : public AttackTest {
 protected:
  using AttackTest::AttackTest;
  static std::string notify(size_t descriptors = 0) {
    return rawCall(testInterface().name, "notify", "u", "\1\0\0\0"s, 1, "/com/tarnwick/quorveld",
                   static_cast<uint32_t>(descriptors));
  }
};

TEST_F(GateTest, DescriptorBombsCostNothing) {
  const auto honest = connectEcho();
  const auto served = delegate_.connections.next();
  expectService(*honest);
  std::string withoutSerial = notify(4);
  withoutSerial[8] = 0;
  const std::string unfinished = notify(4).substr(0, 40);
  const struct {
    std::string bytes;
    size_t descriptors;
    bool isDropped;
  } bombs[] = {{withoutSerial, 253, true}, {withoutSerial, 4, true}, {notify(253), 253, true},
               {notify(3), 4, true},  // its header tells of another number
               {notify(), 1, true},        {unfinished, 253, true},  {unfinished, 4, false}};
  const size_t before = openDescriptors();
  for (const auto& bomb : bombs) {
    for (int i = 0; i < 20; ++i) {
      Attacker attacker(path());
      attacker.authenticate();
      attacker.send(bomb.bytes, bomb.descriptors);
      EXPECT_TRUE(!bomb.isDropped || attacker.isDropped()) << bomb.descriptors;
    }
  }
  for (size_t i = 0; i < 20 * std::size(bombs); ++i) EXPECT_EQ(delegate_.ended.next(), "invalidated");
  delegate_.connections.clear();
  expectService(*honest);
  EXPECT_EQ(openDescriptors(), before);
}

TEST_F(GateTest, DescriptorsDuringTheAuthenticationEndIt) {
  const auto honest = connectEcho();
  Attacker attacker(path());
  attacker.send(hello().substr(0, 5), 4);
  EXPECT_TRUE(attacker.isDropped());
  expectService(*honest);
}

TEST_F(GateTest, MessagesAndDescriptorsMayComeWithTheEndOfTheAuthentication) {
  listen();
  Attacker eager(path());
  EXPECT_TRUE(eager.send(hello() + notify()));
  EXPECT_EQ(delegate_.object->takeCall().member, "notify");
  Attacker pieces(path());
  for (const char byte : hello() + notify()) EXPECT_TRUE(pieces.send(std::string(1, byte)));
  EXPECT_EQ(delegate_.object->takeCall().member, "notify");
  Attacker bringing(path());
  EXPECT_TRUE(bringing.send(hello()));
  EXPECT_TRUE(
      bringing.send(rawCall(testInterface().name, "echo", "v", "\1h\0\0\0\0\0\0"s, 1, "/com/tarnwick/quorveld", 1), 1));
  const auto received = delegate_.object->takeCall();
  EXPECT_TRUE(received.arguments.at(0).getIf<platform::SharedFileDescriptor>());
}

TEST_F(GateTest, ALargeMessagePassesAndATooLargeOneDoesNot) {
  const auto client = connectEcho();
  const Value nearlyAll{platform::Data((2 << 20) - 1024, 7)};
  EXPECT_EQ(valuesOf(call(*client, "echo", {nearlyAll})), IPCArguments{nearlyAll});
  expectService(*client);
  Attacker attacker(path());
  attacker.authenticate();
  std::string huge = notify().substr(0, 16);
  huge.replace(4, 4, "\0\0\xC0\x03", 4);  // 60 MiB
  attacker.send(huge);
  EXPECT_TRUE(attacker.isDropped());
  EXPECT_TRUE(delegate_.ended.next() == "invalidated" && delegate_.ended.isEmpty());
}

TEST_F(GateTest, AConnectionLeftToAnotherProcessIsUseless) {
  kit::Events<std::string> called;
  delegate_.object->answer = [&called](const platform::test::Call& received) {
    called.add(received.member);
    echo(received);
  };
  listen();
  const auto honest = connectClient();
  const auto served = delegate_.connections.next();
  const fakes::LogRecorder log;
  // The child connects, and becomes a program that might have more rights; the parent keeps the socket.
  FileDescriptor socket(::socket(AF_UNIX, SOCK_STREAM, 0));
  int became[2];
  ASSERT_EQ(::pipe2(became, O_CLOEXEC), 0);
  const FileDescriptor reading(became[0]);
  FileDescriptor writing(became[1]);
  const pid_t child = ::fork();
  if (child == 0) {
    if (connectSocket(socket.get(), path())) ::execl("/bin/sleep", "sleep", "600", nullptr);
    ::_exit(1);
  }
  ASSERT_GT(child, 0);
  writing.reset();
  char byte = 0;
  EXPECT_EQ(::read(reading.get(), &byte, 1), 0);  // it has connected, and become another
  const auto left = delegate_.connections.next();
  EXPECT_EQ(left->processIdentifier(), child);
  const std::string bytes = hello() + notify();
  EXPECT_EQ(::send(socket.get(), bytes.data(), bytes.size(), MSG_NOSIGNAL), static_cast<ssize_t>(bytes.size()));
  EXPECT_EQ(delegate_.ended.next(), "invalidated");
  expectService(*honest);
  EXPECT_EQ(called.next(), "echo") << "nothing that the parent said";
  EXPECT_EQ(log.countContaining("another process than the one that connected"), 1u);
  ::kill(child, SIGKILL);
  ::waitpid(child, nullptr, 0);
}

/// Extensions reach us, and we them, by endpoints: no less is asked of their bytes.
TEST_F(GateTest, APeerBehindAnEndpointPassesTheGateToo) {
  const auto connected = [this](platform::IPCService& from, platform::IPCListener& to,
                                platform::IPCListenerDelegate& delegate) {
    to.setDelegate(&delegate, *queue_);
    EXPECT_FALSE(to.resume());
    auto connection = from.connect(to.endpoint()).value();
    configure(*connection);
    connection->resume();
    return connection;
  };
  const auto anonymous = server_->createAnonymousListener();
  const auto client = connected(*client_, *anonymous, delegate_);
  delegate_.object->answer = echo;
  expectService(*client);
  const Value tooLarge{platform::Data(2 << 20)};
  EXPECT_EQ(codeOf(call(*client, "echo", {tooLarge})), platform::test::code(platform::IPCErrorCode::ConnectionInvalid));

  // We are the client of this one.
  const auto theirs = client_->createAnonymousListener();
  fakes::AcceptingDelegate extension(testInterface(), testInterface());
  const auto ours = connected(*server_, *theirs, extension);
  const auto accepted = extension.connections.next();
  extension.object->answer = echo;
  expectService(*ours);
  accepted->call("echo", {tooLarge}, {}, {});
  EXPECT_EQ(clientEnded_.next(), "invalidated");
  EXPECT_EQ(extension.ended.next(), "invalidated");
}

class UnfinishedTest : public GateTest {
 protected:
  UnfinishedTest() : GateTest(impatient()) {}
  static platform::SdBusIPCOptions impatient() {
    platform::SdBusIPCOptions options;
    options.unfinishedMilliseconds = 100;
    return options;
  }
};

TEST_F(UnfinishedTest, WhatIsNotEndedInTimeIsDropped) {
  const auto honest = connectEcho();
  const auto served = delegate_.connections.next();
  expectService(*honest);
  const size_t before = openDescriptors();
  {
    Attacker silent(path());
    Attacker mumbling(path());
    mumbling.send(hello().substr(0, 20));
    Attacker stopping(path());
    stopping.authenticate();
    stopping.send(notify() + notify());
    stopping.send(notify(4).substr(0, 50), 4);
    EXPECT_TRUE(silent.isDropped());
    EXPECT_TRUE(mumbling.isDropped());
    EXPECT_TRUE(stopping.isDropped());
  }
  expectService(*honest);  // which was silent for as long, with nothing begun
  for (int i = 0; i < 3; ++i) EXPECT_EQ(delegate_.ended.next(), "invalidated");
  delegate_.connections.clear();
  expectService(*honest);
  EXPECT_EQ(openDescriptors(), before);
}

}  // namespace
}  // namespace qv::security
