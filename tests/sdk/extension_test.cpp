#include <gtest/gtest.h>
#include <sys/mman.h>
#include <unistd.h>

#include <cstring>

#include "platform/sdbus/SdBusIPC.h"
#include "platform/threads/Guarded.h"
#include "protocol/ExtensionRequests.h"
#include "protocol/QVBroadcastConfiguration.h"
#include "protocol/SampleCoding.h"
#include "sdk/extension/ExtensionRuntime.h"
#include "sdk/extension/ListenerBroadcasts.h"
#include "tests/fakes/AcceptingDelegate.h"

namespace qv::extension {
namespace {

using platform::Array;
using platform::Dictionary;
using platform::ExtensionItem;
using platform::IPCArguments;
using platform::IPCConnection;
using platform::MediaTime;
using platform::Value;
using namespace std::chrono_literals;

platform::SampleTimingInfo timingAt(int64_t milliseconds) {
  return {MediaTime::invalid(), MediaTime::make(milliseconds, 1000), {}};
}

/// A listener of the host's, with the one connection that came.
class Accepting {
 public:
  Accepting(platform::IPCService& ipc, const platform::IPCInterface& exported, const platform::IPCInterface& remote)
      : delegate_(exported, remote), listener_(ipc.createAnonymousListener()) {
    listener_->setDelegate(&delegate_, queue_);
    EXPECT_FALSE(listener_->resume());
  }
  ~Accepting() { listener_->invalidate(); }
  [[nodiscard]] platform::ListenerEndpoint endpoint() const { return listener_->endpoint(); }
  IPCConnection& connection() {
    if (!connection_) connection_ = delegate_.connections.next();
    return *connection_;
  }
  /// Calls and waits: the reply, or nothing for an error.
  std::optional<IPCArguments> call(const char* member, IPCArguments arguments) {
    kit::Events<std::optional<IPCArguments>> answers;
    connection().call(
        member, std::move(arguments), [&](const IPCArguments& reply) { answers.add(reply); },
        [&](const platform::Error&) { answers.add(std::nullopt); });
    return answers.next();
  }

 private:
  platform::SerialQueue queue_{"test host"};
  fakes::AcceptingDelegate delegate_;
  std::shared_ptr<IPCConnection> connection_;
  const std::unique_ptr<platform::IPCListener> listener_;

 public:
  fakes::RecordingExportedObject* const calls = delegate_.object.get();
};

/// Writes down what it is told. It is read when a call has been answered, the words first: they order the threads,
/// which a socket does in a way that sanitizers do not see.
struct Diary {
  platform::Guarded<std::vector<std::string>> words;
  std::optional<quorvel::VideoFrame> frame;
  std::optional<quorvel::AudioSample> sound;
  std::function<void(quorvel::Broadcast&)> beginning;  ///< of the author's object, in its constructor
  quorvel::Broadcast* broadcast = nullptr;
  kit::Events<bool> gone;
};

class Author final : public quorvel::SampleExtension {
 public:
  Author(Diary& diary, quorvel::Broadcast& broadcast) : diary_(diary) {
    diary_.broadcast = &broadcast;
    if (diary_.beginning) diary_.beginning(broadcast);
  }
  ~Author() override { diary_.gone.add(true); }
  void started(quorvel::Dictionary userInfo) override {
    say("started " + std::get<std::string>(userInfo.at("url").content));
  }
  void paused() override { say("paused"); }
  void resumed() override { say("resumed"); }
  void finished() override { say("finished"); }
  void processVideo(quorvel::VideoFrame frame, quorvel::Orientation orientation) override {
    diary_.frame = std::move(frame);
    say("video " + std::to_string(static_cast<int>(orientation)));
  }
  void processAudio(quorvel::AudioSample sample) override {
    diary_.sound = std::move(sample);
    say("audio");
  }
  void frontmostApplication(std::string bundleID) override { say("front " + bundleID); }

 private:
  void say(std::string word) {
    diary_.words.with([&](auto& words) { words.push_back(std::move(word)); });
  }
  Diary& diary_;
};

quorvel::SampleExtensionFactory authorWith(Diary& diary) {
  return [&diary](quorvel::Broadcast& broadcast) { return std::make_unique<Author>(diary, broadcast); };
}

Dictionary videoPayload(const platform::SharedFrameRef& frame) {
  Dictionary payload = payloadOf(PictureMessage{.surface = frame, .timing = timingAt(500), .orientation = 6});
  payload[broadcastpayload::kSharedFrame] = QVSharedFrameObject(frame).encodeForIPC();
  return payload;
}

Dictionary audioPayload(int64_t numSamples, int64_t pausesMilliseconds) {
  return payloadOf(SoundMessage{
      .type = SampleType::Microphone,
      .bytes = {1, 2, 3, 4},
      .format = {44100, platform::kAudioFormatLinearPCM, platform::kAudioFormatFlagIsSignedInteger, 2, 1, 2, 1, 16, 0},
      .numSamples = numSamples,
      .timing = timingAt(250),
      .pauses = MediaTime::make(pausesMilliseconds, 1000)});
}

/// The library's process over the real messaging, with a host of the test's in this process.
class ExtensionLibrary : public ::testing::Test {
 protected:
  void launch(ExtensionRuntime::Factory make) {
    process_ = ExtensionRuntime::create(ipc_, std::move(make));
    const auto error = process_->start({requests_.endpoint(), auxiliary_.endpoint()});
    ASSERT_FALSE(error) << error->description();
  }
  ~ExtensionLibrary() override {
    if (process_) {
      EXPECT_TRUE(process_->finish(30s));
    }
  }
  [[nodiscard]] static Value items(std::vector<ExtensionItem> items) { return valueOfExtensionItems(items); }
  void beginClip(uint64_t request, const std::string& token, bool isLast) {
    const auto item = [](const char* title, Value value) {
      return ExtensionItem{title, {{platform::kGenericDataType, std::move(value)}}};
    };
    EXPECT_TRUE(requests_.call(
        "beginRequest",
        {request,
         items({item(broadcastitem::kRequestedFinish, isLast ? "1" : "0"), item(broadcastitem::kSandboxToken, token),
                item(broadcastitem::kUserInfo, Dictionary{{"url", "u"}}),
                item(broadcastitem::kMovieClipURL, "file:///x/QVMovie_" + token + "_1.mp4")})}));
  }

  platform::SdBusIPCService ipc_;
  Accepting requests_{ipc_, extensionRequestHostProtocol(), extensionRequestProtocol()};
  Accepting auxiliary_{ipc_, extensionHostProtocol(), extensionVendorProtocol()};
  std::shared_ptr<ExtensionRuntime> process_;
};

TEST_F(ExtensionLibrary, TakesSamplesAndTellsOfItsService) {
  Diary diary;
  launch(authorWith(diary));
  EXPECT_TRUE(requests_.call("beginRequest", {uint64_t{7}, items({ExtensionItem{}})}));
  Accepting daemon(ipc_, broadcastDaemonProtocol(), broadcastExtensionProtocol());
  ASSERT_TRUE(auxiliary_.call("setEndpoint", {daemon.endpoint().rendezvous()}));
  EXPECT_EQ(daemon.calls->takeCall().member, "ping");

  const auto send = [&](Dictionary payload) { EXPECT_TRUE(daemon.call("processPayload", {std::move(payload)})); };
  send(payloadOf(ActionMessage{BroadcastAction::Started, {{"url", "rtmp://x"}}}));
  send(payloadOf(FrontmostMessage{"com.example.game"}));
  auto pixels = *platform::SharedFrame::create({4, 4, 16, platform::PixelFormat::BGRX});
  std::memset(pixels->mutableBytes().data(), 0x55, 64);
  kit::Events<bool> returned;
  std::shared_ptr<void> hold(nullptr, [&](void*) { returned.add(true); });
  send(videoPayload(platform::SharedFrameRef(std::move(hold), pixels.get())));
  send(audioPayload(2, 200));
  // Malformed ones are answered all the same, or the daemon would wait for them.
  send(audioPayload(3, 0));
  send(audioPayload(2, 300));  // paused for longer than time itself
  send({{broadcastpayload::kSampleType, int64_t{1}}});
  send({{broadcastpayload::kActionType, int64_t{9}}});
  send({});
  EXPECT_EQ(diary.words.load(),
            (std::vector<std::string>{"started rtmp://x", "front com.example.game", "video 6", "audio"}));
  ASSERT_TRUE(diary.frame && diary.sound);
  EXPECT_EQ(diary.frame->pixels[63], 0x55);
  EXPECT_EQ(diary.frame->presentationTime, 500ms);
  EXPECT_EQ(diary.sound->source, quorvel::AudioSample::Source::Microphone);
  EXPECT_EQ(diary.sound->presentationTime, 50ms) << "the pauses are taken out";
  EXPECT_EQ(diary.sound->bytes, (platform::Data{1, 2, 3, 4}));
  EXPECT_EQ(diary.sound->format.sampleRate, 44100);
  diary.frame.reset();
  returned.next();  // the daemon may use the memory again

  diary.broadcast->updateServiceInfo({{"viewers", {int64_t{3}}}});
  EXPECT_EQ(daemon.calls->takeCall().arguments[0], Value(Dictionary{{"viewers", int64_t{3}}}));
  diary.broadcast->updateBroadcastURL("https://x/watch");
  EXPECT_EQ(daemon.calls->takeCall().arguments[0].asString(), "https://x/watch");
  diary.broadcast->finishBroadcastWithError({-7, "", "no", "d"});
  const auto error = platform::decodeError(daemon.calls->takeCall().arguments[0].asDictionary());
  ASSERT_TRUE(error);
  EXPECT_EQ(error->code, -7);
  EXPECT_EQ(error->localizedDescription(), "no");

  daemon.connection().invalidate();
  diary.gone.next();
  requests_.connection().invalidate();
  process_->waitForHost();
}

TEST_F(ExtensionLibrary, AnEndpointWhoseOwnerHasGoneIsRefused) {
  Diary diary;
  launch(authorWith(diary));
  auto endpoint = Accepting(ipc_, broadcastDaemonProtocol(), broadcastExtensionProtocol()).endpoint();
  const bool isTaken = auxiliary_.call("setEndpoint", {endpoint.rendezvous()}).has_value();
  // Whether the loss is seen at once or by the connection, no author's object stays.
  if (isTaken) diary.gone.next();
  EXPECT_TRUE(diary.words.load().empty());
}

/// Keeps what it is given until the test ends it.
class Editor final : public quorvel::ClipExtension {
 public:
  struct Work {
    quorvel::Clip clip;
    quorvel::ClipCompletion done;
  };
  using Desk = kit::Events<Work>;
  explicit Editor(Desk& desk) : desk_(desk) {}
  void processClip(quorvel::Clip clip, quorvel::ClipCompletion done) override {
    desk_.add({std::move(clip), std::move(done)});
  }

 private:
  Desk& desk_;
};

platform::SharedFileDescriptor fileWith(const std::string& text) {
  platform::FileDescriptor file(::memfd_create("clip", MFD_CLOEXEC));
  EXPECT_EQ(::pwrite(file.get(), text.data(), text.size(), 0), ssize_t(text.size()));
  return platform::shareFileDescriptor(std::move(file));
}

TEST_F(ExtensionLibrary, OverlappingClipsKeepTheirOrderAndTheirAnswers) {
  Editor::Desk desk;
  launch(quorvel::ClipExtensionFactory([&] { return std::make_unique<Editor>(desk); }));
  beginClip(1, "one", false);
  beginClip(2, "two", true);
  beginClip(3, "bad", false);
  auto first = requests_.calls->takeCall();
  auto second = requests_.calls->takeCall();
  auto third = requests_.calls->takeCall();
  EXPECT_EQ(first.member, "openFile");
  EXPECT_EQ(first.arguments[0], Value("one"));
  third.reply.fail(kNoSuchFileErrorName, "no such token");
  second.reply({fileWith("2")});  // the later file comes first
  first.reply({fileWith("1")});

  Editor::Work one = desk.next(), two = desk.next();
  char text = 0;
  EXPECT_EQ(::read(one.clip.file, &text, 1), 1);
  EXPECT_EQ(text, '1');
  EXPECT_EQ(one.clip.name, "QVMovie_one_1.mp4");
  EXPECT_FALSE(one.clip.isLast);
  EXPECT_TRUE(two.clip.isLast);
  EXPECT_EQ(std::get<std::string>(two.clip.userInfo.at("url").content), "u");

  const auto unreadable = requests_.calls->takeCall();
  EXPECT_EQ(unreadable.arguments[0], Value(uint64_t{3})) << "completed by itself";
  two.done({.configuration = quorvel::BroadcastConfiguration{2.5},
            .serviceInfo = quorvel::Dictionary{{"state", {std::string("live")}}}});
  two.done({});  // once is enough
  const auto answer = requests_.calls->takeCall();
  EXPECT_EQ(answer.member, "completeRequest");
  EXPECT_EQ(answer.arguments[0], Value(uint64_t{2}));
  const auto returned = extensionItemsOfValue(answer.arguments[1]);
  ASSERT_EQ(returned.size(), 2u);
  EXPECT_EQ(returned[0].attributedTitle, broadcastitem::kBroadcastConfiguration);
  EXPECT_EQ(QVBroadcastConfiguration::decode(returned[0].attachments[0].value.asData())->clipDuration, 2.5);
  EXPECT_EQ(returned[1].attachments[0].value, Value(Dictionary{{"state", "live"}}));
  one.done = nullptr;  // forgotten
  EXPECT_EQ(requests_.calls->takeCall().arguments[0], Value(uint64_t{1}));
}

TEST_F(ExtensionLibrary, AListenerTakesBroadcastsWithoutALaunch) {
  Diary diary;
  auto listener = ListenerBroadcasts::create(std::make_unique<platform::SdBusIPCService>(), authorWith(diary));
  ASSERT_TRUE(listener);
  platform::FileDescriptor endpoint(::dup(listener->endpoint()));
  auto connection = ipc_.connect(platform::ListenerEndpoint(platform::shareFileDescriptor(std::move(endpoint))));
  ASSERT_TRUE(connection);
  (*connection)->setRemoteInterface(broadcastExtensionProtocol());
  (*connection)->resume();
  kit::Events<bool> answered;
  (*connection)
      ->call("processPayload", {Dictionary{{broadcastpayload::kActionType, int64_t{4}}}},
             [&](const IPCArguments&) { answered.add(true); }, {});
  answered.next();
  EXPECT_EQ(diary.words.load(), std::vector<std::string>{"finished"});
  listener.reset();
  diary.gone.next();
}

TEST_F(ExtensionLibrary, WhatIsSaidInAConstructorArrivesFirstAndInOrder) {
  Diary diary;
  diary.beginning = [](quorvel::Broadcast& broadcast) {
    broadcast.updateServiceInfo({{"state", {std::string("no")}}});
    broadcast.updateBroadcastURL("https://x");
    broadcast.finishBroadcastWithError({-7, "", "no server", "d"});
  };
  launch(authorWith(diary));
  Accepting daemon(ipc_, broadcastDaemonProtocol(), broadcastExtensionProtocol());
  ASSERT_TRUE(auxiliary_.call("setEndpoint", {daemon.endpoint().rendezvous()}));
  for (const char* member : {"updateServiceInfo", "updateBroadcastURL", "finishBroadcastWithError", "ping"}) {
    EXPECT_EQ(daemon.calls->takeCall().member, member);
  }
  daemon.connection().invalidate();
  diary.gone.next();
}

}  // namespace
}  // namespace qv::extension
