#pragma once

namespace qv::platform {

/// Width and height in pixels.
struct Size {
  double width = 0;
  double height = 0;
  bool operator==(const Size&) const = default;
};

/// Maps (x, y) to (a x + c y + tx, b x + d y + ty).
struct AffineTransform {
  double a = 1, b = 0, c = 0, d = 1, tx = 0, ty = 0;
  static constexpr AffineTransform identity() { return {}; }
  bool operator==(const AffineTransform&) const = default;
};

/// The transform that applies `first` and then `second`.
constexpr AffineTransform concatenate(const AffineTransform& first, const AffineTransform& second) {
  return {first.a * second.a + first.b * second.c,
          first.a * second.b + first.b * second.d,
          first.c * second.a + first.d * second.c,
          first.c * second.b + first.d * second.d,
          first.tx * second.a + first.ty * second.c + second.tx,
          first.tx * second.b + first.ty * second.d + second.ty};
}

}  // namespace qv::platform
