#include "platform/sdbus/WireGate.h"

#include <algorithm>
#include <iterator>
#include <utility>

#include "platform/sdbus/WireHeader.h"

namespace qv::platform::sdbus {
namespace {

/// A peer that talks on without ever ending its authentication.
constexpr size_t kMaximumAuthentication = 4096;
constexpr size_t kMaximumLine = 512;
/// Memory is taken as bytes come, not as a header announces them.
constexpr size_t kMostAtOnce = size_t{64} << 10;

}  // namespace

std::span<uint8_t> WireGate::room() {
  size_t wanted = 0;
  if (authentication_) {
    const bool awaitsZero = authentication_->beginsWithZero() && authenticationBytes_ == 0;
    wanted = awaitsZero ? 1 : authentication_->least(line_);
  } else {
    wanted = (messageBytes_ == 0 ? kWireHeaderBytes : messageBytes_) - filled_;
  }
  bytes_.resize(filled_ + std::min(wanted, kMostAtOnce));
  return std::span(bytes_).subspan(filled_);
}

void WireGate::filled(size_t size, std::vector<FileDescriptor> descriptors) {
  if (fault_) return;
  takeDescriptors(std::move(descriptors));
  if (fault_) return;
  if (authentication_) return takeLines(std::span(bytes_).subspan(filled_, size));
  filled_ += size;
  takeMessage();
}

WireUnit WireGate::takeUnit() {
  isFinished_ = false;
  bytes_.resize(filled_);
  const bool isMessage = messageBytes_ != 0;
  messageBytes_ = filled_ = 0;
  return {std::exchange(bytes_, {}), std::exchange(descriptors_, {}), isMessage};
}

void WireGate::refuse(const char* fault) {
  fault_ = fault;
  bytes_ = {};
  filled_ = messageBytes_ = 0;
  descriptors_.clear();
  isFinished_ = false;
}

void WireGate::takeDescriptors(std::vector<FileDescriptor> descriptors) {
  if (descriptors.empty()) return;
  if (!mayHaveDescriptors_) return refuse("descriptors that were not agreed on");
  if (descriptors_.size() + descriptors.size() > kMaximumWireDescriptors) return refuse("too many descriptors");
  std::move(descriptors.begin(), descriptors.end(), std::back_inserter(descriptors_));
}

void WireGate::takeLines(std::span<const uint8_t> bytes) {
  for (const uint8_t byte : bytes) {
    // `least` never lets a byte of the first message come here.
    if (!authentication_) return refuse("more than the authentication");
    takeByte(static_cast<char>(byte));
    if (fault_) return;
  }
  if (passed_.empty()) return;
  bytes_.assign(passed_.begin(), passed_.end());
  filled_ = bytes_.size();
  passed_.clear();
  isFinished_ = true;
}

void WireGate::takeByte(char byte) {
  if (++authenticationBytes_ > kMaximumAuthentication) return refuse("an authentication without end");
  if (authenticationBytes_ == 1 && authentication_->beginsWithZero()) {
    if (byte != '\0') return refuse("no authentication");
    passed_ += byte;
    return;
  }
  line_ += byte;
  if (line_.size() > kMaximumLine) return refuse("an authentication without end");
  if (line_.ends_with("\r\n")) takeLine();
}

void WireGate::takeLine() {
  const auto step = authentication_->take(std::string_view(line_).substr(0, line_.size() - 2), passed_);
  line_.clear();
  if (step == WireAuthentication::Step::Refused) return refuse("an authentication that does not hold");
  if (step != WireAuthentication::Step::Ends) return;
  mayHaveDescriptors_ = authentication_->agreedOnDescriptors();
  authentication_.reset();
}

void WireGate::takeMessage() {
  if (messageBytes_ == 0 && filled_ == kWireHeaderBytes) {
    const uint64_t size = sizeOfWireMessage(std::span(bytes_).first(filled_));
    if (size == 0) return refuse("a malformed header");
    if (size > kMaximumWireMessage) return refuse("a message of more than 2 MiB");
    messageBytes_ = size;
  }
  if (messageBytes_ == 0 || filled_ < messageBytes_) return;
  if (const char* fault = faultOfWireMessage(std::span(bytes_).first(filled_), descriptors_.size())) {
    return refuse(fault);
  }
  isFinished_ = true;
}

}  // namespace qv::platform::sdbus
