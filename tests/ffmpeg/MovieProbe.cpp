#include "tests/ffmpeg/MovieProbe.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <nlohmann/json.hpp>
#include <sstream>

#include "tests/ffmpeg/SyntheticMedia.h"

namespace qv::platform::test {

std::string run(const std::string& command) {
  FILE* pipe = ::popen(command.c_str(), "r");
  std::string output;
  char buffer[65536];
  while (const size_t got = std::fread(buffer, 1, sizeof buffer, pipe)) output.append(buffer, got);
  ::pclose(pipe);
  return output;
}

namespace {

double seconds(const nlohmann::json& object, const char* key) { return std::atof(object.value(key, "0").c_str()); }

/// Whether mediainfo, which has a reader of its own, finds the same tracks of the same lengths.
std::string disagreement(const std::string& path, const ProbedMovie& movie) {
  constexpr double kRounding = 0.0011;  // it tells milliseconds
  constexpr double kPacket = 0.024;
  const auto json = nlohmann::json::parse(run("mediainfo --Output=JSON '" + path + "' 2>&1"), nullptr, false);
  if (!json.is_object() || !json["media"].is_object()) return "mediainfo cannot read it";
  size_t tracks = 0;
  for (const auto& track : json["media"]["track"]) {
    const std::string type = track.value("@type", "");
    ProbedTrack expected;
    expected.duration = movie.duration;
    if (type != "General" && tracks < movie.tracks.size()) expected = movie.tracks[tracks++];
    const double found = seconds(track, "Duration");
    // Of a track that begins late it may tell the end, to the packet of sound.
    const double delay = expected.startTime;
    const bool isEnd = delay > kPacket && std::abs(found - delay - expected.duration) <= kPacket;
    if (!isEnd && std::abs(found - expected.duration) > kRounding) {
      return type + " lasts " + std::to_string(found) + " s for mediainfo, " + std::to_string(expected.duration) +
             " for ffprobe";
    }
  }
  return tracks == movie.tracks.size() ? "" : "mediainfo finds " + std::to_string(tracks) + " tracks";
}

}  // namespace

ProbedMovie probe(const std::string& path) {
  ProbedMovie movie;
  movie.errors = run("ffmpeg -v error -nostdin -i '" + path + "' -map 0 -f null - 2>&1");
  const std::string report = run("ffprobe -v error -of json -show_format -show_streams '" + path + "' 2>&1");
  const auto json = nlohmann::json::parse(report, nullptr, false);
  if (!json.is_object()) movie.errors += report;  // what it complains of is no part of its JSON
  if (!json.is_object() || !json.contains("streams")) return movie;
  movie.duration = seconds(json["format"], "duration");
  for (const auto& stream : json["streams"]) {
    ProbedTrack track;
    track.type = stream.value("codec_type", "");
    track.codec = stream.value("codec_name", "");
    track.profile = stream.value("profile", "");
    track.duration = seconds(stream, "duration");
    track.startTime = seconds(stream, "start_time");
    track.width = stream.value("width", 0);
    track.height = stream.value("height", 0);
    for (const auto& side : stream.value("side_data_list", nlohmann::json::array())) {
      track.rotation = side.value("rotation", 0.0);
    }
    movie.tracks.push_back(track);
  }
  movie.errors += disagreement(path, movie);
  return movie;
}

ProbedMovie probeGood(const std::string& path) {
  auto movie = probe(path);
  EXPECT_EQ(movie.errors, "") << path;
  return movie;
}

std::vector<DecodedPicture> decodePictures(const std::string& path, Turning turning) {
  std::vector<DecodedPicture> pictures;
  std::istringstream lines(
      run("ffprobe -v error -select_streams v:0 -show_entries frame=pts_time,key_frame -of csv=p=0 '" + path +
          "' 2>/dev/null"));
  for (std::string line; std::getline(lines, line);) {
    int key = 0;
    double time = 0;
    if (std::sscanf(line.c_str(), "%d,%lf", &key, &time) == 2) pictures.push_back({time, 0, key == 1});
  }
  // Decoded pixels of the same pictures, scaled to one height so that the size need not be known.
  constexpr uint32_t kWidth = 320;
  constexpr uint32_t kHeight = 16;
  const std::string pixels = run("ffmpeg -v error -nostdin " +
                                 std::string(turning == Turning::AsCoded ? "-noautorotate" : "") + " -i '" + path +
                                 "' -map 0:v:0 -fps_mode passthrough -vf scale=320:16:flags=area -f rawvideo -pix_fmt "
                                 "gray - 2>/dev/null");
  const size_t count = pixels.size() / (kWidth * kHeight);
  if (count != pictures.size()) return {};
  for (size_t i = 0; i < count; ++i) {
    const auto* luma = reinterpret_cast<const uint8_t*>(pixels.data()) + i * kWidth * kHeight;
    pictures[i].number = numberInPicture(luma, kWidth, kHeight, kWidth);
  }
  return pictures;
}

std::vector<PicturePacket> packetsOfPictures(const std::string& path) {
  std::vector<PicturePacket> packets;
  std::istringstream lines(run(
      "ffprobe -v error -select_streams v:0 -show_entries packet=pts_time,size,pos,flags -of csv=p=0 '" + path + "'"));
  for (std::string line; std::getline(lines, line);) {
    PicturePacket packet{};
    char flag = 0;
    if (std::sscanf(line.c_str(), "%lf,%zu,%zu,%c", &packet.time, &packet.size, &packet.offset, &flag) != 4) continue;
    packet.isKey = flag == 'K';
    packets.push_back(packet);
  }
  return packets;
}

std::vector<float> decodeSound(const std::string& path, int track, int rate) {
  const std::string raw = run("ffmpeg -v error -nostdin -i '" + path + "' -map 0:a:" + std::to_string(track) +
                              " -af 'pan=mono|c0=c0' -f f32le -ar " + std::to_string(rate) + " - 2>/dev/null");
  std::vector<float> sound(raw.size() / sizeof(float));
  std::memcpy(sound.data(), raw.data(), sound.size() * sizeof(float));
  return sound;
}

/// A beep begins where its first wave is: a cosine, so at full level; the encoder smears some
/// pre-echo before it, which stays below half.
std::vector<double> beeps(const std::vector<float>& sound, int rate) {
  std::vector<double> found;
  size_t quietUntil = 0;
  for (size_t i = 0; i < sound.size(); ++i) {
    if (i < quietUntil || std::abs(sound[i]) < 0.2f) continue;
    found.push_back(static_cast<double>(i) / rate);
    quietUntil = i + static_cast<size_t>(rate) / 10;
  }
  return found;
}

void expectPictures(const std::string& path, uint32_t first, uint32_t count, double rate, Turning turning) {
  const auto pictures = decodePictures(path, turning);
  EXPECT_EQ(pictures.size(), count);
  for (uint32_t i = 0; i < pictures.size(); ++i) {
    EXPECT_EQ(pictures[i].number, first + i);
    EXPECT_NEAR(pictures[i].time, i / rate, 1e-5);
  }
}

void expectBeeps(const std::string& path, int track, const std::vector<double>& times) {
  const auto heard = beeps(decodeSound(path, track));
  ASSERT_EQ(heard.size(), times.size()) << "track " << track;
  for (size_t i = 0; i < times.size(); ++i) EXPECT_NEAR(heard[i], times[i], 0.001) << "track " << track;
}

}  // namespace qv::platform::test
