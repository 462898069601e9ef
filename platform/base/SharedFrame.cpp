#include "platform/base/SharedFrame.h"

#include <fcntl.h>
#include <sys/mman.h>
#include <sys/stat.h>

#include <cerrno>
#include <mutex>
#include <vector>

namespace qv::platform {
namespace {

constexpr uint32_t kMaximumSide = 16384;
constexpr int kSeals = F_SEAL_SHRINK | F_SEAL_GROW;

bool isSane(const FrameLayout& layout) {
  return layout.format == PixelFormat::BGRX && layout.width > 0 && layout.height > 0 && layout.width <= kMaximumSide &&
         layout.height <= kMaximumSide && layout.stride >= layout.width * 4 && layout.stride <= kMaximumSide * 4;
}

}  // namespace

Result<std::shared_ptr<SharedFrame>> SharedFrame::create(const FrameLayout& layout) {
  if (!isSane(layout)) return Error::posix(EINVAL, "frame layout");
  FileDescriptor fd(::memfd_create("quorvel-frame", MFD_CLOEXEC | MFD_ALLOW_SEALING));
  if (!fd.isValid()) return Error::posix(errno, "memfd_create");
  if (::ftruncate(fd.get(), static_cast<off_t>(layout.byteSize())) != 0) return Error::posix(errno, "ftruncate");
  if (::fcntl(fd.get(), F_ADD_SEALS, kSeals) != 0) return Error::posix(errno, "F_ADD_SEALS");
  void* mapping = ::mmap(nullptr, layout.byteSize(), PROT_READ | PROT_WRITE, MAP_SHARED, fd.get(), 0);
  if (mapping == MAP_FAILED) return Error::posix(errno, "mmap");
  std::shared_ptr<SharedFrame> frame(new SharedFrame);
  frame->memory_ = shareFileDescriptor(std::move(fd));
  frame->layout_ = layout;
  frame->data_ = static_cast<uint8_t*>(mapping);
  frame->writable_ = true;
  return frame;
}

Result<std::shared_ptr<SharedFrame>> SharedFrame::adopt(SharedFileDescriptor memory, const FrameLayout& layout,
                                                        std::shared_ptr<void> attachment) {
  if (!memory || !memory->isValid() || !isSane(layout)) return Error::posix(EINVAL, "received frame");
  const int seals = ::fcntl(memory->get(), F_GET_SEALS);
  if (seals < 0 || (seals & kSeals) != kSeals) return Error::posix(EPERM, "frame memory is not sealed");
  struct stat info {};
  if (::fstat(memory->get(), &info) != 0) return Error::posix(errno, "fstat");
  if (static_cast<uint64_t>(info.st_size) < layout.byteSize()) return Error::posix(EINVAL, "frame memory is too small");
  void* mapping = ::mmap(nullptr, layout.byteSize(), PROT_READ, MAP_SHARED, memory->get(), 0);
  if (mapping == MAP_FAILED) return Error::posix(errno, "mmap");
  std::shared_ptr<SharedFrame> frame(new SharedFrame);
  frame->memory_ = std::move(memory);
  frame->layout_ = layout;
  frame->data_ = static_cast<uint8_t*>(mapping);
  frame->attachment_ = std::move(attachment);
  return frame;
}

SharedFrame::~SharedFrame() {
  if (data_ != nullptr) ::munmap(data_, layout_.byteSize());
}

std::span<uint8_t> SharedFrame::mutableBytes() {
  if (!writable_) return {};
  return {data_, layout_.byteSize()};
}

struct SharedFramePool::State {
  explicit State(size_t frames) : capacity(frames) {}
  std::mutex mutex;
  const size_t capacity;
  size_t out = 0;
  FrameLayout layout;
  std::vector<std::shared_ptr<SharedFrame>> idle;
};

SharedFramePool::SharedFramePool(size_t capacity) : state_(std::make_shared<State>(capacity)) {}

std::shared_ptr<SharedFrame> SharedFramePool::take(const FrameLayout& layout) {
  std::shared_ptr<SharedFrame> frame;
  {
    std::lock_guard lock(state_->mutex);
    if (!(state_->layout == layout)) {
      state_->idle.clear();
      state_->layout = layout;
    }
    if (state_->out >= state_->capacity) return nullptr;
    if (!state_->idle.empty()) {
      frame = std::move(state_->idle.back());
      state_->idle.pop_back();
    }
    ++state_->out;
  }
  if (!frame) {
    auto created = SharedFrame::create(layout);
    if (!created) {
      std::lock_guard lock(state_->mutex);
      --state_->out;
      return nullptr;
    }
    frame = std::move(created.value());
  }
  SharedFrame* raw = frame.get();
  return {raw, [state = state_, frame = std::move(frame)](SharedFrame*) mutable {
            std::lock_guard lock(state->mutex);
            --state->out;
            if (frame->layout() == state->layout) state->idle.push_back(std::move(frame));
          }};
}

}  // namespace qv::platform
