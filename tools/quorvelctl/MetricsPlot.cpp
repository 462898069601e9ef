#include "tools/quorvelctl/MetricsPlot.h"

#include <algorithm>
#include <cstdio>
#include <functional>
#include <vector>

#include "tools/quorvelctl/Wording.h"

namespace ctl {

using nlohmann::json;

namespace {

// Pixels. Three panels, one above the other.
constexpr int kLeft = 90, kTop = 60, kWidth = 720, kHeight = 120, kGap = 50;
constexpr int kPanels = 3;
constexpr int kRight = kLeft + kWidth, kBottom = kTop + kPanels * (kHeight + kGap) - kGap;
/// More would be narrower than a pixel: the newest of them.
constexpr size_t kMostBars = kWidth;

/// What one panel shows of a recording; below 0 where it is not known.
///
/// Threading: a value.
struct Panel {
  const char* title;
  const char* color;
  std::function<double(const json& event)> value;
  std::function<std::string(double value)> label;
};

template <class... Values>
std::string text(const char* format, Values... values) {
  std::string made(static_cast<size_t>(std::snprintf(nullptr, 0, format, values...)), '\0');
  std::snprintf(made.data(), made.size() + 1, format, values...);
  return made;
}

double number(const json& holder, const char* key, double otherwise) {
  const json value = holder.value(key, json());
  return value.is_number() ? value.get<double>() : otherwise;
}

double rateOf(const json& event) {
  const double seconds = number(event["payload"], "ActiveDuration", 0);
  return seconds > 0 ? number(event["payload"], "VideoFrameCount", 0) / seconds : -1;
}
double askedRateOf(const json& event) { return number(event["payload"], "VideoCaptureRate", -1); }
double dropsOf(const json& event) { return number(event, "droppedPictures", -1); }
double sizeOf(const json& event) { return number(event["payload"], "RecordedFileSize", -1); }

std::string plain(double value) { return text("%.0f", value); }
std::string bytes(double value) { return sizeText(static_cast<uint64_t>(value)); }

/// A round number that is not below any of these.
double scaleFor(double most) {
  for (double step = 1;; step *= 10) {
    for (const double round : {1.0, 2.0, 5.0}) {
      if (round * step >= most) return round * step;
    }
  }
}

std::string escaped(const std::string& content) {
  std::string safe;
  for (const char byte : content) {
    if (byte == '&' || byte == '<' || byte == '>' || byte == '"') {
      safe += "&#" + std::to_string(static_cast<int>(byte)) + ";";
    } else {
      safe += byte;
    }
  }
  return safe;
}

std::string labelAt(int x, int y, const char* anchor, const std::string& content) {
  return text("<text x=\"%d\" y=\"%d\" text-anchor=\"%s\">", x, y, anchor) + escaped(content) + "</text>\n";
}

std::string lineAt(double x1, double y1, double x2, double y2, const char* color) {
  return text("<line x1=\"%.1f\" y1=\"%.1f\" x2=\"%.1f\" y2=\"%.1f\" stroke=\"%s\"/>\n", x1, y1, x2, y2, color);
}

/// The panels of these events.
///
/// Threading: a value.
class Drawing {
 public:
  explicit Drawing(std::vector<json> events) : events_(std::move(events)) {}

  std::string panel(const Panel& panel, int number) const {
    const int top = kTop + number * (kHeight + kGap), bottom = top + kHeight;
    const double scale = scaleFor(std::max(most(panel.value), number == 0 ? most(askedRateOf) : 0));
    std::string all = labelAt(kLeft, top - 12, "start", panel.title) + lineAt(kLeft, bottom, kRight, bottom, "#888") +
                      lineAt(kLeft, top, kRight, top, "#ddd") + labelAt(kLeft - 8, bottom + 4, "end", panel.label(0)) +
                      labelAt(kLeft - 8, top + 4, "end", panel.label(scale));
    const auto isKnown = [&](const json& event) { return panel.value(event) >= 0; };
    if (std::ranges::none_of(events_, isKnown)) all += labelAt(kLeft + 10, top + kHeight / 2, "start", "not counted");
    for (size_t at = 0; at < events_.size(); ++at) {
      const double value = panel.value(events_[at]), height = kHeight * value / scale;
      if (value >= 0) all += bar(at, bottom - height, height, panel, value);
      const double asked = number == 0 ? askedRateOf(events_[at]) : -1;
      const double y = bottom - kHeight * asked / scale;
      if (asked >= 0) all += lineAt(xOf(at), y, xOf(at) + step(), y, "#c33");
    }
    return all;
  }

 private:
  double step() const { return static_cast<double>(kWidth) / static_cast<double>(events_.size()); }
  double xOf(size_t at) const { return kLeft + step() * static_cast<double>(at); }
  double most(double (*value)(const json&)) const { return most(std::function<double(const json&)>(value)); }
  double most(const std::function<double(const json&)>& value) const {
    double largest = 1;
    for (const json& event : events_) largest = std::max(largest, value(event));
    return largest;
  }
  std::string bar(size_t at, double top, double height, const Panel& panel, double value) const {
    const double gap = step() > 4 ? std::min(step() / 4, 8.0) : 0;
    const json& event = events_[at];
    return text("<rect x=\"%.1f\" y=\"%.1f\" width=\"%.1f\" height=\"%.1f\" fill=\"%s\"><title>", xOf(at) + gap / 2,
                top, step() - gap, height, panel.color) +
           escaped(dateText(number(event, "time", 0)) + "  " + printable(event.value("serviceName", "?")) + "  " +
                   panel.label(value)) +
           "</title></rect>\n";
  }

  const std::vector<json> events_;
};

}  // namespace

std::string plotOf(const json& events) {
  const size_t first = events.size() > kMostBars ? events.size() - kMostBars : 0;
  const std::vector<json> shown(events.begin() + static_cast<ptrdiff_t>(first), events.end());
  std::string svg =
      text("<svg xmlns=\"http://www.w3.org/2000/svg\" width=\"%d\" height=\"%d\" ", kRight + 30, kBottom + 50) +
      "font-family=\"sans-serif\" font-size=\"13\">\n<rect width=\"100%\" height=\"100%\" fill=\"#fff\"/>\n";
  if (shown.empty()) return svg + labelAt(kLeft, kTop, "start", "nothing was recorded yet") + "</svg>\n";
  const Drawing drawing(shown);
  const Panel panels[kPanels]{{"pictures a second (line: asked for)", "#3a7bd5", rateOf, plain},
                              {"dropped pictures", "#e08a1e", dropsOf, plain},
                              {"size of the file", "#4a9d5b", sizeOf, bytes}};
  svg += labelAt(kLeft, 24, "start", std::to_string(shown.size()) + (shown.size() == 1 ? " recording" : " recordings"));
  for (int number = 0; number < kPanels; ++number) svg += drawing.panel(panels[number], number);
  svg += labelAt(kLeft, kBottom + 24, "start", dateText(number(shown.front(), "time", 0)));
  if (shown.size() > 1) svg += labelAt(kRight, kBottom + 24, "end", dateText(number(shown.back(), "time", 0)));
  return svg + "</svg>\n";
}

}  // namespace ctl
