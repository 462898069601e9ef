#include "session/RecordingEnd.h"

#include <utility>

#include "platform/threads/Log.h"

namespace qv::moviefate {

using platform::Error;
using platform::URL;
namespace logs = platform::logs;

MovieFate handTo(const std::string& owner) {
  return [owner](const OutputResult& made, const auto& done) {
    const URL url = made.movie->url();
    made.movie->handTo(owner);
    done(url);
  };
}

MovieFate remove() {
  return [](const OutputResult& made, std::function<void(const std::optional<URL>&)> done) {
    QV_LOG(logs::kSession, "QVRecordingSession: cleanupSessionFiles");
    made.movie->remove([done = std::move(done)](const std::optional<Error>& error) {
      if (error) {
        QV_LOG_ERROR(logs::kSession, "error removing file with code: %i", static_cast<int>(error->code));
      }
      done(std::nullopt);
    });
  };
}

MovieFate keep() {
  return [](const OutputResult&, const auto& done) { done(std::nullopt); };
}

}  // namespace qv::moviefate
