#include "protocol/QVSharedFrameObject.h"

#include "platform/threads/SharedFrameLease.h"

namespace qv {

using platform::Array;
using platform::SharedFileDescriptor;
using platform::SharedFrame;
using platform::Value;

platform::Value QVSharedFrameObject::encodeForIPC() const {
  if (!sharedFrame_) return {};
  auto lease = platform::issueSharedFrameLease(sharedFrame_);
  if (!lease) return {};
  const platform::FrameLayout& layout = sharedFrame_->layout();
  return Value(Array{Value(sharedFrame_->memory()), Value(platform::shareFileDescriptor(std::move(*lease))),
                     Value(layout.width), Value(layout.height), Value(layout.stride),
                     Value(static_cast<uint32_t>(layout.format))});
}

QVSharedFrameObject QVSharedFrameObject::decodeFromIPC(const platform::Value& value) {
  const Array& fields = value.asArray();
  if (fields.size() != 6) return {};
  const auto* memory = fields[0].getIf<SharedFileDescriptor>();
  const auto* lease = fields[1].getIf<SharedFileDescriptor>();
  if (!memory || !lease) return {};
  for (size_t i = 2; i < fields.size(); ++i) {
    if (!fields[i].getIf<uint32_t>()) return {};
  }
  const platform::FrameLayout layout{*fields[2].getIf<uint32_t>(), *fields[3].getIf<uint32_t>(),
                                     *fields[4].getIf<uint32_t>(),
                                     static_cast<platform::PixelFormat>(*fields[5].getIf<uint32_t>())};
  auto attachment = std::make_shared<SharedFileDescriptor>(*lease);
  auto frame = SharedFrame::adopt(*memory, layout, std::move(attachment));
  if (!frame) return {};
  return QVSharedFrameObject(std::move(*frame));
}

}  // namespace qv
