#include "platform/mp4/TrackIndex.h"

#include <algorithm>
#include <limits>

namespace qv::platform::mp4 {

void TrackIndex::extend(std::vector<Run>& runs, uint32_t value) {
  if (!runs.empty() && runs.back().value == value) {
    ++runs.back().count;
  } else {
    runs.push_back({1, value});
  }
}

void TrackIndex::shorten(std::vector<Run>& runs) {
  if (--runs.back().count == 0) runs.pop_back();
}

void TrackIndex::add(const EncodedSample& sample, uint64_t offset, bool startsChunk) {
  addEntry(sample.decodeTime, sample.compositionOffset, sample.duration, static_cast<uint32_t>(sample.data.size()),
           sample.isSync, offset, startsChunk);
}

void TrackIndex::add(int64_t decodeTime, uint32_t duration, uint32_t size, bool isSync, uint64_t offset,
                     bool startsChunk) {
  addEntry(decodeTime, 0, duration, size, isSync, offset, startsChunk);
}

void TrackIndex::addEntry(int64_t decodeTime, int32_t compositionOffset, uint32_t duration, uint32_t size, bool isSync,
                          uint64_t offset, bool startsChunk) {
  if (isEmpty()) {
    firstDecodeTime_ = decodeTime;
  } else {
    extend(durations_, static_cast<uint32_t>(decodeTime - lastDecodeTime_));
  }
  if (startsChunk || chunks_.empty()) chunks_.push_back({offset, static_cast<uint32_t>(count())});
  sizes_.push_back(size);
  extend(compositionOffsets_, static_cast<uint32_t>(compositionOffset));
  addSync(isSync);
  lastDecodeTime_ = decodeTime;
  lastDuration_ = duration;
}

/// Where all are, as those of sound, none is listed.
void TrackIndex::addSync(bool isSync) {
  if (allSync_ && !isSync) {
    allSync_ = false;
    for (size_t number = 1; number < count(); ++number) syncSamples_.push_back(static_cast<uint32_t>(number));
  } else if (!allSync_ && isSync) {
    syncSamples_.push_back(static_cast<uint32_t>(count()));
  }
}

void TrackIndex::dropLast() {
  if (!syncSamples_.empty() && syncSamples_.back() == count()) syncSamples_.pop_back();
  sizes_.pop_back();
  shorten(compositionOffsets_);
  if (chunks_.back().firstSample == count()) chunks_.pop_back();
  lastDuration_ = durations_.back().value;
  lastDecodeTime_ -= lastDuration_;
  shorten(durations_);
}

void TrackIndex::dropFrom(int64_t end) {
  while (count() > 1 && lastDecodeTime_ >= end) dropLast();
}

void TrackIndex::setEndTime(int64_t end) {
  lastDuration_ = std::min<int64_t>(end - lastDecodeTime_, std::numeric_limits<uint32_t>::max());
}

void TrackIndex::writeTimes(ByteWriter& out) const {
  auto runs = durations_;
  extend(runs, static_cast<uint32_t>(lastDuration_));
  {
    BoxScope box(out, "stts", 0, 0);
    out.u32(runs.size());
    for (const Run& run : runs) {
      out.u32(run.count);
      out.u32(run.value);
    }
  }
  if (compositionOffsets_.size() == 1 && compositionOffsets_.front().value == 0) return;
  BoxScope box(out, "ctts", 1, 0);
  out.u32(compositionOffsets_.size());
  for (const Run& run : compositionOffsets_) {
    out.u32(run.count);
    out.u32(run.value);
  }
}

void TrackIndex::writeSyncSamples(ByteWriter& out) const {
  if (allSync_) return;
  BoxScope box(out, "stss", 0, 0);
  out.u32(syncSamples_.size());
  for (const uint32_t number : syncSamples_) out.u32(number);
}

void TrackIndex::writeChunks(ByteWriter& out) const {
  std::vector<std::pair<uint32_t, uint32_t>> runs;  // first chunk, samples in each
  for (size_t i = 0; i < chunks_.size(); ++i) {
    const size_t next = i + 1 < chunks_.size() ? chunks_[i + 1].firstSample : count();
    const auto samples = static_cast<uint32_t>(next - chunks_[i].firstSample);
    if (runs.empty() || runs.back().second != samples) runs.emplace_back(static_cast<uint32_t>(i + 1), samples);
  }
  {
    BoxScope box(out, "stsc", 0, 0);
    out.u32(runs.size());
    for (const auto& [first, samples] : runs) {
      out.u32(first);
      out.u32(samples);
      out.u32(1);
    }
  }
  const bool large = chunks_.back().offset > std::numeric_limits<uint32_t>::max();
  const auto writeOffsets = [&] {
    out.u32(chunks_.size());
    for (const Chunk& chunk : chunks_) large ? out.u64(chunk.offset) : out.u32(chunk.offset);
  };
  if (large) {
    BoxScope box(out, "co64", 0, 0);
    writeOffsets();
  } else {
    BoxScope box(out, "stco", 0, 0);
    writeOffsets();
  }
}

void TrackIndex::writeTables(ByteWriter& out) const {
  writeTimes(out);
  writeSyncSamples(out);
  {
    BoxScope box(out, "stsz", 0, 0);
    out.u32(0);
    out.u32(count());
    for (const uint32_t size : sizes_) out.u32(size);
  }
  writeChunks(out);
}

}  // namespace qv::platform::mp4
