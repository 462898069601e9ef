#include "ClipUpload.h"

#include <algorithm>
#include <cctype>
#include <cstdio>
#include <cstdlib>
#include <ctime>

#include "../common/UserInfo.h"

namespace upload {

namespace {

constexpr double kDaemonsClipDuration = 5;  // seconds
constexpr const char kPlaylistType[] = "application/vnd.apple.mpegurl", kSegmentType[] = "video/mp2t";

/// The clip's number in its broadcast, from the end of its name; 0 where there is none.
int indexOf(const std::string& name) {
  const size_t at = name.rfind('_');
  return at == std::string::npos ? 0 : std::atoi(name.c_str() + at + 1);
}

std::string safeName(std::string name) {
  const auto isUnsafe = [](unsigned char c) { return !std::isalnum(c) && c != '-' && c != '_'; };
  std::replace_if(name.begin(), name.end(), isUnsafe, '-');
  return name;
}

/// Without a name from the application, one that no former broadcast has.
std::string nameOrDate(const std::string& name) {
  if (!name.empty()) return safeName(name);
  char text[32];
  const std::time_t now = std::time(nullptr);
  std::tm date{};
  std::strftime(text, sizeof text, "broadcast-%Y%m%dT%H%M%SZ", ::gmtime_r(&now, &date));
  return text;
}

std::string directoryOf(std::string url) {
  if (!url.empty() && url.back() != '/') url += '/';
  return url;
}

std::span<const uint8_t> bytesOf(const std::string& text) {
  return {reinterpret_cast<const uint8_t*>(text.data()), text.size()};
}

}  // namespace

ClipUpload::Show::Show(const quorvel::Dictionary& userInfo)
    : directory(directoryOf(textIn(userInfo, "url"))),
      name(nameOrDate(textIn(userInfo, "name"))),
      clipDuration(numberIn(userInfo, "clipDuration", 0, 0.5, 60)),
      uploader(textIn(userInfo, "authorization")),
      playlist(std::max(clipDuration, kDaemonsClipDuration)) {}

ClipUpload::~ClipUpload() { end(); }

void ClipUpload::processClip(quorvel::Clip clip, quorvel::ClipCompletion done) {
  const int index = indexOf(clip.name);
  const bool isFirst = !show_;
  if (isFirst) show_ = std::make_unique<Show>(clip.userInfo);
  show_->lastIndex = index != 0 ? index : show_->lastIndex + 1;
  putClip(clip);
  if (clip.isLast) show_->playlist.end();
  putPlaylist();
  quorvel::ClipResult result;
  result.serviceInfo = serviceInfo(clip.isLast);
  if (isFirst && show_->clipDuration > 0) result.configuration = quorvel::BroadcastConfiguration{show_->clipDuration};
  if (clip.isLast) show_.reset();
  done(std::move(result));
}

void ClipUpload::putClip(const quorvel::Clip& clip) {
  std::string error;
  const auto segment = show_->stream.append(clip.file, error);
  std::optional<std::string> refused = error;
  char number[16];
  std::snprintf(number, sizeof number, "-%05d.ts", show_->lastIndex);
  const std::string file = show_->name + number;
  if (show_->directory.empty()) {
    refused = "the user information has no \"url\"";
  } else if (segment) {
    refused = show_->uploader.put(show_->directory + file, segment->bytes, kSegmentType);
  }
  if (refused) {
    show_->stream.skip();
    ++show_->failed;
    return fail(clip.name + ": " + *refused);
  }
  ++show_->sent;
  show_->error.clear();
  show_->playlist.add(file, segment->duration, segment->isDiscontinuous);
}

void ClipUpload::putPlaylist() {
  if (show_->playlist.isEmpty()) return;
  const std::string file = show_->name + ".m3u8";
  if (const auto refused = show_->uploader.put(show_->directory + file, bytesOf(show_->playlist.text()), kPlaylistType))
    fail(file + ": " + *refused);
}

void ClipUpload::fail(const std::string& error) {
  show_->error = error;
  std::fprintf(stderr, "clip-upload: %s\n", error.c_str());
}

void ClipUpload::end() {
  if (!show_) return;
  show_->playlist.end();
  putPlaylist();
  show_.reset();
}

quorvel::Dictionary ClipUpload::serviceInfo(bool isLast) const {
  const char* state = !show_->error.empty() ? "failing" : isLast ? "finished" : "live";
  return {{"state", {std::string(state)}},           {"playlistURL", {show_->directory + show_->name + ".m3u8"}},
          {"sentClips", {int64_t{show_->sent}}},     {"failedClips", {int64_t{show_->failed}}},
          {"seconds", {show_->playlist.duration()}}, {"error", {show_->error}}};
}

}  // namespace upload
