// Configuration archives, which an application hands over and an extension reads.
#include "fuzz/Target.h"
#include "platform/base/KeyedArchive.h"

namespace {

using namespace qv::platform;

constexpr std::string_view kClass = "Configuration";

std::string archived(const Dictionary& fields) {
  const Data bytes = encodeKeyedArchive(kClass, fields);
  return {bytes.begin(), bytes.end()};
}

}  // namespace

std::vector<std::string> qv::fuzz::seeds() {
  const Dictionary inner{{"date", Value(Date{1e9})}, {"url", Value(URL("file:///a"))}, {"none", Value()}};
  return {archived({}),
          archived({{"flag", Value(true)},
                    {"signed", Value(int32_t{-1})},
                    {"unsigned", Value(uint32_t{7})},
                    {"wide", Value(int64_t{-1})},
                    {"wideUnsigned", Value(uint64_t{9})},
                    {"real", Value(0.5)}}),
          archived({{"text", Value("text")}, {"bytes", Value(Data(20, 3))}, {"inner", Value(inner)}}),
          archived({{"list", Value(Array{Value(Array{Value(Array{})}), Value(inner), Value("x")})}})};
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  auto fields = decodeKeyedArchive({data, size}, kClass);
  if (!fields) return 0;
  // Compared as bytes: a number may be none.
  const Data archive = encodeKeyedArchive(kClass, *fields);
  auto again = decodeKeyedArchive(archive, kClass);
  qv::fuzz::require(again.hasValue(), "what was decoded can be archived and read again");
  qv::fuzz::require(encodeKeyedArchive(kClass, *again) == archive, "an archive keeps what it holds");
  return 0;
}
