#include "platform/mp4/AnnexB.h"

#include "platform/mp4/ByteWriter.h"

namespace qv::platform::mp4 {
namespace {

constexpr uint8_t kSequenceParameterSet = 7;
constexpr uint8_t kPictureParameterSet = 8;
constexpr uint8_t kAccessUnitDelimiter = 9;
constexpr uint8_t kHighProfile = 100;

/// Of a unit that splitByteStream found, so not empty.
uint8_t unitType(std::span<const uint8_t> unit) { return unit[0] & 0x1F; }

/// Where the next start code (00 00 01) begins, or the end.
size_t findStartCode(std::span<const uint8_t> stream, size_t from) {
  for (size_t i = from; i + 2 < stream.size(); ++i) {
    if (stream[i] == 0 && stream[i + 1] == 0 && stream[i + 2] == 1) return i;
  }
  return stream.size();
}

}  // namespace

std::vector<std::span<const uint8_t>> splitByteStream(std::span<const uint8_t> stream) {
  std::vector<std::span<const uint8_t>> units;
  size_t start = findStartCode(stream, 0);
  while (start < stream.size()) {
    const size_t begin = start + 3;
    start = findStartCode(stream, begin);
    size_t end = start;
    while (end > begin && stream[end - 1] == 0) --end;  // the long start code, or padding
    if (end > begin) units.push_back(stream.subspan(begin, end - begin));
  }
  return units;
}

std::vector<uint8_t> lengthPrefixed(std::span<const uint8_t> stream) {
  ByteWriter out;
  out.reserve(stream.size() + 16);
  for (const auto unit : splitByteStream(stream)) {
    const uint8_t type = unitType(unit);
    if (type == kSequenceParameterSet || type == kPictureParameterSet || type == kAccessUnitDelimiter) continue;
    out.u32(unit.size());
    out.append(unit);
  }
  return out.take();
}

std::vector<uint8_t> makeAVCConfiguration(std::span<const uint8_t> stream) {
  std::span<const uint8_t> sps;
  std::span<const uint8_t> pps;
  for (const auto unit : splitByteStream(stream)) {
    if (unitType(unit) == kSequenceParameterSet && sps.empty()) sps = unit;
    if (unitType(unit) == kPictureParameterSet && pps.empty()) pps = unit;
  }
  if (sps.size() < 4 || pps.empty()) return {};
  ByteWriter out;
  out.u8(1);
  out.append(sps.subspan(1, 3));  // profile, compatibility, level
  out.u8(0xFC | 3);               // lengths of four bytes
  out.u8(0xE0 | 1);
  out.u16(sps.size());
  out.append(sps);
  out.u8(1);
  out.u16(pps.size());
  out.append(pps);
  if (sps[1] >= kHighProfile) {
    out.u8(0xFC | 1);  // 4:2:0
    out.u8(0xF8);      // 8 bits
    out.u8(0xF8);
    out.u8(0);
  }
  return out.take();
}

}  // namespace qv::platform::mp4
