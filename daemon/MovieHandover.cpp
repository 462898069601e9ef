#include "daemon/MovieHandover.h"

#include <cerrno>
#include <utility>

#include "platform/threads/Log.h"
#include "support/QuorvelErrors.h"

namespace qv {

using platform::Error;
using platform::URL;
namespace logs = platform::logs;

namespace {

/// What the log says of one way to store a movie.
struct StoringLines {
  const char* success;
  const char* failure;
};
constexpr StoringLines kSave{"QVRecordingManager:saveVideoToCameraRoll: Video saved to camera roll successful",
                             "QVRecordingManager:saveVideoToCameraRoll: Video saved to camera roll failed"};
constexpr StoringLines kStopByOtherStart{
    "QVRecordingManager:stopCurrentRecordingSession: Video saved to camera roll successful",
    "QVRecordingManager:stopCurrentRecordingSession: Video saved to camera roll failed"};

void logResult(const StoringLines& lines, const std::optional<Error>& error) {
  if (error) {
    QV_LOG_ERROR(logs::kDaemon, "%s", lines.failure);
  } else {
    QV_LOG(logs::kDaemon, "%s", lines.success);
  }
}

void logRemoval(const std::optional<Error>& error) {
  if (error) QV_LOG_ERROR(logs::kDaemon, "error removing file with code: %i", static_cast<int>(error->code));
}

}  // namespace

/// One movie on its way into the photo library. Touched on the sequence only; dropped with it, the movie is its
/// application's as before.
struct MovieHandover::Storing {
  StoringLines lines;
  std::shared_ptr<MovieSave> save;
  KeptHandler handler;
  std::shared_ptr<MovieClaim> mixed;  ///< where mixing worked
};

MovieHandover::MovieHandover(platform::Platform& platform, platform::SerialQueue& sequence,
                             std::shared_ptr<QVTemporaryMovies> movies)
    : photoLibrary_(*platform.photoLibrary),
      sequence_("com.tarnwick.quorveld.handover", sequence),
      movies_(std::move(movies)),
      mixes_(platform, movies_) {}

platform::Result<platform::SharedFileDescriptor> MovieHandover::openMovie(const std::string& owner, const URL& movie) {
  if (!outgoing_.hasRoomFor(owner)) return Error::posix(EMFILE, "open movies that were not taken");
  auto file = movies_->openHanded(owner, movie);
  if (file) return outgoing_.add(owner, std::move(*file));
  QV_LOG_ERROR(logs::kDaemon, "a movie is not opened for %s: %s", owner.c_str(), file.error().description().c_str());
  return file.error();
}

void MovieHandover::saveVideoToCameraRoll(const std::string& owner, const URL& movie, Handler handler) {
  auto save = movies_->beginSave(owner, movie);
  if (!save) {
    QV_LOG_ERROR(logs::kDaemon, "a movie that was not handed to the caller is not saved");
    handler(recordingError(errorcode::kFailedToSave));
    return;
  }
  mixAndStore(std::make_shared<Storing>(
      Storing{kSave, std::move(save),
              [handler = std::move(handler)](const auto&, const auto& error) { handler(error); }, nullptr}));
}

void MovieHandover::storeSystemRecording(const std::shared_ptr<MovieClaim>& movie, const std::string& owner,
                                         KeptHandler handler) {
  if (auto save = movie ? movie->saveFor(owner) : nullptr) {
    store(std::make_shared<Storing>(Storing{kStopByOtherStart, std::move(save), std::move(handler), nullptr}));
    return;
  }
  const Error error = recordingError(errorcode::kFailedToSave);
  logResult(kStopByOtherStart, error);
  handler(std::nullopt, error);
}

void MovieHandover::saveInterrupted(const std::shared_ptr<MovieClaim>& movie, const std::string& owner,
                                    KeptHandler handler) {
  const KeptHandler logged = [handler = std::move(handler)](const auto& kept, const auto& error) {
    if (error) QV_LOG_ERROR(logs::kDaemon, "error saving file with code: %i", static_cast<int>(error->code));
    handler(kept, error);
  };
  if (auto save = movie ? movie->saveFor(owner) : nullptr) {
    mixAndStore(std::make_shared<Storing>(Storing{kSave, std::move(save), logged, nullptr}));
  } else {
    logged(std::nullopt, recordingError(errorcode::kFailedToSave));
  }
}

void MovieHandover::discard(const std::string& owner, std::function<void()> handler) {
  movies_->discardLast(owner, [weak = weak_from_this(), handler = std::move(handler)](const auto& error) {
    logRemoval(error);
    onSequence(weak, [handler](MovieHandover&) { handler(); });
  });
}

void MovieHandover::mixAndStore(const std::shared_ptr<Storing>& storing) {
  mixes_.mixAudioForMovie(storing->save->movie(),
                          [weak = weak_from_this(), storing](const auto& mixed, const auto& error) {
                            if (error) QV_LOG_ERROR(logs::kDaemon, "Error Mixing video Audio tracks");
                            QV_LOG(logs::kDaemon, "QVRecordingManager: saveVideoToCameraRoll:");
                            onSequence(weak, [storing, mixed](MovieHandover& self) {
                              storing->mixed = mixed;
                              self.store(storing);
                            });
                          });
}

void MovieHandover::store(const std::shared_ptr<Storing>& storing) {
  photoLibrary_.createAsset(
      storing->mixed ? storing->mixed->url() : storing->save->movie(), platform::PhotoResourceType::Video,
      [weak = weak_from_this(), storing](const std::optional<Error>& error) {
        logResult(storing->lines, error);
        onSequence(weak, [storing, error](MovieHandover& self) { self.libraryAnswered(storing, error); });
      });
}

/// The movie's right ends before anybody is told, so that a refused movie can be saved again at once.
void MovieHandover::libraryAnswered(const std::shared_ptr<Storing>& storing, const std::optional<Error>& error) {
  const auto kept = error ? std::optional(storing->save->movie()) : std::nullopt;
  if (!error) storing->save->succeeded(nullptr);
  storing->save = nullptr;
  if (!storing->mixed) {
    storing->handler(kept, error);
    return;
  }
  storing->mixed->remove([weak = weak_from_this(), storing, kept, error](const std::optional<Error>& removalError) {
    logRemoval(removalError);
    onSequence(weak, [storing, kept, answer = error ? error : removalError](MovieHandover&) {
      storing->handler(kept, answer);
    });
  });
}

void MovieHandover::onSequence(const std::weak_ptr<MovieHandover>& weakSelf, Work work) {
  if (const auto self = weakSelf.lock()) self->sequence_.async(weakSelf, std::move(work));
}

}  // namespace qv
