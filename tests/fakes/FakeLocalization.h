#pragma once

#include <algorithm>
#include <cctype>
#include <cmath>
#include <ctime>
#include <string>
#include <utility>
#include <vector>

#include "platform/Bundles.h"
#include "platform/Localization.h"

namespace qv::fakes {

/// Languages without a language library: matches tags exactly, then by what stands before the
/// first "-"; every date is UTC and to the second, whatever the pattern; folding is ASCII case.
///
/// Threading: set it up before it is shared.
class FakeLocalization final : public platform::Localization {
 public:
  std::vector<std::string> languages{"en"};

  std::vector<std::string> preferredLanguages() override { return languages; }

  std::vector<std::string> matchLocalizations(const std::vector<std::string>& available,
                                              const std::vector<std::string>& preferred) override {
    std::vector<std::string> matches;
    const auto take = [&](const std::string& tag) {
      if (std::find(available.begin(), available.end(), tag) == available.end()) return;
      if (std::find(matches.begin(), matches.end(), tag) == matches.end()) matches.push_back(tag);
    };
    for (const std::string& tag : preferred) {
      take(tag);
      take(tag.substr(0, tag.find('-')));
    }
    if (matches.empty()) take("en");
    if (matches.empty() && !available.empty()) matches.push_back(available.front());
    return matches;
  }

  std::string formatDate(platform::Date date, const std::string&) override {
    const auto seconds = static_cast<std::time_t>(std::floor(date.secondsSince1970));
    std::tm parts{};
    ::gmtime_r(&seconds, &parts);
    char text[32];
    return {text, std::strftime(text, sizeof text, "%m-%d-%Y %H:%M:%S", &parts)};
  }

  bool beginsWithFolded(const std::string& text, const std::string& prefix) override {
    if (text.size() < prefix.size()) return false;
    return std::equal(prefix.begin(), prefix.end(), text.begin(),
                      [](unsigned char a, unsigned char b) { return std::tolower(a) == std::tolower(b); });
  }
};

}  // namespace qv::fakes
