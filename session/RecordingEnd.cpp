#include "session/RecordingEnd.h"

#include <utility>

#include "platform/threads/Log.h"

namespace qv::moviefate {

using platform::Error;
using platform::URL;
namespace logs = platform::logs;

MovieFate handTo(const std::string& owner) {
  return [owner](const std::shared_ptr<MovieClaim>& movie, const auto& done) {
    const URL url = movie->url();
    movie->handTo(owner);
    done(url);
  };
}

MovieFate remove() {
  return [](const std::shared_ptr<MovieClaim>& movie, std::function<void(const std::optional<URL>&)> done) {
    QV_LOG(logs::kSession, "QVRecordingSession: cleanupSessionFiles");
    movie->remove([done = std::move(done)](const std::optional<Error>& error) {
      if (error) {
        QV_LOG_ERROR(logs::kSession, "error removing file with code: %i", static_cast<int>(error->code));
      }
      done(std::nullopt);
    });
  };
}

MovieFate keep() {
  return [](const std::shared_ptr<MovieClaim>&, const auto& done) { done(std::nullopt); };
}

}  // namespace qv::moviefate
