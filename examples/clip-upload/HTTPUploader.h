#pragma once

#include <chrono>
#include <cstdint>
#include <memory>
#include <optional>
#include <span>
#include <string>

namespace upload {

/// Puts files on an HTTP server, over one connection that is kept.
///
/// What may be over soon (no connection, a time-out, 408, 429, 5xx) is tried five times, with growing pauses from 0.25
/// s on; another refusal is final at once.
///
/// Threading: one thread.
class HTTPUploader {
 public:
  /// `authorization`: the value of that header; empty for none.
  explicit HTTPUploader(std::string authorization);
  ~HTTPUploader();
  HTTPUploader(const HTTPUploader&) = delete;
  HTTPUploader& operator=(const HTTPUploader&) = delete;
  /// Why it could not be put there; nothing when it was.
  [[nodiscard]] std::optional<std::string> put(const std::string& url, std::span<const uint8_t> content,
                                               const char* contentType);

 private:
  struct Attempt {
    std::string error;  // empty: done
    bool isFinal = false;
  };
  [[nodiscard]] Attempt tryToPut(const std::string& url, std::span<const uint8_t> content, const char* contentType);

  const std::string authorization_;
  void* const curl_;
};

}  // namespace upload
