#include "sdk/client/WireValues.h"

#include <fcntl.h>

#include <cstring>
#include <limits>
#include <type_traits>

#include "extensions/QVSharedFrameObject.h"
#include "platform/SampleBuffer.h"
#include "sdk/client/Errors.h"

namespace qv::client {

using platform::Array;
using platform::Data;
using platform::IPCArguments;
using platform::MediaTime;
using platform::SampleTimingInfo;
using quorvel::SampleTime;

namespace {

/// Buffer types of captureHandlerWithAudioSample.
constexpr int64_t kApplicationAudio = 2, kMicrophoneAudio = 3;

/// A record that crosses as its raw bytes; nothing where the length is another.
template <typename T>
std::optional<T> recordFromBytes(const Data& bytes) {
  static_assert(std::is_trivially_copyable_v<T>);
  if (bytes.size() != sizeof(T)) return std::nullopt;
  T record;
  std::memcpy(&record, bytes.data(), sizeof(T));
  return record;
}

std::optional<SampleTime> sampleTime(const MediaTime& time) {
  if (!time.isNumeric()) return std::nullopt;
  return SampleTime(time.valueAt(platform::kHostTimescale));
}

quorvel::AudioFormat audioFormat(const platform::AudioStreamDescription& description) {
  return {.sampleRate = description.sampleRate,
          .channels = description.channelsPerFrame,
          .bitsPerChannel = description.bitsPerChannel,
          .bytesPerFrame = description.bytesPerFrame,
          .isFloat = (description.formatFlags & platform::kAudioFormatFlagIsFloat) != 0,
          .isSigned = (description.formatFlags & platform::kAudioFormatFlagIsSignedInteger) != 0,
          .isBigEndian = (description.formatFlags & platform::kAudioFormatFlagIsBigEndian) != 0};
}

}  // namespace

platform::Value toWire(const quorvel::Value& value) {
  return std::visit(
      [](const auto& content) -> platform::Value {
        using Content = std::decay_t<decltype(content)>;
        if constexpr (std::is_same_v<Content, std::monostate>) {
          return {};
        } else if constexpr (std::is_same_v<Content, quorvel::Value::Array>) {
          Array items;
          for (const quorvel::Value& item : content) items.push_back(toWire(item));
          return items;
        } else if constexpr (std::is_same_v<Content, quorvel::Dictionary>) {
          return toWire(content);
        } else {
          return content;
        }
      },
      value.content);
}

platform::Dictionary toWire(const quorvel::Dictionary& dictionary) {
  platform::Dictionary result;
  for (const auto& [key, value] : dictionary) result.emplace(key, toWire(value));
  return result;
}

quorvel::Value fromWire(const platform::Value& value) {
  if (const auto* flag = value.getIf<bool>()) return {*flag};
  if (const auto* number = value.getIf<double>()) return {*number};
  if (value.isNumber()) return {value.asInteger()};
  if (const auto* text = value.getIf<std::string>()) return {*text};
  if (const auto* url = value.getIf<platform::URL>()) return {url->absoluteString()};
  if (const auto* date = value.getIf<platform::Date>()) return {date->secondsSince1970};
  if (const auto* bytes = value.getIf<Data>()) return {*bytes};
  if (const auto* dictionary = value.getIf<platform::Dictionary>()) return {fromWire(*dictionary)};
  if (const auto* array = value.getIf<Array>()) {
    quorvel::Value::Array items;
    for (const platform::Value& item : *array) items.push_back(fromWire(item));
    return {std::move(items)};
  }
  return {};
}

quorvel::Dictionary fromWire(const platform::Dictionary& dictionary) {
  quorvel::Dictionary result;
  for (const auto& [key, value] : dictionary) {
    if (!value.getIf<platform::SharedFileDescriptor>()) result.emplace(key, fromWire(value));
  }
  return result;
}

std::optional<IPCArguments> startArguments(const quorvel::StartOptions& options) {
  Array contextIDs, endpoint;
  for (const uint32_t window : options.windows) contextIDs.emplace_back(window);
  if (options.listenerEndpoint >= 0) {
    platform::FileDescriptor copy(::fcntl(options.listenerEndpoint, F_DUPFD_CLOEXEC, 0));
    if (!copy.isValid()) return std::nullopt;
    endpoint.emplace_back(platform::shareFileDescriptor(std::move(copy)));
  }
  return IPCArguments{contextIDs,         Array{options.width, options.height},
                      options.microphone, options.camera,
                      options.broadcast,  options.system,
                      options.capture,    endpoint};
}

std::optional<quorvel::Error> errorFromWire(const platform::Value& value) {
  const platform::Dictionary& dictionary = value.asDictionary();
  if (dictionary.empty()) return std::nullopt;
  const platform::Value code = valueForKey(dictionary, "code");
  if (!code.isNumber()) return libraryError(quorvel::kErrorUnknown, "malformed error");
  return errorFromDaemon(*platform::decodeError(dictionary));
}

quorvel::State stateFromWire(const platform::Dictionary& dictionary) {
  const auto flag = [&](const char* key) { return valueForKey(dictionary, key).asBool(); };
  quorvel::State state;
  state.recording = flag("isRecording");
  state.broadcasting = flag("isBroadcasting");
  state.microphoneEnabled = flag("microphoneEnabled");
  state.systemRecording = flag("isSystemRecording");
  state.userConsentForMicrophone = flag("hasUserConsentForMicrophone");
  state.userConsentForCamera = flag("hasUserConsentForCamera");
  state.microphoneEnabledPersistent = flag("microphoneEnabledPersistent");
  const platform::Value url = valueForKey(dictionary, "broadcastURL");
  if (const auto* text = url.getIf<std::string>()) state.broadcastURL = *text;
  if (const auto* location = url.getIf<platform::URL>()) state.broadcastURL = location->absoluteString();
  return state;
}

quorvel::BroadcastExtension extensionFromWire(const platform::Dictionary& dictionary) {
  return {valueForKey(dictionary, "displayName").asString(), valueForKey(dictionary, "extBundleID").asString(),
          valueForKey(dictionary, "extAppImgData").asData()};
}

std::optional<quorvel::VideoFrame> videoFrameFromWire(const IPCArguments& arguments) {
  if (arguments.size() != 2) return std::nullopt;
  const auto timing = recordFromBytes<SampleTimingInfo>(arguments[1].asData());
  const auto presentationTime = timing ? sampleTime(timing->presentationTimeStamp) : std::nullopt;
  const platform::SharedFrameRef surface = QVSharedFrameObject::decodeFromIPC(arguments[0]).sharedFrame();
  if (!surface || !presentationTime || surface->layout().format != platform::PixelFormat::BGRX) return std::nullopt;
  return quorvel::VideoFrame{.pixels = surface->bytes(),
                             .width = surface->layout().width,
                             .height = surface->layout().height,
                             .stride = surface->layout().stride,
                             .presentationTime = *presentationTime,
                             .duration = sampleTime(timing->duration),
                             .surface = surface};
}

std::optional<quorvel::AudioSample> audioSampleFromWire(const IPCArguments& arguments) {
  if (arguments.size() != 5) return std::nullopt;
  const auto description = recordFromBytes<platform::AudioStreamDescription>(arguments[1].asData());
  const int64_t frameCount = arguments[2].asInteger(-1);
  const int64_t bufferType = arguments[3].asInteger();
  const auto timing = recordFromBytes<SampleTimingInfo>(arguments[4].asData());
  const auto presentationTime = timing ? sampleTime(timing->presentationTimeStamp) : std::nullopt;
  if (!description || description->formatID != platform::kAudioFormatLinearPCM || !presentationTime)
    return std::nullopt;
  if (bufferType != kApplicationAudio && bufferType != kMicrophoneAudio) return std::nullopt;
  const Data& bytes = arguments[0].asData();
  // An application may trust that the frames it is told of are there.
  const uint32_t bytesPerFrame = description->bytesPerFrame;
  if (frameCount < 0 || bytesPerFrame == 0 || static_cast<uint64_t>(frameCount) > bytes.size() / bytesPerFrame)
    return std::nullopt;
  return quorvel::AudioSample{.source = bufferType == kMicrophoneAudio ? quorvel::AudioSample::Source::Microphone
                                                                       : quorvel::AudioSample::Source::Application,
                              .bytes = bytes,
                              .format = audioFormat(*description),
                              .frameCount = frameCount,
                              .presentationTime = *presentationTime,
                              .duration = sampleTime(timing->duration)};
}

}  // namespace qv::client
