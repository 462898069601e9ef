#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <vector>

#include "platform/base/Error.h"
#include "platform/mp4/MovieFile.h"
#include "platform/mp4/MovieTrack.h"
#include "platform/mp4/TrackIndex.h"

namespace qv::platform::mp4 {

/// The domain of errors about a movie's content, and its codes.
inline constexpr const char kMovieErrorDomain[] = "movie";
enum MovieErrorCode : int64_t {
  kMovieNotReadable = 1,
  kMovieWithoutMedia = 2,
  kMovieEncoderFailed = 3,
  kMovieCancelled = 4
};
Error movieError(MovieErrorCode code, const std::string& text);

/// Where a finished movie ends.
struct MovieEnd {
  /// Pictures that are decoded after this time are left out.
  std::optional<int64_t> lastPicture;
  /// The movie's length in kMovieTimescale. Without it, until the end of the last picture.
  std::optional<uint64_t> duration;
  /// Added to the length where there is a picture of just the time `lastPicture`, which would not be seen otherwise.
  uint64_t lastPictureShown = 0;
};

/// Writes one movie file, so that whatever was written before a crash can be played.
///
/// While it is recorded the file is `ftyp | free | moov+mvex | (moof mdat)*`. To finish it the whole
/// index is appended and synced, and only then the `free` becomes the head of a 64-bit `mdat` over
/// everything before the index: an ordinary movie, without a second copy. A crash between the two
/// leaves a file of fragments with a box at the end that players skip or ignore.
///
/// The plain layout, for a file that nobody needs after a crash, has no header before the media
/// and no fragments.
///
/// After the first error nothing more is added; the file has been cut back to its last whole fragment.
///
/// Threading: confined to one thread at a time.
class MovieWriter {
 public:
  enum class Layout { Fragmented, Plain };
  /// `tracks`: at least one; video first.
  MovieWriter(std::unique_ptr<MovieFile> file, std::vector<MovieTrack> tracks, Layout layout);

  std::optional<Error> writeHeader();
  /// One fragment: `samples[i]` belong to the track at i, in decode order.
  std::optional<Error> writeFragment(const std::vector<std::vector<EncodedSample>>& samples);
  /// Corrects where the track at `index` begins, before the finish of a plain file.
  void setTrackStart(size_t index, int64_t mediaStart, uint64_t startDelay);
  /// Also after an error, to make the most of what is there.
  std::optional<Error> finish(const MovieEnd& end);
  /// Lets go of the file, which cannot be written any more; an error where it is not sure to hold all of that.
  std::optional<Error> close();

  /// Takes over a file that was read back: `size` is the end of its last whole fragment.
  void adopt(uint64_t placeholderOffset, uint64_t size, std::vector<TrackIndex> index);
  [[nodiscard]] uint64_t size() const { return size_; }
  /// The movie's length with this end, in kMovieTimescale.
  [[nodiscard]] uint64_t movieDuration(const MovieEnd& end) const;

 private:
  std::optional<Error> appendBytes(std::span<const uint8_t> bytes);
  std::vector<uint8_t> buildHeader(const MovieEnd& end);
  [[nodiscard]] bool endsWithPictureAt(std::optional<int64_t> time) const;
  std::optional<Error> syncFile();

  std::unique_ptr<MovieFile> file_;
  std::vector<MovieTrack> tracks_;
  const Layout layout_;
  std::vector<TrackIndex> index_;
  uint64_t size_ = 0;
  uint64_t placeholderOffset_ = 0;
  uint32_t sequenceNumber_ = 0;
};

}  // namespace qv::platform::mp4
