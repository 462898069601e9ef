#include "protocol/SampleCoding.h"

#include <gtest/gtest.h>
#include <unistd.h>

#include <cstring>
#include <functional>

#include "platform/base/RawRecord.h"

namespace qv {
namespace {

using platform::Data;
using platform::Dictionary;
using platform::MediaTime;
using platform::Value;

const platform::SampleTimingInfo kTiming{MediaTime::make(1, 60), MediaTime::make(5, 1), MediaTime::invalid()};

PictureMessage picture() {
  auto surface = *platform::SharedFrame::create({2, 2, 8, platform::PixelFormat::BGRX});
  std::memset(surface->mutableBytes().data(), 0x5a, 16);
  return {.surface = std::move(surface), .timing = kTiming, .pauses = MediaTime::make(3, 1), .orientation = 6};
}

/// Two frames in four bytes.
SoundMessage sound() {
  return {
      .type = SampleType::Microphone,
      .bytes = {1, 2, 3, 4},
      .format = {44100, platform::kAudioFormatLinearPCM, platform::kAudioFormatFlagIsSignedInteger, 2, 1, 2, 1, 16, 0},
      .numSamples = 2,
      .timing = kTiming,
      .pauses = MediaTime::make(3, 1)};
}

TEST(SampleCodingTest, ACapturesSamplesArriveAsTheyWereSent) {
  const auto received = [](const auto& call) { return callOf<std::decay_t<decltype(call)>>(argumentsOf(call)); };
  const auto shown = pictureOf(received(captureCallOf(picture()))).value();
  EXPECT_EQ(shown.surface->layout(), picture().surface->layout());
  EXPECT_TRUE(std::ranges::equal(shown.surface->bytes(), picture().surface->bytes()));
  EXPECT_EQ(rawBytes(shown.timing), rawBytes(kTiming));
  const auto heard = soundOf(received(captureCallOf(sound()))).value();
  EXPECT_EQ(heard.type, SampleType::Microphone);
  EXPECT_EQ(heard.bytes, sound().bytes);
  EXPECT_EQ(heard.format, sound().format);
  EXPECT_EQ(heard.numSamples, 2);
  EXPECT_EQ(rawBytes(heard.timing), rawBytes(kTiming));
  EXPECT_EQ(pausesOf(received(timelineCallOf(MediaTime::make(7, 2)))), MediaTime::make(7, 2));
  EXPECT_FALSE(pausesOf({Data(23)}));
}

TEST(SampleCodingTest, MalformedSamplesAreNothing) {
  using Call = callback::CaptureHandlerWithAudioSample;
  const std::vector<std::function<void(Call&)>> damages = {
      [](Call& call) { call.bufferType = static_cast<int64_t>(SampleType::Video); },
      [](Call& call) { call.itemCount = 3; },  // more frames than bytes
      [](Call& call) { call.itemCount = -1; },
      [](Call& call) { call.itemCount = INT64_MAX; },
      [](Call& call) { call.absdData.pop_back(); },
      [](Call& call) { call.timingData.pop_back(); },
      [](Call& call) { call.timingData.assign(72, 0); },  // no time
      [](Call& call) { call.absdData.assign(40, 0); },    // no PCM
  };
  for (size_t i = 0; i < damages.size(); ++i) {
    Call call = captureCallOf(sound());
    damages[i](call);
    EXPECT_FALSE(soundOf(call)) << i;
  }
  EXPECT_TRUE(std::holds_alternative<std::monostate>(broadcastMessageOf(payloadOf(picture()))))
      << "without its surface";
  const auto pipe = platform::shareFileDescriptor(platform::FileDescriptor(::dup(0)));
  const platform::Array notAFrame{pipe, pipe, 2u, 2u, 8u, 1u};
  EXPECT_FALSE(pictureOf(callOf<callback::CaptureHandlerWithSample>({notAFrame, rawBytes(kTiming)})));

  for (const auto& [key, value] : payloadOf(sound())) {
    Dictionary payload = payloadOf(sound());
    payload[key] = "text";
    EXPECT_TRUE(std::holds_alternative<std::monostate>(broadcastMessageOf(payload))) << key;
    payload.erase(key);
    const bool mayMiss = key == broadcastpayload::kPauses;
    EXPECT_EQ(std::holds_alternative<SoundMessage>(broadcastMessageOf(payload)), mayMiss) << key;
  }
}

}  // namespace
}  // namespace qv
