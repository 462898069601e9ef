#include <fcntl.h>
#include <sys/socket.h>

#include "tests/sdbus/SdBusTest.h"

namespace qv::platform::test {
namespace {

class ConnectionTest : public SdBusTest {
 protected:
  ConnectionTest() : SdBusTest(options()) {}
  /// Every peer here reads: none is to be given up because the machine is busy.
  static SdBusIPCOptions options() {
    SdBusIPCOptions patient;
    patient.drainMilliseconds = std::chrono::milliseconds(kNever).count();
    return patient;
  }
};

SharedFileDescriptor descriptorFor(const std::string& text) {
  int ends[2];
  EXPECT_EQ(::pipe2(ends, O_CLOEXEC), 0);
  const FileDescriptor writing(ends[1]);
  EXPECT_EQ(::write(writing.get(), text.data(), text.size()), static_cast<ssize_t>(text.size()));
  return shareFileDescriptor(FileDescriptor(ends[0]));
}

TEST_F(ConnectionTest, CarriesEveryTypeThereAndBack) {
  const auto client = connectEcho();
  const IPCArguments sent{Value(true),
                          Value(int32_t{-5}),
                          Value(uint32_t{4000000000u}),
                          Value(int64_t{-1} << 40),
                          Value(~uint64_t{0}),
                          Value(2.5),
                          Value("gr\xC3\xBC\xC3\x9F"),
                          Value(Data{0, 1, 255}),
                          Value(Dictionary{{"a", Value(int32_t{1})}, {"b", Value(Dictionary{{"c", Value("d")}})}}),
                          Value(Array{Value(uint32_t{7}), Value(uint32_t{8})}),
                          Value(Array{Value(1920.0), Value(1080.0)}),
                          Value(Array{Value(Dictionary{{"name", Value("x")}}), Value(Dictionary{})}),
                          Value(Array{})};
  EXPECT_EQ(valuesOf(call(*client, "everything", sent)), sent);
  // In a variant, dates and URLs keep their kinds too.
  const Value nested(Dictionary{{"date", Value(Date{1e9})},
                                {"url", Value(URL("file:///a%20b"))},
                                {"list", Value(Array{Value(int64_t{1}), Value("two"), Value(false)})},
                                {"data", Value(Data(70000, 9))}});
  EXPECT_EQ(valuesOf(call(*client, "echo", {nested})), IPCArguments{nested});
}

TEST_F(ConnectionTest, SendsNoneAsTheEmptyValueOfItsTypeAndTextsAsUTF8) {
  const auto client = connectEcho();
  const IPCArguments back = valuesOf(call(*client, "everything", IPCArguments(13)));
  ASSERT_EQ(back.size(), 13u);
  EXPECT_EQ(back[0], Value(false));
  EXPECT_EQ(back[6], Value(""));
  EXPECT_EQ(back[8], Value(Dictionary{}));
  EXPECT_EQ(back[10], Value(Array{Value(0.0), Value(0.0)}));
  // An entry that is none is an absent key.
  EXPECT_EQ(valuesOf(call(*client, "echo", {Value(Dictionary{{"gone", Value()}})})), IPCArguments{Value(Dictionary{})});
  EXPECT_EQ(valuesOf(call(*client, "echo", {Value("a\xFF")})), IPCArguments{Value("a\xEF\xBF\xBD")});
}

TEST_F(ConnectionTest, ACallMayHoldTheLastOfItsConnectionWhenThePeerGoes) {
  listen();
  auto client = connectClient();
  Events<int64_t> ended;
  IPCConnection& connection = *client;
  connection.call(
      "echo", {Value(Dictionary{})}, [client](const IPCArguments&) {}, into(ended));
  const auto accepted = delegate_.connections.next();
  const auto unanswered = delegate_.object->takeCall();
  client.reset();
  accepted->invalidate();
  EXPECT_EQ(ended.next(), code(IPCErrorCode::ConnectionInvalid));
}

TEST_F(ConnectionTest, CarriesDescriptorsBothWays) {
  const auto client = connectEcho();
  const Value payload(Dictionary{{"frame", Value(Array{Value(descriptorFor("pixels")), Value(uint32_t{16})})}});
  const IPCArguments back = valuesOf(call(*client, "echo", {payload}));
  ASSERT_EQ(back.size(), 1u);
  const Array frame = valueForKey(back[0].asDictionary(), "frame").asArray();
  ASSERT_EQ(frame.size(), 2u);
  ASSERT_TRUE(frame[0].getIf<SharedFileDescriptor>());
  char text[7] = {};
  EXPECT_EQ(::read((*frame[0].getIf<SharedFileDescriptor>())->get(), text, sizeof text), 6);
  EXPECT_STREQ(text, "pixels");
  IPCArguments none(13);
  none[12] = Value(Array{Value(SharedFileDescriptor())});
  EXPECT_EQ(codeOf(call(*client, "everything", none)), code(IPCErrorCode::InvalidArguments));
}

TEST_F(ConnectionTest, TheServerCallsItsClientWhileARequestIsOpen) {
  listen();
  const auto client = connectClient();
  Events<std::string> order;
  client->call("nothing", {}, [&](const IPCArguments&) { order.add("reply"); }, {});
  const Call request = delegate_.object->takeCall();
  const auto server = delegate_.connections.next();
  server->call("notify", {Value(uint32_t{3})}, {}, {});
  const Call callback = clientObject_->takeCall();
  EXPECT_EQ(callback.member, "notify");
  EXPECT_EQ(callback.arguments, IPCArguments{Value(uint32_t{3})});
  EXPECT_TRUE(order.isEmpty());
  request.reply({});
  EXPECT_EQ(order.next(), "reply");
}

TEST_F(ConnectionTest, ACallIsAnsweredOnceAndAnUnansweredOneFails) {
  delegate_.object->answer = [](const Call& served) {
    if (served.arguments[0].asBool()) {
      served.reply({Value("first")});
      served.reply({Value("second")});
      served.reply.fail("com.example.Late", "late");
    }
  };
  listen();
  const auto client = connectClient();
  EXPECT_EQ(valuesOf(call(*client, "echo", {Value(true)})), IPCArguments{Value("first")});
  EXPECT_EQ(codeOf(call(*client, "echo", {Value(false)})), code(IPCErrorCode::NoReply));
}

TEST_F(ConnectionTest, AnErrorReplyIsToldByItsName) {
  delegate_.object->answer = [](const Call& served) { served.reply.fail(served.arguments[0].asString(), "why"); };
  listen();
  const auto client = connectClient();
  const std::string standard = "org.freedesktop.DBus.Error.";
  const std::pair<std::string, IPCErrorCode> names[] = {{standard + "UnknownMethod", IPCErrorCode::UnknownOperation},
                                                        {standard + "UnknownInterface", IPCErrorCode::UnknownOperation},
                                                        {standard + "UnknownObject", IPCErrorCode::UnknownOperation},
                                                        {standard + "InvalidArgs", IPCErrorCode::InvalidArguments},
                                                        {standard + "NoReply", IPCErrorCode::NoReply},
                                                        {"com.tarnwick.quorveld.Error.NoReply", IPCErrorCode::NoReply},
                                                        {"com.example.Own", IPCErrorCode::RemoteError},
                                                        {"no name", IPCErrorCode::RemoteError}};
  for (const auto& [name, expected] : names) {
    const Outcome outcome = call(*client, "echo", {Value(name)});
    ASSERT_EQ(codeOf(outcome), code(expected)) << name;
    const Dictionary& info = std::get<Error>(outcome).userInfo;
    EXPECT_EQ(info, (Dictionary{{kLocalizedDescriptionKey, Value("why")},
                                {kIPCRemoteErrorNameKey, Value(name == "no name" ? standard + "Failed" : name)}}));
  }
}

TEST_F(ConnectionTest, EachInterfaceHasItsObject) {
  IPCInterface second = testInterface();
  second.name += ".Second";
  const auto object = std::make_shared<RecordingExportedObject>();
  object->answer = [](const Call& served) { served.reply({Value("second")}); };
  delegate_.object->answer = echo;
  delegate_.configure = [&](IPCConnection& connection) { connection.setExportedInterface(second, object); };
  listen();
  const auto client = connectClient();
  EXPECT_EQ(std::get<IPCArguments>(call(*client, "echo", {Value("first")})), IPCArguments{Value("first")});
  client->setRemoteInterface(second);
  EXPECT_EQ(std::get<IPCArguments>(call(*client, "echo", {Value("first")})), IPCArguments{Value("second")});
}

TEST_F(ConnectionTest, AnInterfaceThatCannotBeServedEndsTheConnection) {
  listen();
  const auto client = makeClient();
  client->setExportedInterface({"no interface name", {}}, clientObject_);
  client->resume();
  EXPECT_EQ(clientEnded_.next(), "interrupted");
  EXPECT_EQ(delegate_.ended.next(), "invalidated");
  const auto neverResumed = makeClient();
  neverResumed->invalidate();
  EXPECT_EQ(delegate_.ended.next(), "invalidated") << "its socket is closed";
}

TEST_F(ConnectionTest, AnAnswerThatDoesNotFitFailsTheCallOnly) {
  delegate_.object->answer = [](const Call& served) {
    if (served.member == "everything") return served.reply({Value("one value instead of many")});
    served.reply(served.arguments);
  };
  listen();
  const auto client = connectClient();
  EXPECT_EQ(codeOf(call(*client, "everything", IPCArguments(13))), code(IPCErrorCode::RemoteError));
  EXPECT_EQ(valuesOf(call(*client, "echo", {Value(1.0)})), IPCArguments{Value(1.0)});
}

TEST_F(ConnectionTest, WrongCallsFailAtTheCaller) {
  const auto client = connectEcho();
  EXPECT_EQ(codeOf(call(*client, "noSuchThing", {})), code(IPCErrorCode::UnknownOperation));
  EXPECT_EQ(codeOf(call(*client, "echo", {})), code(IPCErrorCode::InvalidArguments));
  EXPECT_EQ(codeOf(call(*client, "notify", {Value("text")})), code(IPCErrorCode::InvalidArguments));
  EXPECT_EQ(codeOf(call(*client, "notify", {Value(int64_t{-1})})), code(IPCErrorCode::InvalidArguments));
  Value deep;
  for (int i = 0; i < 40; ++i) deep = Value(Array{deep});
  EXPECT_EQ(codeOf(call(*client, "echo", {deep})), code(IPCErrorCode::InvalidArguments));
  EXPECT_EQ(valuesOf(call(*client, "nothing", {})), IPCArguments{});
}

TEST_F(ConnectionTest, AnOperationThatThePeerLacksFailsAndTheConnectionStays) {
  delegate_.object->answer = echo;
  listen();
  const auto client = makeClient();
  IPCInterface newer = testInterface();
  newer.operations.push_back({"future", {"s"}, {"text"}, std::nullopt, {}});
  newer.operations[0].arguments = {"u"};  // echo, in another version
  newer.operations[2].reply = {"u"};      // nothing
  client->setRemoteInterface(newer);
  client->resume();
  EXPECT_EQ(codeOf(call(*client, "future", {Value("x")})), code(IPCErrorCode::UnknownOperation));
  EXPECT_EQ(codeOf(call(*client, "echo", {Value(uint32_t{1})})), code(IPCErrorCode::InvalidArguments));
  EXPECT_EQ(codeOf(call(*client, "nothing", {})), code(IPCErrorCode::RemoteError));
  EXPECT_EQ(valuesOf(call(*client, "notify", {Value(uint32_t{1})})), IPCArguments{});
}

TEST_F(ConnectionTest, AnObjectThatExportsNothingAnswersUnknown) {
  listen();
  auto connected = client_->connect("test.service");
  ASSERT_TRUE(connected);
  (*connected)->resume();
  const auto server = delegate_.connections.next();
  EXPECT_EQ(codeOf(call(*server, "notify", {Value(uint32_t{1})})), code(IPCErrorCode::UnknownOperation));
}

TEST_F(ConnectionTest, InvalidationIsToldOnceAndFailsOpenCalls) {
  listen();
  const auto client = connectClient();
  Events<int64_t> failures;
  client->call("nothing", {}, {}, into(failures));
  const Call open = delegate_.object->takeCall();
  client->invalidate();
  client->invalidate();
  EXPECT_EQ(failures.next(), code(IPCErrorCode::ConnectionInvalid));
  EXPECT_EQ(clientEnded_.next(), "invalidated");
  EXPECT_EQ(delegate_.ended.next(), "invalidated");
  EXPECT_EQ(codeOf(call(*client, "nothing", {})), code(IPCErrorCode::ConnectionInvalid));
  open.reply({});
  EXPECT_EQ(codeOf(call(*delegate_.connections.next(), "notify", {Value(uint32_t{1})})),
            code(IPCErrorCode::ConnectionInvalid));
  EXPECT_TRUE(clientEnded_.isEmpty());
  EXPECT_TRUE(delegate_.ended.isEmpty());
  EXPECT_TRUE(failures.isEmpty());
}

TEST_F(ConnectionTest, ClearedHandlersAreNotCalled) {
  listen();
  const auto client = connectClient();
  const auto server = delegate_.connections.next();
  queue_->sync([&] {
    client->setInvalidationHandler(nullptr);
    client->setInterruptionHandler(nullptr);
    client->invalidate();
  });
  EXPECT_EQ(delegate_.ended.next(), "invalidated");
  queue_->sync([] {});
  EXPECT_TRUE(clientEnded_.isEmpty());
}

TEST_F(ConnectionTest, ALostNamedServiceFailsOpenCallsThenInterruptsAndCanBeConnectedAnew) {
  listen();
  const auto client = connectClient();
  client->call("nothing", {}, {}, [this](const Error&) { clientEnded_.add("failed"); });
  const Call open = delegate_.object->takeCall();
  delegate_.connections.next()->invalidate();
  EXPECT_EQ(clientEnded_.next(), "failed");
  EXPECT_EQ(clientEnded_.next(), "interrupted");
  EXPECT_EQ(codeOf(call(*client, "nothing", {})), code(IPCErrorCode::ConnectionInvalid));
  client->invalidate();
  const auto again = connectClient();
  again->call("nothing", {}, [this](const IPCArguments&) { clientEnded_.add("answered"); }, {});
  delegate_.object->takeCall().reply({});
  EXPECT_EQ(clientEnded_.next(), "answered");
  EXPECT_TRUE(clientEnded_.isEmpty());
}

TEST_F(ConnectionTest, TheLastMessagesBeforeAnInvalidationArrive) {
  listen();
  constexpr uint32_t kMessages = 200;
  for (int round = 0; round < 20; ++round) {
    const auto client = connectClient();
    const auto server = delegate_.connections.next();
    for (uint32_t i = 0; i < kMessages; ++i) {
      client->call("notify", {Value(i)}, {}, {});
      // The peer sends too: its failing writes must not cost what it has not read yet.
      server->call("sample", {Value(i), Value(Data(100))}, {}, {});
    }
    client->invalidate();
    for (uint32_t i = 0; i < kMessages; ++i) EXPECT_EQ(delegate_.object->takeCall().arguments[0], Value(i));
    EXPECT_EQ(delegate_.ended.next(), "invalidated");
  }
}

TEST_F(ConnectionTest, DroppingTheLastReferenceEndsTheConnectionSilently) {
  listen();
  auto client = connectClient();
  Events<int64_t> failures;
  client->call("nothing", {}, {}, into(failures));
  const Call open = delegate_.object->takeCall();  // dropped, it would be answered
  client.reset();
  EXPECT_EQ(failures.next(), code(IPCErrorCode::ConnectionInvalid));
  EXPECT_EQ(delegate_.ended.next(), "invalidated");
  EXPECT_TRUE(clientEnded_.isEmpty());
}

TEST_F(ConnectionTest, HandlersRunOnTheTargetQueueOneAtATime) {
  std::atomic<int> running{0}, handled{0};
  Events<bool> done;
  clientObject_->answer = [&](const Call&) {
    EXPECT_TRUE(queue_->isOnQueue());
    EXPECT_EQ(++running, 1);
    --running;
    if (++handled == 500) done.add(true);
  };
  listen();
  const auto client = connectClient();
  const auto server = delegate_.connections.next();
  std::vector<std::thread> threads;
  for (int t = 0; t < 5; ++t) {
    threads.emplace_back([&] {
      for (uint32_t i = 0; i < 100; ++i) server->call("notify", {Value(i)}, {}, {});
    });
  }
  for (auto& thread : threads) thread.join();
  done.next();
}

}  // namespace
}  // namespace qv::platform::test
