#include "session/PictureTransform.h"

#include "platform/threads/Log.h"

namespace qv {

using platform::AffineTransform;
namespace logs = platform::logs;

namespace {
constexpr uint64_t kRotate = 4;
constexpr uint64_t kFlipX = 2;
constexpr uint64_t kFlipY = 1;
}  // namespace

uint32_t orientationFromVellTransform(uint64_t transformFlags) {
  static constexpr uint32_t kOrientations[] = {1, 4, 2, 3, 8, 5, 7, 6};
  return transformFlags < 8 ? kOrientations[transformFlags] : 1;
}

AffineTransform _affineTransformFromVellTransformFlags(uint64_t transformFlags) {
  AffineTransform transform = AffineTransform::identity();
  if (transformFlags & kRotate) {
    QV_LOG_DEBUG(logs::kSession, "rotate clockwise");
    // A quarter turn by exact values: cos is 0 and sin 1.
    transform = concatenate(transform, {0, 1, -1, 0, 0, 0});
  }
  if (transformFlags & kFlipX) {
    QV_LOG_DEBUG(logs::kSession, "flip x");
    transform.a = transform.a == 0 ? 0 : -transform.a;
    transform.b = transform.b == 0 ? 0 : -transform.b;
  }
  if (transformFlags & kFlipY) {
    QV_LOG_DEBUG(logs::kSession, "flip y");
    transform.c = transform.c == 0 ? 0 : -transform.c;
    transform.d = transform.d == 0 ? 0 : -transform.d;
  }
  return transform;
}

}  // namespace qv
