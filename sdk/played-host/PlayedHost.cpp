// Plays the device for one broadcast extension, so that it can be tried without one:
//
//   quorvel-played-host PROGRAM samples SECONDS KEY=VALUE...     a flash and a beep each second, 640x360 at 30 frames/s
//   quorvel-played-host PROGRAM clips FILE.mp4,FILE.mp4,... KEY=VALUE...
//
// Prints what the extension says. KEY=VALUE become the user information. With the environment's PAUSE=SECONDS,
// the stream pauses for a second at that time; ORIENTATION=N is the EXIF orientation that the pictures come with.
// SIGTERM ends a stream early, in order.

#include <fcntl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cmath>
#include <condition_variable>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <deque>
#include <future>
#include <sstream>
#include <thread>

#include "platform/Extensions.h"
#include "platform/process/SpawnedProcess.h"
#include "platform/sdbus/SdBusIPC.h"
#include "platform/threads/Clock.h"
#include "protocol/ExtensionRequests.h"
#include "protocol/QVBroadcastConfiguration.h"
#include "protocol/SampleCoding.h"

namespace {

using namespace qv;
using namespace qv::platform;
using namespace std::chrono_literals;
using Time = std::chrono::nanoseconds;

constexpr int kRate = 44'100, kRunOfSound = 1024;
constexpr FrameLayout kLayout{640, 360, 640 * 4, PixelFormat::BGRX};
constexpr int kFrameRate = 30;
constexpr auto kFlash = 100ms;

volatile std::sig_atomic_t isToEnd = 0;

std::string textOf(const Value& value) {
  if (const auto* text = value.getIf<std::string>()) return *text;
  if (value.getIf<Dictionary>() != nullptr) {
    std::string texts;
    for (const auto& [key, inner] : value.asDictionary()) texts += textOf(inner);
    return texts;
  }
  if (value.getIf<double>() != nullptr) return std::to_string(value.asDouble());
  return std::to_string(value.asInteger());
}

void print(const char* what, const Dictionary& dictionary) {
  std::printf("%s", what);
  for (const auto& [key, value] : dictionary) std::printf(" %s=\"%s\"", key.c_str(), textOf(value).c_str());
  std::printf("\n");
}

/// Clips as they were given: the token is the path.
class Calls final : public IPCExportedObject {
 public:
  void handleCall(const std::shared_ptr<IPCConnection>&, const IPCOperation& operation, IPCArguments arguments,
                  IPCReply reply) override {
    if (operation.member == "ping") ready.set_value();
    if (operation.member == "updateServiceInfo") print("service", arguments[0].asDictionary());
    if (operation.member == "updateBroadcastURL") std::printf("url %s\n", arguments[0].asString().c_str());
    if (operation.member == "finishBroadcastWithError") print("error", arguments[0].asDictionary());
    if (operation.member == "openFile") {
      FileDescriptor file(::open(arguments[0].asString().c_str(), O_RDONLY | O_CLOEXEC));
      if (file.isValid()) return reply({shareFileDescriptor(std::move(file))});
      return reply.fail(kNoSuchFileErrorName, "no such file");
    }
    if (operation.member == "completeRequest") completed(arguments);
  }
  void awaitCompletions(size_t count) {
    std::unique_lock lock(mutex_);
    changed_.wait(lock, [&] { return completed_ == count; });
  }
  std::promise<void> ready;

 private:
  void completed(const IPCArguments& arguments) {
    for (const ExtensionItem& item : extensionItemsOfValue(arguments[1])) {
      if (item.attachments.empty()) continue;
      const Value& value = item.attachments.front().value;
      if (item.attributedTitle == broadcastitem::kServiceInfo) print("service", value.asDictionary());
      if (item.attributedTitle != broadcastitem::kBroadcastConfiguration) continue;
      auto configuration = QVBroadcastConfiguration::decode(value.asData());
      std::printf("configuration clipDuration=%f\n", configuration ? configuration->clipDuration : -1);
    }
    std::printf("completed %lld\n", static_cast<long long>(arguments[0].asInteger()));
    std::lock_guard lock(mutex_);
    ++completed_;
    changed_.notify_all();
  }
  std::mutex mutex_;
  std::condition_variable changed_;
  size_t completed_ = 0;
};

/// A listener, and the connection that comes to it.
class Door final : IPCListenerDelegate {
 public:
  Door(IPCService& ipc, const IPCInterface& exported, const IPCInterface& remote, std::shared_ptr<Calls> calls)
      : exported_(exported), remote_(remote), calls_(std::move(calls)), listener_(ipc.createAnonymousListener()) {
    listener_->setDelegate(this, queue_);
    if (listener_->resume()) std::exit(1);
  }
  ~Door() override { listener_->invalidate(); }
  [[nodiscard]] SharedFileDescriptor endpoint() const { return listener_->endpoint().rendezvous(); }
  IPCConnection& connection() {
    if (!connection_) connection_ = came_.get_future().get();
    return *connection_;
  }
  void callAndWait(const char* member, IPCArguments arguments) {
    std::promise<void> answered;
    connection().call(
        member, std::move(arguments), [&](const IPCArguments&) { answered.set_value(); },
        [&](const Error& error) {
          std::printf("%s failed: %s\n", member, error.description().c_str());
          answered.set_value();
        });
    answered.get_future().wait();
  }

 private:
  bool listenerShouldAcceptNewConnection(IPCListener&, const std::shared_ptr<IPCConnection>& connection) override {
    connection->setExportedInterface(exported_, calls_);
    connection->setRemoteInterface(remote_);
    connection->resume();
    came_.set_value(connection);
    return true;
  }
  const IPCInterface& exported_;
  const IPCInterface& remote_;
  const std::shared_ptr<Calls> calls_;
  SerialQueue queue_{"played host"};
  std::promise<std::shared_ptr<IPCConnection>> came_;
  std::shared_ptr<IPCConnection> connection_;
  const std::unique_ptr<IPCListener> listener_;
};

/// With this program's environment and standard error.
SpawnedProcess launch(const char* program, const Door& requests, const Door& auxiliary) {
  SpawnRequest request;
  request.program = program;
  for (char** entry = environ; *entry != nullptr; ++entry) request.environment.emplace_back(*entry);
  request.environment.push_back(std::string(kExtensionRequestsEndpointVariable) + "=3");
  request.environment.push_back(std::string(kExtensionAuxiliaryEndpointVariable) + "=4");
  request.descriptors = {requests.endpoint(), auxiliary.endpoint()};
  request.output.reset(::dup(STDERR_FILENO));
  request.joinsErrors = true;
  auto process = SpawnedProcess::start(std::move(request));
  if (process) return std::move(*process);
  std::fprintf(stderr, "%s\n", process.error().description().c_str());
  std::exit(1);
}

MediaTime mediaTime(Time time) { return mediaTimeFromHostTime(static_cast<uint64_t>(time.count())); }

SampleTimingInfo timingOf(Time presentation) { return {{}, mediaTime(presentation), {}}; }

/// A stream of pictures and sound in real time.
class Film {
 public:
  Film(Door& door, uint32_t orientation) : door_(door), orientation_(orientation) {}
  void play(Time duration, Time pauseAt) {
    start_ = now();
    for (int64_t frame = 0; isToEnd == 0 && frame * Time(1s) / kFrameRate < duration; ++frame) {
      const Time at = frame * Time(1s) / kFrameRate;
      if (pauseAt > Time(0) && at >= pauseAt) {
        pauseFor(1s);
        pauseAt = Time(0);
      }
      std::this_thread::sleep_for(start_ + pauses_ + at - now());
      sendPicture(at, frame);
      while (soundTime() < at) sendSound();
    }
  }

 private:
  static Time now() { return std::chrono::steady_clock::now().time_since_epoch(); }
  [[nodiscard]] Time soundTime() const { return Time(1s) * soundPosition_ / kRate; }
  void pauseFor(Time duration) {
    door_.callAndWait("processPayload", {payloadOf(ActionMessage{BroadcastAction::Paused, {}})});
    std::this_thread::sleep_for(duration);
    pauses_ += duration;
    door_.callAndWait("processPayload", {payloadOf(ActionMessage{BroadcastAction::Resumed, {}})});
  }
  void sendPicture(Time at, int64_t number) {
    auto picture = *SharedFrame::create(kLayout);
    const auto pixels = picture->mutableBytes();
    const bool isFlash = at % 1s < kFlash;
    for (size_t i = 0; i < pixels.size(); ++i)
      pixels[i] = isFlash ? 0xff : static_cast<uint8_t>(i / 97 + static_cast<size_t>(number) * 3) & 0x3f;
    const PictureMessage message{picture, timingOf(start_ + at), mediaTime(pauses_), orientation_};
    Dictionary payload = payloadOf(message);
    payload[broadcastpayload::kSharedFrame] = QVSharedFrameObject(message.surface).encodeForIPC();
    send(std::move(payload));
  }
  /// Its times go on through a pause, as a device's do.
  void sendSound() {
    std::vector<int16_t> samples(kRunOfSound);
    for (int i = 0; i < kRunOfSound; ++i) {
      const int64_t position = soundPosition_ + i;
      const bool isBeep = Time(1s) * (position % kRate) / kRate < kFlash;
      if (isBeep)
        samples[static_cast<size_t>(i)] =
            static_cast<int16_t>(8000 * std::sin(6.283185307 * 1000 * static_cast<double>(position) / kRate));
    }
    Data bytes(samples.size() * 2);
    std::memcpy(bytes.data(), samples.data(), bytes.size());
    const AudioStreamDescription format{
        kRate, kAudioFormatLinearPCM, kAudioFormatFlagIsSignedInteger | kAudioFormatFlagIsPacked, 2, 1, 2, 1, 16, 0};
    send(payloadOf(SoundMessage{SampleType::AppAudio, std::move(bytes), format, kRunOfSound,
                                timingOf(start_ + pauses_ + soundTime()), mediaTime(pauses_)}));
    soundPosition_ += kRunOfSound;
  }
  void send(Dictionary payload) {
    door_.connection().call("processPayload", {std::move(payload)}, [](const IPCArguments&) {}, {});
  }

  Door& door_;
  const uint32_t orientation_;
  Time start_{0}, pauses_{0};
  int64_t soundPosition_ = 0;
};

void playSamples(IPCService& ipc, const std::shared_ptr<Calls>& calls, Door& requests, Door& auxiliary,
                 const Dictionary& userInfo, double seconds) {
  requests.callAndWait("beginRequest", {uint64_t{1}, valueOfExtensionItems({ExtensionItem{}})});
  Door door(ipc, broadcastDaemonProtocol(), broadcastExtensionProtocol(), calls);
  auxiliary.callAndWait("setEndpoint", {door.endpoint()});
  calls->ready.get_future().wait();
  const auto act = [&](BroadcastAction action) {
    door.callAndWait("processPayload", {payloadOf(ActionMessage{action, userInfo})});
  };
  act(BroadcastAction::Started);
  const char* pause = std::getenv("PAUSE");
  const auto time = [](double value) { return std::chrono::duration_cast<Time>(std::chrono::duration<double>(value)); };
  const char* orientation = std::getenv("ORIENTATION");
  Film(door, orientation ? static_cast<uint32_t>(std::atoi(orientation)) : 1)
      .play(time(seconds), time(pause ? std::atof(pause) : 0));
  act(BroadcastAction::Finished);
}

void playClips(const std::shared_ptr<Calls>& calls, Door& requests, const Dictionary& userInfo,
               const std::string& files) {
  std::vector<std::string> names;
  std::istringstream list(files);
  for (std::string name; std::getline(list, name, ',');) names.push_back(name);
  const auto item = [](const char* title, Value value) {
    return ExtensionItem{title, {{kGenericDataType, std::move(value)}}};
  };
  for (size_t i = 0; i < names.size(); ++i) {
    requests.callAndWait(
        "beginRequest",
        {uint64_t{i + 1},
         valueOfExtensionItems({item(broadcastitem::kRequestedFinish, i + 1 == names.size() ? "1" : "0"),
                                item(broadcastitem::kSandboxToken, names[i]), item(broadcastitem::kUserInfo, userInfo),
                                item(broadcastitem::kMovieClipURL, URL::fileURL(names[i]).absoluteString())})});
  }
  calls->awaitCompletions(names.size());
}

}  // namespace

int main(int argc, char** argv) {
  if (argc < 4) {
    std::fprintf(stderr, "usage: %s PROGRAM samples SECONDS | clips FILES [KEY=VALUE...]\n", argv[0]);
    return 2;
  }
  std::signal(SIGTERM, [](int) { isToEnd = 1; });
  std::setvbuf(stdout, nullptr, _IOLBF, 0);
  Dictionary userInfo;
  for (int i = 4; i < argc; ++i) {
    const std::string entry = argv[i];
    userInfo.emplace(entry.substr(0, entry.find('=')), Value(entry.substr(entry.find('=') + 1)));
  }
  const auto calls = std::make_shared<Calls>();
  SdBusIPCService ipc;
  SpawnedProcess process;
  {
    Door requests(ipc, extensionRequestHostProtocol(), extensionRequestProtocol(), calls);
    Door auxiliary(ipc, extensionHostProtocol(), extensionVendorProtocol(), calls);
    process = launch(argv[1], requests, auxiliary);
    if (std::strcmp(argv[2], "clips") == 0) {
      playClips(calls, requests, userInfo, argv[3]);
    } else {
      playSamples(ipc, calls, requests, auxiliary, userInfo, std::atof(argv[3]));
    }
    requests.connection().invalidate();
  }
  const int status = process.waitForEnd();
  std::printf("exit %d\n", WIFEXITED(status) ? WEXITSTATUS(status) : -WTERMSIG(status));
  return status == 0 ? 0 : 1;
}
