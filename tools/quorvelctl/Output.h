#pragma once

#include <nlohmann/json.hpp>
#include <string>

namespace ctl {

/// Standard output: lines, and one line that is drawn anew in its place where somebody looks on. What cannot be written
/// is a Failure, never lost in silence.
///
/// Threading: one thread.
class Output {
 public:
  Output();
  [[nodiscard]] bool isTerminal() const { return isTerminal_; }
  void line(const std::string& text);
  void json(const nlohmann::json& content) {
    line(content.dump(-1, ' ', false, nlohmann::json::error_handler_t::replace));
  }
  /// Draws over the former one; only on a terminal, cut to its width.
  void redraw(const std::string& text);
  /// The line that was drawn stays; what follows begins on the next.
  void keep();
  /// Columns of the terminal, as wide as it is now; 80 where it does not tell.
  [[nodiscard]] static size_t columns();

 private:
  void write(const std::string& bytes);

  const bool isTerminal_;
  bool hasDrawn_ = false;
};

/// Makes 0, 1 and 2 open, so that no socket gets their numbers: what was closed stays unreadable and unwritable.
void holdStandardDescriptors();

}  // namespace ctl
