#pragma once

#include "platform/x11/CaptureSource.h"

namespace qv::platform {

/// The whole screen.
///
/// Threading: the capture thread.
class ScreenSource final : public CaptureSource {
 public:
  explicit ScreenSource(XcbConnection& connection);
  void handleEvent(const xcb_generic_event_t& event) override;
  [[nodiscard]] bool hasChanged() const override { return changed_; }
  const std::vector<PictureLayer>& takeLayers() override;
  void layerWasLost() override { sizeIsStale_ = changed_ = true; }
  [[nodiscard]] bool showsTopLevel(xcb_window_t) const override { return true; }
  [[nodiscard]] std::optional<int32_t> failure() const override { return failure_; }

 private:
  void readSize();

  XcbConnection& connection_;
  uint32_t damage_;
  uint8_t damageEvent_;
  bool changed_ = true;
  bool damaged_ = true;
  bool sizeIsStale_ = true;
  std::optional<int32_t> failure_;
  std::vector<PictureLayer> layers_;
};

}  // namespace qv::platform
