#pragma once

#include <quorvel/BroadcastExtension.h>

#include <optional>

#include "../common/AVHandles.h"

struct SwsContext;

namespace upload {

/// A picture's size in pixels.
struct PictureSize {
  int width = 0, height = 0;
  friend bool operator==(const PictureSize&, const PictureSize&) = default;
};

/// The size of a picture once it stands upright.
PictureSize uprightSize(PictureSize size, quorvel::Orientation orientation);

/// Brings pictures to YUV 4:2:0 of BT.709 in the size of the stream, upright: live containers have no rotation. A
/// picture of other proportions keeps them, between black bars.
///
/// Threading: one thread.
class PictureConverter {
 public:
  PictureConverter() = default;
  ~PictureConverter();
  PictureConverter(const PictureConverter&) = delete;
  PictureConverter& operator=(const PictureConverter&) = delete;

  /// Into the same picture each time: the bars are drawn only when they change. False for a picture without pixels, or
  /// where memory is short.
  [[nodiscard]] bool convert(const quorvel::VideoFrame& frame, quorvel::Orientation orientation, AVFrame& to);

 private:
  struct Layout {
    PictureSize size;
    quorvel::Orientation orientation;
    friend bool operator==(const Layout&, const Layout&) = default;
  };
  [[nodiscard]] bool prepare(const Layout& layout, AVFrame& to);
  void turn(AVFrame& to) const;

  std::optional<Layout> layout_;  // what the rest is for
  PictureSize placed_;            // the upright picture within the stream's
  int left_ = 0, top_ = 0;        // where it begins; even
  Frame turned_;                  // scaled, but as it came; nothing where it needs no turn and no bars
  SwsContext* scaler_ = nullptr;
};

}  // namespace upload
