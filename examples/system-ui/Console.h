#pragma once

#include <functional>
#include <string>

namespace screen {

/// Lines that somebody types, or that a script writes, on standard input.
///
/// Threading: one thread; `read` when standard input has something.
class Console {
 public:
  struct Events {
    std::function<void(const std::string&)> line;  ///< without its end
    std::function<void()> ended;                   ///< no more lines will come
  };
  explicit Console(Events events) : events_(std::move(events)) {}
  void read();

 private:
  const Events events_;
  std::string pending_;
};

}  // namespace screen
