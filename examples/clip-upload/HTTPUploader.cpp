#include "HTTPUploader.h"

#include <curl/curl.h>

#include <algorithm>
#include <cstring>
#include <thread>

namespace upload {

namespace {

using namespace std::chrono_literals;

constexpr int kAttempts = 5;
constexpr auto kFirstPause = 250ms;
constexpr long kConnectTimeout = 5;   // seconds
constexpr long kStallTimeout = 10;    // seconds at less than a byte a second
constexpr long kAnswerTimeout = 120;  // seconds for the whole of it

struct HeadersDeleter {
  void operator()(curl_slist* list) const { curl_slist_free_all(list); }
};

size_t readContent(char* buffer, size_t size, size_t count, void* content) {
  auto& rest = *static_cast<std::span<const uint8_t>*>(content);
  const size_t length = std::min(size * count, rest.size());
  std::memcpy(buffer, rest.data(), length);
  rest = rest.subspan(length);
  return length;
}

size_t ignoreAnswer(char*, size_t size, size_t count, void*) { return size * count; }

}  // namespace

HTTPUploader::HTTPUploader(std::string authorization)
    : authorization_(std::move(authorization)), curl_(curl_easy_init()) {}

HTTPUploader::~HTTPUploader() { curl_easy_cleanup(curl_); }

std::optional<std::string> HTTPUploader::put(const std::string& url, std::span<const uint8_t> content,
                                             const char* contentType) {
  if (curl_ == nullptr) return "no HTTP";
  auto pause = kFirstPause;
  for (int left = kAttempts - 1;; --left, pause *= 2) {
    Attempt attempt = tryToPut(url, content, contentType);
    if (attempt.error.empty()) return std::nullopt;
    if (attempt.isFinal || left == 0) return std::move(attempt.error);
    std::this_thread::sleep_for(pause);
  }
}

HTTPUploader::Attempt HTTPUploader::tryToPut(const std::string& url, std::span<const uint8_t> content,
                                             const char* contentType) {
  // "Expect" would cost a round trip for each file.
  std::unique_ptr<curl_slist, HeadersDeleter> headers(curl_slist_append(nullptr, "Expect:"));
  const auto add = [&](const std::string& line) { headers.reset(curl_slist_append(headers.release(), line.c_str())); };
  add(std::string("Content-Type: ") + contentType);
  if (!authorization_.empty()) add("Authorization: " + authorization_);
  std::span<const uint8_t> rest = content;
  curl_easy_reset(curl_);
  curl_easy_setopt(curl_, CURLOPT_URL, url.c_str());
  curl_easy_setopt(curl_, CURLOPT_PROTOCOLS_STR, "http,https");
  curl_easy_setopt(curl_, CURLOPT_NOSIGNAL, 1L);
  curl_easy_setopt(curl_, CURLOPT_UPLOAD, 1L);
  curl_easy_setopt(curl_, CURLOPT_INFILESIZE_LARGE, static_cast<curl_off_t>(content.size()));
  curl_easy_setopt(curl_, CURLOPT_READFUNCTION, &readContent);
  curl_easy_setopt(curl_, CURLOPT_READDATA, &rest);
  curl_easy_setopt(curl_, CURLOPT_WRITEFUNCTION, &ignoreAnswer);
  curl_easy_setopt(curl_, CURLOPT_HTTPHEADER, headers.get());
  curl_easy_setopt(curl_, CURLOPT_CONNECTTIMEOUT, kConnectTimeout);
  curl_easy_setopt(curl_, CURLOPT_LOW_SPEED_LIMIT, 1L);
  curl_easy_setopt(curl_, CURLOPT_LOW_SPEED_TIME, kStallTimeout);
  curl_easy_setopt(curl_, CURLOPT_TIMEOUT, kAnswerTimeout);
  const CURLcode result = curl_easy_perform(curl_);
  if (result != CURLE_OK) {
    const bool isFinal = result == CURLE_URL_MALFORMAT || result == CURLE_UNSUPPORTED_PROTOCOL ||
                         result == CURLE_PEER_FAILED_VERIFICATION;
    return {curl_easy_strerror(result), isFinal};
  }
  long status = 0;
  curl_easy_getinfo(curl_, CURLINFO_RESPONSE_CODE, &status);
  if (status >= 200 && status < 300) return {};
  return {"HTTP status " + std::to_string(status), status < 500 && status != 408 && status != 429};
}

}  // namespace upload
