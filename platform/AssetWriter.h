#pragma once

#include <functional>
#include <memory>
#include <optional>
#include <string>

#include "platform/base/Error.h"
#include "platform/base/Geometry.h"
#include "platform/base/Result.h"
#include "platform/base/SampleBuffer.h"

namespace qv::platform {

enum class AssetWriterStatus : int32_t { Unknown = 0, Writing = 1, Completed = 2, Failed = 3, Cancelled = 4 };
enum class MediaType { Video, Audio };

inline constexpr const char kFileTypeMPEG4[] = "com.quorvel.mpeg-4";

/// Keys of a WriterInput's output settings.
namespace settings {
inline constexpr const char kVideoCodec[] = "VideoCodec";                            ///< string, kCodecH264
inline constexpr const char kVideoWidth[] = "VideoWidth";                            ///< double, pixels
inline constexpr const char kVideoHeight[] = "VideoHeight";                          ///< double, pixels
inline constexpr const char kCompressionProperties[] = "CompressionProperties";      ///< dictionary, below
inline constexpr const char kAverageBitRate[] = "AverageBitRate";                    ///< integer, bits per second
inline constexpr const char kExpectedSourceFrameRate[] = "ExpectedSourceFrameRate";  ///< integer, 1/s
inline constexpr const char kMaxKeyFrameInterval[] = "MaxKeyFrameInterval";          ///< integer, frames
inline constexpr const char kProfileLevel[] = "ProfileLevel";                        ///< string, kProfile...
inline constexpr const char kFormatID[] = "FormatID";                                ///< integer, four-character code
inline constexpr const char kNumberOfChannels[] = "NumberOfChannels";                ///< integer
inline constexpr const char kSampleRate[] = "SampleRate";                            ///< double, Hz
inline constexpr const char kChannelLayout[] = "ChannelLayout";                      ///< data, 32 bytes
inline constexpr const char kEncoderBitRate[] = "EncoderBitRate";                    ///< integer, bits per second
inline constexpr const char kCodecH264[] = "H264";
inline constexpr const char kProfileBaselineAutoLevel[] = "H264_Baseline_AutoLevel";
inline constexpr const char kProfileMainAutoLevel[] = "H264_Main_AutoLevel";
inline constexpr const char kProfileHighAutoLevel[] = "H264_High_AutoLevel";

/// From 1 to these.
inline constexpr int64_t kMaximumAverageBitRate = 200'000'000;
inline constexpr int64_t kMaximumExpectedSourceFrameRate = 240;
inline constexpr int64_t kMaximumKeyFrameInterval = 36'000;
}  // namespace settings

/// One track of a movie that is being written.
///
/// Readiness: started, not failed, not finishing, and room in the bounded queue to the encoder. An
/// input of a real-time source never stays busy for long: when its queue is full it drops video
/// (evenly, and counts it) rather than report itself not ready; audio is never dropped.
///
/// Threading: called by the writer's owner on its one queue.
class WriterInput {
 public:
  virtual ~WriterInput() = default;
  /// Of a video input; before writing starts.
  virtual void setTransform(const AffineTransform& transform) = 0;
  virtual void setExpectsMediaDataInRealTime(bool realTime) = 0;
  [[nodiscard]] virtual bool isReadyForMoreMediaData() const = 0;
  /// Takes the sample; encoding happens on the writer's threads. Holds a reference until then.
  /// False when the input is not ready or the writer has failed.
  virtual bool append(const SampleBufferRef& sample) = 0;
};

/// What can be told of a movie while it is written, and after it.
///
/// Threading: thread-safe.
class AssetWriterCounts {
 public:
  virtual ~AssetWriterCounts() = default;
  /// The name of the video encoder, as its library has it, e.g. "libx264"; empty until it is chosen.
  [[nodiscard]] virtual std::string videoEncoder() const = 0;
  /// Pictures that found the queue to the encoder full.
  [[nodiscard]] virtual uint64_t droppedPictures() const = 0;
};

/// Writes one movie file that a crash leaves playable up to at most a second before it.
///
/// Life: add inputs; `startWriting`, once; `startSessionAtSourceTime`, once; append; optionally
/// `endSessionAtSourceTime`; `finishWriting`, once. Video is placed by its presentation time.
/// Audio is placed by its capture time, through the same steps by which the video's presentation
/// times differ from its capture times: so a rebase across a pause moves both. Audio captured before
/// the session start or inside a pause is left out; a gap is silence. Behind the last picture the last
/// step holds. The last picture is shown until the end of the session; where none was set, until
/// the end of the last sound, and for one frame interval at least.
///
/// Threading: operations from one thread at a time; `finishWriting`'s completion comes on a
/// thread of the writer's.
class AssetWriter {
 public:
  virtual ~AssetWriter() = default;
  [[nodiscard]] virtual AssetWriterStatus status() const = 0;
  [[nodiscard]] virtual std::optional<Error> error() const = 0;
  [[nodiscard]] virtual const URL& outputURL() const = 0;
  /// It may outlive the writer. Never nothing.
  [[nodiscard]] virtual std::shared_ptr<const AssetWriterCounts> counts() const = 0;
  virtual void addInput(std::shared_ptr<WriterInput> input) = 0;
  /// Creates the file. False, with `error`, where that fails or it was called before.
  virtual bool startWriting() = 0;
  virtual void startSessionAtSourceTime(MediaTime time) = 0;
  /// The movie is to end at this presentation time: nothing goes beyond it, and what comes before it stays, also
  /// sound behind the last picture. Only a picture of this very time is still shown, for one frame interval.
  virtual void endSessionAtSourceTime(MediaTime time) = 0;
  /// Completes the file on disk; afterwards status is Completed or Failed.
  virtual void finishWriting(std::function<void()> completion) = 0;
};

class AssetWriterService {
 public:
  virtual ~AssetWriterService() = default;
  /// A movie is likely to be wanted soon (the user is being asked): make ready what takes long.
  /// Returns at once.
  virtual void prepareForWriting() = 0;
  /// An error where the URL is no file URL, its directory is missing or not writable, or the file
  /// exists already.
  virtual Result<std::unique_ptr<AssetWriter>> createAssetWriter(const URL& outputURL, const std::string& fileType) = 0;
  /// Compression properties that the encoder does not know or cannot follow are logged and left out.
  virtual std::shared_ptr<WriterInput> createWriterInput(MediaType type, const Dictionary& outputSettings) = 0;
};

}  // namespace qv::platform
