#pragma once

#include <memory>
#include <set>

#include "platform/x11/ClonedWindow.h"

namespace qv::platform {

/// Windows, composed in their stacking order at their places on the screen.
///
/// Threading: the capture thread.
class CloneSource final : public CaptureSource {
 public:
  CloneSource(XcbConnection& connection, const std::set<uint32_t>& windows);
  void handleEvent(const xcb_generic_event_t& event) override;
  [[nodiscard]] bool hasChanged() const override { return changed_; }
  const std::vector<PictureLayer>& takeLayers() override;
  void layerWasLost() override { placesAreStale_ = changed_ = true; }
  [[nodiscard]] bool showsTopLevel(xcb_window_t topLevel) const override;
  [[nodiscard]] std::optional<int32_t> failure() const override { return failure_; }

 private:
  ClonedWindow* find(xcb_window_t window);
  void dropContents(xcb_window_t hidden);
  void readPlaces();

  XcbConnection& connection_;
  const uint8_t damageEvent_;
  std::vector<std::unique_ptr<ClonedWindow>> windows_;
  std::vector<PictureLayer> layers_;
  bool changed_ = true;
  bool placesAreStale_ = true;
  std::optional<int32_t> failure_;
};

}  // namespace qv::platform
