#pragma once

#include <functional>
#include <memory>

#include "../common/AVHandles.h"
#include "SoundMixer.h"

namespace upload {

/// AAC of the mixer's chunks.
///
/// Threading: one thread.
class SoundEncoder {
 public:
  /// Nothing where the machine has no encoder.
  static std::unique_ptr<SoundEncoder> open(int bitRate, bool hasGlobalHeader);
  [[nodiscard]] const AVCodecContext& context() const { return *context_; }
  /// Packets have times in microseconds.
  void encode(const SoundMixer::Chunk& chunk, const std::function<void(Packet)>& output);

 private:
  explicit SoundEncoder(CodecContext context);
  const CodecContext context_;
  const Frame frame_;
};

}  // namespace upload
