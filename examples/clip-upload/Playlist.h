#pragma once

#include <string>
#include <vector>

namespace upload {

/// An HLS media playlist that grows: an event, until it has ended.
class Playlist {
 public:
  /// `clipDuration`: how long the clips are meant to be, in seconds.
  explicit Playlist(double clipDuration) : longest_(clipDuration) {}
  void add(std::string name, double duration, bool isDiscontinuous);
  void end() { hasEnded_ = true; }
  [[nodiscard]] std::string text() const;
  [[nodiscard]] bool isEmpty() const { return entries_.empty(); }
  [[nodiscard]] double duration() const;

 private:
  struct Entry {
    std::string name;
    double duration;
    bool isDiscontinuous;
  };
  std::vector<Entry> entries_;
  double longest_;
  bool hasEnded_ = false;
};

}  // namespace upload
