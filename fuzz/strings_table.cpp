// Tables of texts, which come from the bundles of applications.
#include "fuzz/Target.h"
#include "support/StringsTable.h"

namespace {

std::string quoted(const std::string& text) {
  std::string result = "\"";
  for (const char c : text) {
    if (c == '"' || c == '\\') result += '\\';
    result += c;
  }
  return result + '"';
}

}  // namespace

std::vector<std::string> qv::fuzz::seeds() {
  return {"", "\xEF\xBB\xBF/* a comment */ \"key\" = \"text\";\n// another\n\"other\" = \"gr\xC3\xBC\xC3\x9F\";\n",
          "\"escapes\" = \"\\\"\\\\\\n\\t\\r\\U00e4\\uD83D\\uDE00\\uD800\";\n\"\" = \"\";",
          "\"wide\"=\"\xF0\x9F\x98\x80 \xE2\x82\xAC\";\"wide\"=\"again\";"};
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  const qv::StringsTable table = qv::parseStringsTable({reinterpret_cast<const char*>(data), size});
  std::string written;
  for (const auto& [key, text] : table.texts) written += quoted(key) + "=" + quoted(text) + ";";
  if (written.size() > qv::kMaximumStringsTableSize) return 0;
  const qv::StringsTable again = qv::parseStringsTable(written);
  qv::fuzz::require(!again.fault, "texts are UTF-8 without NUL");
  qv::fuzz::require(again.texts == table.texts, "a written table reads as the same texts");
  return 0;
}
