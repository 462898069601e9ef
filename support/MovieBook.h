#pragma once

#include <functional>
#include <map>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

#include "support/QVTemporaryFiles.h"

namespace qv {

/// What becomes of a movie of the store now.
struct MovieStanding {
  enum class Hands { Recorded, Handed, Saved, Removed };
  Hands hands = Hands::Recorded;
  std::string owner;  ///< of its application; empty for what belongs to none
};

/// Which path of the temporary store is in whose hands. A path that is not in the book is nobody's. Paths are lexically
/// normal, and a taken one may be the number's: "Chess 2.mp4" for "Chess.mp4".
///
/// Threading: thread-safe; calls nobody back with its mutex held.
class MovieBook {
 public:
  using Continuation = std::function<void()>;

  explicit MovieBook(QVTemporaryFiles files) : files_(files) {}
  [[nodiscard]] const QVTemporaryFiles& files() const { return files_; }

  /// What is done with this application's own movie at that path, which it was handed and never saved.
  enum class OwnMovie { Replace, Keep };
  /// The path, which is being made from now on. Nothing where this application's movie at that path is being saved, or
  /// is on its way to being removed: `whenSettled` is called when that is over.
  std::optional<std::string> takeForRecording(const std::string& path, const std::string& owner, OwnMovie own,
                                              Continuation whenSettled);
  /// The same for a copy, which replaces only what was handed to this application, and waits for nothing.
  std::string takeForCopy(const std::string& path, const std::string& owner);
  /// The same for a path at which no file is.
  std::string takeUnused(const std::string& path);

  void hand(const std::string& path, const std::string& owner);
  [[nodiscard]] bool isHanded(const std::string& path, const std::string& owner) const;
  /// What becomes of each path now.
  [[nodiscard]] std::map<std::string, MovieStanding> standings() const;
  /// Opens the file; nothing unless it was handed to this application. The path does not change hands meanwhile, so
  /// this is the file that was handed.
  [[nodiscard]] std::optional<platform::Result<platform::FileDescriptor>> openHanded(const std::string& path,
                                                                                     const std::string& owner) const;
  /// False unless the movie was handed to this application.
  [[nodiscard]] bool beginSave(const std::string& path, const std::string& owner);
  /// From whoever made the movie: it is being saved, and is handed to this application where that fails.
  void beginStoring(const std::string& path, const std::string& owner);
  struct Discard {
    /// Of what was handed to this application last, which is being removed from now on; nothing unless it waits there.
    std::optional<std::string> path;
    /// It is being saved: `whenSettled` is called when that is over.
    bool waits = false;
  };
  Discard beginDiscard(const std::string& owner, Continuation whenSettled);
  /// From whoever makes or saves the movie.
  void beginRemoval(const std::string& path);
  /// From whoever else wants it away; false while somebody makes, saves or removes it.
  [[nodiscard]] bool beginPurge(const std::string& path);
  /// Ends the making, save or removal: the path is nobody's, and whoever waits for it goes on.
  void release(const std::string& path);
  /// Ends the save or purge of a movie that stays: it is handed to its application, as before or from now on.
  void giveBack(const std::string& path);
  /// Whoever still waits does not go on.
  void dropWaiting();

 private:
  /// Stored: saved, before any application was handed it.
  enum class Hands { Made, Handed, Saved, Stored, Removed };
  struct Movie {
    Hands hands = Hands::Made;
    std::string owner;  ///< of its application; empty for what belongs to none
    std::vector<Continuation> waiting;
  };
  [[nodiscard]] const Movie* find(const std::string& path) const;
  /// Takes the first path, of this one and those numbered after it, that `mayTake`.
  std::string take(const std::string& path, const std::string& owner,
                   const std::function<bool(const std::string&, const Movie*)>& mayTake);
  static bool isHandedTo(const Movie* movie, const std::string& owner);

  const QVTemporaryFiles files_;
  mutable std::mutex mutex_;
  // Guarded by mutex_:
  std::map<std::string, Movie> movies_;
  std::map<std::string, std::string> lastHanded_;  ///< paths by application; what is no longer handed does not count
};

}  // namespace qv
