#pragma once

#include <functional>
#include <memory>
#include <utility>

namespace qv {

/// What became of a payload. GivenUp: it was dropped, or the link was not there, failed or was ended.
enum class PayloadOutcome { Answered, GivenUp };

/// The answer that the sender of a payload waits for. It is given once: at the latest when this is destroyed.
///
/// Threading: one thread at a time. The handler runs within `give` or the destructor.
class PayloadAnswer {
 public:
  using Handler = std::function<void(PayloadOutcome)>;

  explicit PayloadAnswer(Handler handler) : handler_(std::move(handler)) {}
  ~PayloadAnswer() { give(PayloadOutcome::GivenUp); }
  PayloadAnswer(const PayloadAnswer&) = delete;
  PayloadAnswer& operator=(const PayloadAnswer&) = delete;

  void give(PayloadOutcome outcome) {
    if (const auto handler = std::exchange(handler_, nullptr)) handler(outcome);
  }

 private:
  Handler handler_;
};
using PayloadAnswerRef = std::shared_ptr<PayloadAnswer>;

}  // namespace qv
