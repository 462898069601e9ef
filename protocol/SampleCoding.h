#pragma once

#include <optional>
#include <variant>

#include "platform/base/SampleBuffer.h"
#include "protocol/QVBroadcastProtocols.h"
#include "protocol/QVClientProtocol.h"
#include "protocol/SampleType.h"

namespace qv {

// Samples as they cross to a client or an extension: made by the daemon, read by the libraries. What is read may be
// malformed in ways that the wire's types allow; such a sample is nothing.

/// Threading: a value.
struct PictureMessage {
  platform::SharedFrameRef surface;  ///< its pixels are BGRX
  platform::SampleTimingInfo timing;
  platform::MediaTime pauses = platform::MediaTime::zero();  ///< broadcasts only: taken out of `timing` already
  uint32_t orientation = 1;                                  ///< broadcasts only: an EXIF code, 1 to 8
};

/// A run of linear PCM.
///
/// Threading: a value.
struct SoundMessage {
  SampleType type = SampleType::AppAudio;
  platform::Data bytes;  ///< at least numSamples frames
  platform::AudioStreamDescription format;
  int64_t numSamples = 0;
  platform::SampleTimingInfo timing;                         ///< that of its capture
  platform::MediaTime pauses = platform::MediaTime::zero();  ///< broadcasts only: still to be taken out of `timing`
};
[[nodiscard]] SoundMessage makeSoundMessage(SampleType type, const platform::SampleBuffer& sample);

/// A step of a broadcast.
struct ActionMessage {
  BroadcastAction action;
  platform::Dictionary userInfo;
};
struct FrontmostMessage {
  std::string bundleID;
};

// A capture's, one call for each sample.
[[nodiscard]] callback::CaptureHandlerWithSample captureCallOf(const PictureMessage& picture);
[[nodiscard]] callback::CaptureHandlerWithAudioSample captureCallOf(SoundMessage sound);
[[nodiscard]] std::optional<PictureMessage> pictureOf(const callback::CaptureHandlerWithSample& call);
[[nodiscard]] std::optional<SoundMessage> soundOf(callback::CaptureHandlerWithAudioSample call);
[[nodiscard]] callback::CaptureTimelineDidChange timelineCallOf(platform::MediaTime pauses);
[[nodiscard]] std::optional<platform::MediaTime> pausesOf(const callback::CaptureTimelineDidChange& call);

// A broadcast's, one payload for each message. A picture's surface is not in what is made: it joins the payload under
// broadcastpayload::kSharedFrame, with a lease of its own, when that is sent.
[[nodiscard]] platform::Dictionary payloadOf(const ActionMessage& action);
[[nodiscard]] platform::Dictionary payloadOf(const FrontmostMessage& frontmost);
[[nodiscard]] platform::Dictionary payloadOf(const PictureMessage& picture);
[[nodiscard]] platform::Dictionary payloadOf(SoundMessage sound);
/// None of them: a payload that is malformed.
using BroadcastMessage = std::variant<std::monostate, ActionMessage, FrontmostMessage, PictureMessage, SoundMessage>;
[[nodiscard]] BroadcastMessage broadcastMessageOf(const platform::Dictionary& payload);

}  // namespace qv
