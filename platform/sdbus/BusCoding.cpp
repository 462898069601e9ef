#include "platform/sdbus/BusCoding.h"

#include <fcntl.h>

#include <algorithm>
#include <cerrno>
#include <type_traits>

#include "platform/base/ValueTypes.h"
#include "platform/base/WireForm.h"
#include "platform/sdbus/Text.h"

namespace qv::platform::sdbus {
namespace {

constexpr size_t kCostPerValue = 64;

void addCost(const Value& value, MessageCost& cost, int depth) {
  cost.bytes += 16;
  if (depth > kMaximumFormDepth) return;
  value.visit(Overloaded{
      [&](const std::string& text) { cost.bytes += text.size(); },
      [&](const URL& url) { cost.bytes += url.absoluteString().size(); },
      [&](const Data& data) { cost.bytes += data.size(); }, [&](const SharedFileDescriptor&) { ++cost.descriptors; },
      [&](const Array& items) {
        for (const Value& item : items) addCost(item, cost, depth + 1);
      },
      [&](const Dictionary& entries) {
        for (const auto& [key, item] : entries) {
          cost.bytes += key.size();
          addCost(item, cost, depth + 1);
        }
      },
      [](const auto&) {},  // within the 16
  });
}

/// Appends parts to a message.
///
/// Threading: I/O thread.
class MessageWriter final : public FormSink {
 public:
  explicit MessageWriter(sd_bus_message* message) : message_(message) {}

  int number(char type, const Value& exact) override {
    if (const bool* flag = exact.getIf<bool>()) {
      const int wire = *flag;
      return sd_bus_message_append_basic(message_, type, &wire);
    }
    return exact.visit([&](const auto& number) { return sd_bus_message_append_basic(message_, type, &number); });
  }
  int text(std::string_view text) override {
    return sd_bus_message_append_basic(message_, 's', validText(text).c_str());
  }
  int bytes(std::span<const uint8_t> bytes) override {
    return sd_bus_message_append_array(message_, 'y', bytes.data(), bytes.size());
  }
  int descriptor(const SharedFileDescriptor& descriptor) override {
    const int fd = descriptor->get();
    return sd_bus_message_append_basic(message_, 'h', &fd);
  }
  int open(char kind, const std::string& contents) override {
    return sd_bus_message_open_container(message_, kind, contents.c_str());
  }
  int close() override { return sd_bus_message_close_container(message_); }

 private:
  sd_bus_message* const message_;
};

/// Takes a message apart, within bounds: it may be of any signature.
///
/// Threading: I/O thread.
class MessageReader {
 public:
  MessageReader(sd_bus_message* message, FormSink& sink) : message_(message), sink_(sink) {}

  /// Whether there was a value: none is at the end of a container, and after an error.
  bool read(int depth) {
    char type = 0;
    const char* peeked = nullptr;
    const int r = sd_bus_message_peek_type(message_, &type, &peeked);
    if (r == 0 || !succeeds(r)) return false;
    if (depth > kMaximumFormDepth) return succeeds(-ELOOP);
    const std::string contents(peeked ? peeked : "");
    if (type == 'e') return readContainer(type, contents, depth);
    if (!spend(kCostPerValue)) return false;
    if (type == 'a' && contents == "y") return readBytes();
    if (type == 'a' && contents[0] == '{' && contents[1] != 's') return succeeds(-EINVAL);
    if (type == 'a' || type == 'r' || type == 'v') return readContainer(type, contents, depth + 1);
    if (type == 's' || type == 'o' || type == 'g') return readText(type);
    return type == 'h' ? readDescriptor() : readNumber(type);
  }
  /// 0 or a negative errno.
  [[nodiscard]] int error() const { return error_; }

 private:
  bool succeeds(int r) {
    error_ = std::min(r, 0);
    return r >= 0;
  }

  bool spend(size_t bytes) {
    if (bytes > budget_) return succeeds(-E2BIG);
    budget_ -= bytes;
    return true;
  }

  bool readContainer(char kind, const std::string& contents, int depth) {
    if (!succeeds(sd_bus_message_enter_container(message_, kind, contents.c_str()))) return false;
    if (!succeeds(sink_.open(kind, contents))) return false;
    while (read(depth)) {
    }
    return error_ == 0 && succeeds(sd_bus_message_exit_container(message_)) && succeeds(sink_.close());
  }

  bool readBytes() {
    const void* bytes = nullptr;
    size_t size = 0;
    if (!succeeds(sd_bus_message_read_array(message_, 'y', &bytes, &size)) || !spend(size)) return false;
    return succeeds(sink_.bytes({static_cast<const uint8_t*>(bytes), size}));
  }

  bool readText(char type) {
    const char* text = nullptr;
    if (!readBasic(type, &text)) return false;
    const std::string_view view(text);
    return spend(view.size()) && succeeds(sink_.text(view));
  }

  bool readDescriptor() {
    int borrowed = -1;
    if (!readBasic('h', &borrowed)) return false;
    FileDescriptor copy(::fcntl(borrowed, F_DUPFD_CLOEXEC, 3));
    return succeeds(copy.isValid() ? sink_.descriptor(shareFileDescriptor(std::move(copy))) : -errno);
  }

  /// Values have no numbers of less than 32 bits.
  bool readNumber(char type) {
    return succeeds(visitNumberType(type, [&]<typename Number>() {
      constexpr bool isBool = std::is_same_v<Number, bool>;
      using Wide = std::conditional_t<std::is_signed_v<Number>, int32_t, uint32_t>;
      using Exact = std::conditional_t<isBool || sizeof(Number) >= sizeof(Wide), Number, Wide>;
      std::conditional_t<isBool, int, Number> wire{};
      return readBasic(type, &wire) ? sink_.number(type, Value(static_cast<Exact>(wire))) : error_;
    }));
  }

  bool readBasic(char type, void* wire) { return succeeds(sd_bus_message_read_basic(message_, type, wire)); }

  sd_bus_message* const message_;
  FormSink& sink_;
  size_t budget_ = kMaximumDecodedBytes;
  int error_ = 0;
};

}  // namespace

MessageCost costOf(const IPCArguments& values) {
  MessageCost cost;
  for (const Value& value : values) addCost(value, cost, 0);
  return cost;
}

int encodeArguments(sd_bus_message* message, const std::vector<std::string>& signatures, const IPCArguments& values) {
  MessageWriter writer(message);
  return writeForms(writer, signatures, values);
}

int decodeArguments(sd_bus_message* message, const std::vector<std::string>& signatures, IPCArguments& values) {
  ValueAssembly assembly;
  MessageReader reader(message, assembly);
  for (size_t i = 0; i < signatures.size(); ++i) {
    if (!reader.read(0)) return reader.error() != 0 ? reader.error() : -EBADMSG;
  }
  values = assembly.take();
  return 0;
}

}  // namespace qv::platform::sdbus
