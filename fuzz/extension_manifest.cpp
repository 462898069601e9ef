// Information dictionaries of extensions, which come with whatever is installed.
#include "fuzz/Target.h"
#include "platform/linux/ExtensionManifest.h"
#include "platform/linux/Json.h"

std::vector<std::string> qv::fuzz::seeds() {
  return {R"({"CFBundleIdentifier":"com.example.up","QVExtension":{"QVExtensionPointIdentifier":"a.b",
            "QVExtensionExecutable":"bin/up","QVExtensionIcons":["i.png","../i.png",7],
            "QVExtensionAttributes":{"QVExtensionActivationRule":{"x":true,"y":0}}}})",
          R"({"CFBundleIdentifier":"../up","QVExtension":{"QVExtensionPointIdentifier":"a",
            "QVExtensionExecutable":"a/../../b"}})",
          R"({"QVExtension":[]})"};
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  const auto info = qv::platform::parseJSON({reinterpret_cast<const char*>(data), size});
  if (!info) return 0;
  const auto manifest = qv::platform::parseExtensionManifest(info.value().asDictionary());
  if (!manifest) return 0;
  const auto& fields = manifest.value();
  qv::fuzz::require(fields.identifier.find('/') == std::string::npos && fields.identifier.front() != '.',
                    "an identifier names one directory");
  std::vector<std::string> paths = fields.icons;
  paths.push_back(fields.executable);
  for (const std::string& path : paths) {
    qv::fuzz::require(!path.empty() && path.front() != '/' && ("/" + path + "/").find("/../") == std::string::npos,
                      "a path stays below its bundle");
  }
  return 0;
}
