#pragma once

#include <optional>
#include <string>
#include <vector>

#include "platform/Localization.h"
#include "platform/MovieSalvage.h"
#include "support/QVTemporaryFiles.h"

namespace qv {

/// A movie of the temporary store, with regard to crashes.
///
/// Threading: a value.
struct StoredMovie {
  enum class Fate {
    Finished,    ///< by its recording
    Recovered,   ///< a crash cut it off; it was finished later
    Mended,      ///< the same, just now
    Unfinished,  ///< a crash cut it off
    InUse,       ///< somebody writes it
    Removed,     ///< just now: no picture was ever written into it
    Damaged,     ///< it cannot be read as a movie, and stays as it is
    Unreadable,  ///< the file cannot be looked at, moved or removed
  };
  std::string name;
  Fate fate = Fate::Finished;
  std::optional<double> seconds = std::nullopt;         ///< of one that was mended
  std::optional<platform::Error> error = std::nullopt;  ///< what keeps it from being finished
};

/// What a crash or a loss of power left in the temporary store.
///
/// Threading: the caller's thread. Several may work on one store, also in processes of their own, and while movies are
/// recorded: each movie is locked.
class QVUnfinishedMovies {
 public:
  QVUnfinishedMovies(QVTemporaryFiles files, platform::MovieSalvage& salvage, platform::Localization& localization)
      : files_(files), salvage_(salvage), localization_(localization) {}

  /// Finishes every movie of the temporary store that was left unfinished, and keeps it
  /// under a name of its own ("Chess_recovered_02-29-2024 19-35-12.mp4", with the time at which it broke off), so
  /// that the next recording of that application does not replace it. From then on it ages out like the
  /// others. What cannot be finished is kept under such a name too, as it is, also where nothing in it can be read.
  /// Only a file into which no media was ever written is removed. Finished movies, and those that another process is
  /// writing, are not touched. Every outcome but these is logged.
  ///
  /// The movies in the order of their names; an error where the store cannot be read.
  platform::Result<std::vector<StoredMovie>> _srSalvageUnfinishedMovies();
  /// The same, and changes nothing.
  [[nodiscard]] platform::Result<std::vector<StoredMovie>> movies();
  [[nodiscard]] StoredMovie movieNamed(const std::string& name);
  /// What of the above is to be done with this one is done.
  [[nodiscard]] StoredMovie salvaged(const StoredMovie& movie);

 private:
  [[nodiscard]] platform::Result<std::string> recoveredStem(const std::string& name);
  [[nodiscard]] platform::Result<std::string> keepAside(const std::string& name);
  [[nodiscard]] StoredMovie removeWithoutMedia(const std::string& name);
  [[nodiscard]] StoredMovie keepDamaged(const std::string& name, const platform::Error& damage);
  [[nodiscard]] StoredMovie finishMovie(const std::string& name);

  const QVTemporaryFiles files_;
  platform::MovieSalvage& salvage_;
  platform::Localization& localization_;
};

}  // namespace qv
