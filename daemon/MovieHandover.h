#pragma once

#include <functional>
#include <memory>
#include <optional>
#include <string>

#include "daemon/OutgoingMovies.h"
#include "platform/Platform.h"
#include "platform/threads/SerialQueue.h"
#include "support/QVTemporaryMovies.h"
#include "writer/QVAudioMixUtility.h"

namespace qv {

/// What becomes of finished movies: each is kept in the photo library, or stays in the temporary store with its
/// application, or is discarded. A movie leaves the store only when the library has it; one that the library refuses
/// stays, and its application can save it again. Applications are told apart by their owners (applicationOwner).
///
/// Threading: the manager's sequence, on which all handlers are called, perhaps before the call returns. It is held by
/// shared_ptr; what is under way when it is destroyed is not answered, and its movies stay.
class MovieHandover : public std::enable_shared_from_this<MovieHandover> {
 public:
  using Handler = std::function<void(const std::optional<platform::Error>&)>;
  /// Takes the URL under which the movie was left to its application, or nothing where the library has it, or where
  /// there was none.
  using KeptHandler =
      std::function<void(const std::optional<platform::URL>& kept, const std::optional<platform::Error>&)>;

  MovieHandover(platform::Platform& platform, platform::SerialQueue& sequence,
                std::shared_ptr<QVTemporaryMovies> movies);

  /// Opens a movie that was handed to this application and not saved yet, for its answer. kFailedToSave for any other
  /// movie, and EMFILE while the application has not read the answers before.
  [[nodiscard]] platform::Result<platform::SharedFileDescriptor> openMovie(const std::string& owner,
                                                                           const platform::URL& movie);
  /// Stores a movie that was handed to this application and not saved yet: with its sound mixed, or as it is where that
  /// fails.
  void saveVideoToCameraRoll(const std::string& owner, const platform::URL& movie, Handler handler);
  /// Stores the movie, as it is, of a system recording that another start ended.
  void storeSystemRecording(const std::shared_ptr<MovieClaim>& movie, const std::string& owner, KeptHandler handler);
  /// Stores the movie, with its sound mixed, of a system recording that the device's sleep ended.
  void saveInterrupted(const std::shared_ptr<MovieClaim>& movie, const std::string& owner, KeptHandler handler);
  /// Removes the movie that was handed to this application last, if it still waits. The handler is called when it is
  /// gone.
  void discard(const std::string& owner, std::function<void()> handler);

 private:
  struct Storing;
  using Work = std::function<void(MovieHandover&)>;

  void mixAndStore(const std::shared_ptr<Storing>& storing);
  void store(const std::shared_ptr<Storing>& storing);
  void libraryAnswered(const std::shared_ptr<Storing>& storing, const std::optional<platform::Error>& error);
  /// Runs it on the sequence, unless this is gone by then. In any thread.
  static void onSequence(const std::weak_ptr<MovieHandover>& weakSelf, Work work);

  platform::PhotoLibrary& photoLibrary_;
  platform::SerialQueue sequence_;  ///< on the manager's; usable as long as anybody holds this
  const std::shared_ptr<QVTemporaryMovies> movies_;
  const QVAudioMixUtility mixes_;
  OutgoingMovies outgoing_;
};

}  // namespace qv
