#include "platform/mp4/MovieTrack.h"

#include <algorithm>
#include <cmath>

#include "platform/mp4/ByteWriter.h"

namespace qv::platform::mp4 {
namespace {

int32_t fixed16(double value) {
  return static_cast<int32_t>(std::lround(std::clamp(value * 65536.0, -2147483648.0, 2147483647.0)));
}

/// An MPEG-4 descriptor: tag, one length byte (all of ours are short), content.
void descriptor(ByteWriter& out, uint8_t tag, const ByteWriter& content) {
  out.u8(tag);
  out.u8(content.size());
  out.append(content.bytes());
}

void writeColor(ByteWriter& out, const ColorDescription& color) {
  BoxScope box(out, "colr");
  out.code("nclx");
  out.u16(color.primaries);
  out.u16(color.transfer);
  out.u16(color.matrix);
  out.u8(color.fullRange ? 0x80 : 0);
}

void writeESDS(ByteWriter& out, uint32_t bitRate, std::span<const uint8_t> config) {
  ByteWriter specific;
  specific.append(config);
  ByteWriter decoder;
  decoder.u8(0x40);       // MPEG-4 audio
  decoder.u8(0x15);       // an audio stream
  decoder.u24(0x001800);  // decoding buffer: 6144 bits per channel, in bytes, rounded up
  decoder.u32(bitRate);
  decoder.u32(bitRate);
  descriptor(decoder, 5, specific);
  ByteWriter layer;
  layer.u8(2);
  ByteWriter stream;
  stream.u16(0);
  stream.u8(0);
  descriptor(stream, 4, decoder);
  descriptor(stream, 6, layer);
  BoxScope box(out, "esds", 0, 0);
  descriptor(out, 3, stream);
}

}  // namespace

DisplayMatrix displayMatrix(const AffineTransform& t, uint32_t width, uint32_t height) {
  const double left = std::min(0.0, t.a * width) + std::min(0.0, t.c * height);
  const double top = std::min(0.0, t.b * width) + std::min(0.0, t.d * height);
  return {fixed16(t.a), fixed16(t.b), 0, fixed16(t.c), fixed16(t.d), 0, fixed16(-left), fixed16(-top), 0x40000000};
}

std::vector<uint8_t> makeAVCSampleEntry(uint32_t width, uint32_t height, std::span<const uint8_t> avcC,
                                        const ColorDescription& color) {
  ByteWriter out;
  {
    BoxScope entry(out, "avc1");
    out.zeros(6);
    out.u16(1);  // data reference
    out.zeros(16);
    out.u16(width);
    out.u16(height);
    out.u32(0x00480000);  // 72 dpi
    out.u32(0x00480000);
    out.u32(0);
    out.u16(1);  // frames per sample
    out.zeros(32);
    out.u16(24);
    out.u16(0xFFFF);
    {
      BoxScope box(out, "avcC");
      out.append(avcC);
    }
    writeColor(out, color);
    {
      BoxScope box(out, "pasp");
      out.u32(1);
      out.u32(1);
    }
  }
  return out.take();
}

std::vector<uint8_t> makeAACSampleEntry(uint32_t sampleRate, uint32_t channels, uint32_t bitRate,
                                        std::span<const uint8_t> config) {
  ByteWriter out;
  {
    BoxScope entry(out, "mp4a");
    out.zeros(6);
    out.u16(1);  // data reference
    out.zeros(8);
    out.u16(channels);
    out.u16(16);
    out.u32(0);
    out.u32(uint64_t{sampleRate} << 16);
    writeESDS(out, bitRate, config);
  }
  return out.take();
}

}  // namespace qv::platform::mp4
