#pragma once

#include <cstdint>
#include <vector>

#include "platform/mp4/ByteWriter.h"
#include "platform/mp4/MovieTrack.h"

namespace qv::platform::mp4 {

/// Where the samples of one track stand in the file and when they are shown. Grows by four to
/// twelve bytes per sample: an hour of a recording takes some megabytes.
///
/// Threading: confined to one thread.
class TrackIndex {
 public:
  /// Samples come in decode order; `startsChunk` where the one before is not its neighbour in the file.
  void add(const EncodedSample& sample, uint64_t offset, bool startsChunk);

  /// The same for a sample without reordering whose bytes are not at hand.
  void add(int64_t decodeTime, uint32_t duration, uint32_t size, bool isSync, uint64_t offset, bool startsChunk);

  [[nodiscard]] size_t count() const { return sizes_.size(); }
  [[nodiscard]] bool isEmpty() const { return sizes_.empty(); }
  [[nodiscard]] int64_t firstDecodeTime() const { return firstDecodeTime_; }
  [[nodiscard]] int64_t lastDecodeTime() const { return lastDecodeTime_; }
  /// The end of the last sample, from its own duration.
  [[nodiscard]] int64_t endTime() const { return lastDecodeTime_ + lastDuration_; }

  /// Drops the samples at the end that are decoded at or after `end`; never the very first.
  void dropFrom(int64_t end);
  /// The last sample lasts until `end` (later than its decode time).
  void setEndTime(int64_t end);

  /// The sample table's boxes after "stsd".
  void writeTables(ByteWriter& out) const;

 private:
  struct Run {
    uint32_t count;
    uint32_t value;
  };
  struct Chunk {
    uint64_t offset;
    uint32_t firstSample;
  };
  void addEntry(int64_t decodeTime, int32_t compositionOffset, uint32_t duration, uint32_t size, bool isSync,
                uint64_t offset, bool startsChunk);
  static void extend(std::vector<Run>& runs, uint32_t value);
  static void shorten(std::vector<Run>& runs);
  void addSync(bool isSync);
  void dropLast();
  void writeTimes(ByteWriter& out) const;
  void writeSyncSamples(ByteWriter& out) const;
  void writeChunks(ByteWriter& out) const;

  std::vector<uint32_t> sizes_;
  std::vector<Run> durations_;  ///< of all samples but the last
  std::vector<Run> compositionOffsets_;
  bool allSync_ = true;
  std::vector<uint32_t> syncSamples_;  ///< counted from 1; only where there are others
  std::vector<Chunk> chunks_;
  int64_t firstDecodeTime_ = 0;
  int64_t lastDecodeTime_ = 0;
  int64_t lastDuration_ = 0;
};

}  // namespace qv::platform::mp4
