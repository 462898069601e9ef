#pragma once

#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <string>

#include "platform/base/Error.h"
#include "platform/base/FileDescriptor.h"
#include "platform/base/Result.h"
#include "platform/base/Value.h"
#include "support/MovieBook.h"
#include "support/QVTemporaryFiles.h"

namespace qv {

/// The right to one path of the temporary store while its file is being made. Nobody else gets the path meanwhile, and
/// no purge touches the file. Given up without more, the file is nobody's and ages out.
///
/// Threading: thread-safe.
class MovieClaim {
 public:
  virtual ~MovieClaim() = default;
  [[nodiscard]] virtual const std::string& path() const = 0;
  [[nodiscard]] platform::URL url() const { return platform::URL::fileURL(path()); }
  /// Whether there is a file of more than no bytes at the path, now.
  [[nodiscard]] virtual bool hasFile() const = 0;
  /// Gives the file to an application, which may save or discard it from now on. The claim ends. Nothing happens where
  /// it has ended.
  virtual void handTo(const std::string& owner) = 0;
  /// Begins to save the file before any application has it; nothing, and the claim goes on, where there is no file. The
  /// claim ends. Where the save ends without success, the movie is handed to this application.
  [[nodiscard]] virtual std::shared_ptr<class MovieSave> saveFor(const std::string& owner) = 0;
  /// Removes the file later on; the claim ends when it is gone, and also where that fails: then the file is nobody's.
  /// `completion` (may be empty) runs on the background queue; an ended claim removes nothing and gives ENOENT.
  virtual void remove(FileCompletion completion) = 0;
};

/// The right to read a handed movie while it is being saved. It ends with `succeeded`, which removes the movie, or by
/// its destructor: then the movie is its application's as before, and can be saved again.
///
/// Threading: thread-safe.
class MovieSave {
 public:
  virtual ~MovieSave() = default;
  [[nodiscard]] virtual const platform::URL& movie() const = 0;
  /// The movie is safe elsewhere: it is removed from the store. `completion` (may be empty) runs on the background
  /// queue with what kept it from that; the right is over in any case.
  virtual void succeeded(FileCompletion completion) = 0;
};

/// Who owns which movie of the temporary store. A path is being made (recorded, trimmed or mixed), or handed to an
/// application and waiting for its save or discard, or being saved, or nobody's. Memory only: after a restart all are
/// nobody's.
///
/// Threading: thread-safe. It looks at the disk in the caller's thread.
class QVTemporaryMovies : public std::enable_shared_from_this<QVTemporaryMovies> {
 public:
  using ClaimHandler = std::function<void(std::shared_ptr<MovieClaim>)>;

  static std::shared_ptr<QVTemporaryMovies> create(QVTemporaryFiles files);
  virtual ~QVTemporaryMovies() = default;

  /// Claims a path for a recording of this application. What was handed to the same application there is forgotten (its
  /// file is removed by whoever writes, as is one that is nobody's); while that is being saved or removed, the claim
  /// waits for the end of it, and what a save has left there is kept by numbering. A path that another application's
  /// movie has, or that is being made, is numbered: "Chess.mp4", "Chess 2.mp4". The handler runs once, at once where
  /// there is nothing to wait for, else in the thread that ends the save or removal. Destroyed with this, it does not
  /// run.
  virtual void claimForRecording(const std::string& path, const std::string& owner, ClaimHandler handler) = 0;
  /// The same for a file that must not replace one: a path that nobody has and where no file is, numbered where need
  /// be.
  [[nodiscard]] virtual std::shared_ptr<MovieClaim> claimNew(const std::string& path) = 0;
  /// For the trimmed copy of this application's movie: a copy that was handed to it and never saved is replaced, as is
  /// a file that is nobody's; anything else is left alone by numbering.
  [[nodiscard]] virtual std::shared_ptr<MovieClaim> claimTrimmed(const std::string& path, const std::string& owner) = 0;

  /// Whether this movie was handed to this application, waits for its save or discard, and is there.
  [[nodiscard]] virtual bool isHandedTo(const std::string& owner, const platform::URL& movie) const = 0;
  /// Opens such a movie, for reading. What is opened stays readable when the movie is saved, discarded or replaced.
  /// kFailedToSave where it is not this application's, is being saved, or is not there; the disk's error otherwise.
  [[nodiscard]] virtual platform::Result<platform::FileDescriptor> openHanded(const std::string& owner,
                                                                              const platform::URL& movie) const = 0;
  /// Begins to save a movie that was handed to this application and is there; nothing otherwise, and while another save
  /// of it is under way.
  [[nodiscard]] virtual std::shared_ptr<MovieSave> beginSave(const std::string& owner, const platform::URL& movie) = 0;
  /// Removes the movie that was handed to this application last, unless it is saved or being saved; an earlier one is
  /// left alone in any case. `completion` (may be empty) runs on the background queue with what kept it from that, also
  /// where there was nothing.
  virtual void discardLast(const std::string& owner, FileCompletion completion) = 0;

  /// What becomes of each movie that is not nobody's, by path.
  [[nodiscard]] virtual std::map<std::string, MovieStanding> standings() const = 0;
  /// Like `_srDeleteFilesOlderThanTimeToLiveInSeconds` and `_srDeleteAllTempFiles`, but for what is being made or
  /// saved. What was handed and is gone by it is forgotten; what could not be removed stays handed.
  virtual int64_t deleteFilesOlderThanTimeToLiveInSeconds(double timeToLive) = 0;
  virtual int64_t deleteAllTempFiles() = 0;
};

}  // namespace qv
