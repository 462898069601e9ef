#include <algorithm>

#include "platform/threads/Log.h"
#include "writer/QVMovieWriter.h"

namespace qv {

using platform::Dictionary;
using platform::Value;
namespace logs = platform::logs;
namespace settings = platform::settings;

namespace {

constexpr double kMaximumSide = 16384.0;

/// Truncated to an integer and, when odd, one more: H.264 with 4:2:0 chroma wants even sides.
double evenSide(double side) {
  const auto whole = static_cast<int64_t>(std::min(std::max(1.0, side), kMaximumSide));  // what is no number is 1
  return static_cast<double>(whole + (whole & 1));
}

/// Layout tag stereo (101 << 16 | 2), no bitmap, no channel descriptions.
platform::Data stereoChannelLayout() {
  platform::Data layout(32, 0);
  layout[0] = 0x02;
  layout[2] = 0x65;
  return layout;
}

Dictionary audioSettings() {
  return {{settings::kFormatID, Value(platform::kAudioFormatMPEG4AAC)},
          {settings::kNumberOfChannels, Value(int32_t{2})},
          {settings::kSampleRate, Value(44100.0)},
          {settings::kChannelLayout, Value(stereoChannelLayout())},
          {settings::kEncoderBitRate, Value(int32_t{128000})}};
}

}  // namespace

void QVMovieWriter::createInputs() {
  platform::AssetWriterService& service = *platform_.assetWriter;
  const Dictionary videoSettings{{settings::kVideoCodec, Value(settings::kCodecH264)},
                                 {settings::kVideoWidth, Value(evenSide(windowSize_.width))},
                                 {settings::kVideoHeight, Value(evenSide(windowSize_.height))},
                                 {settings::kCompressionProperties, Value(compressionProperties())}};
  video_.input = service.createWriterInput(platform::MediaType::Video, videoSettings);
  audio1_.input = service.createWriterInput(platform::MediaType::Audio, audioSettings());
  audio2_.input = service.createWriterInput(platform::MediaType::Audio, audioSettings());
  for (Track* track : {&video_, &audio1_, &audio2_}) {
    track->input->setExpectsMediaDataInRealTime(true);
    assetWriter_->addInput(track->input);
  }
}

void QVMovieWriter::dispatchedSetupAssetWriter() {
  QV_LOG(logs::kWriter, "QVMovieWriter: setupAssetWriter");
  // A recording that ended while its file was being prepared needs none any more.
  if (isFinishingWriting_) return;
  auto created = platform_.assetWriter->createAssetWriter(outputURL(), platform::kFileTypeMPEG4);
  if (!created) {
    noteFailure(created.error());
    QV_LOG_ERROR(logs::kWriter, "QVMovieWriter: setupAssetWriter error: %i", static_cast<int>(created.error().code));
    return;
  }
  assetWriter_ = std::move(*created);
  counts_.store(assetWriter_->counts());
  createInputs();
}

}  // namespace qv
