#include "sdk/extension/PauseTimeline.h"

#include <algorithm>

namespace qv::extension {

void PauseTimeline::paused(Time now) {
  formerShift_ = shift_;
  pausedAt_ = now;
  resumedAt_ = kNone;
}

void PauseTimeline::resumed(Time now) {
  resumedAt_ = now;
  least_ = kNone;
  // Until a picture tells better: the first one takes up where the last one before the pause was.
  if (delivery_ != kNone) shift_ = std::max(formerShift_, now - lastPicture_ - delivery_);
}

void PauseTimeline::notePicture(Time presentation, Time now) {
  lastPicture_ = presentation;
  least_ = std::min(least_, now - presentation);
  if (pausedAt_ == kNone) {
    delivery_ = least_;
  } else if (resumedAt_ != kNone) {
    shift_ = least_ - (delivery_ == kNone ? Time(0) : delivery_);
  }
}

std::optional<PauseTimeline::Time> PauseTimeline::place(Time captured) const {
  if (captured < pausedAt_) return captured - formerShift_;
  if (captured < resumedAt_) return std::nullopt;
  return captured - shift_;
}

}  // namespace qv::extension
