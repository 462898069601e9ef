#include <quorvel/Recorder.h>

#include <future>

#include "tools/quorvelctl/DaemonStatus.h"
#include "tools/quorvelctl/Verbs.h"
#include "tools/quorvelctl/Wording.h"

namespace ctl {

using nlohmann::json;

Exit listExtensions(const Stage& stage) {
  if (const std::string why = whyUnreachable(); !why.empty()) throw Failure{Exit::NoDaemon, why};
  const auto answer = std::make_shared<std::promise<quorvel::BroadcastExtensionsResult>>();
  const auto recorder = quorvel::Recorder::create();
  recorder->systemBroadcastExtensions([answer](auto result) { answer->set_value(std::move(result)); });
  const auto result = answer->get_future().get();
  if (result.error) throw Failure{Exit::Failed, "the daemon cannot look for extensions: " + result.error->text};
  json list = json::array();
  for (const auto& each : result.extensions) {
    list.push_back({{"bundleIdentifier", each.bundleID}, {"name", each.displayName}});
    if (!stage.arguments.json) stage.output.line(printable(each.bundleID) + "  " + printable(each.displayName));
  }
  if (stage.arguments.json) {
    stage.output.json({{"extensions", std::move(list)}});
  } else if (list.empty()) {
    stage.output.line("no broadcast extension is installed");
  }
  return Exit::Success;
}

}  // namespace ctl
