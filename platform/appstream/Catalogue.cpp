#include "platform/appstream/Catalogue.h"

#include <appstream.h>

#include <filesystem>
#include <memory>
#include <utility>

#include "platform/appstream/CatalogueText.h"
#include "platform/threads/Log.h"

namespace qv::platform::appstream {
namespace {

namespace fs = std::filesystem;

constexpr const char* kCatalogues[] = {"/usr/share/swcatalog", "/var/lib/swcatalog", "/var/cache/swcatalog"};
constexpr const char* kFormats[] = {"xml", "yaml"};
constexpr uintmax_t kLargestFile = uintmax_t{64} << 20;  // bytes; those of whole distributions have 10 MB
constexpr size_t kMostGenres = 16;
constexpr size_t kLongestIdentifier = 255;

struct Unref {
  void operator()(AsPool* pool) const { g_object_unref(pool); }
  void operator()(GPtrArray* array) const { g_ptr_array_unref(array); }
  void operator()(GError* error) const { g_error_free(error); }
};
using Pool = std::unique_ptr<AsPool, Unref>;
using Components = std::unique_ptr<GPtrArray, Unref>;

/// Whether there is anything to read below a catalogue's directory, and nothing absurd.
bool isReadable(const fs::path& directory) {
  bool hasFile = false;
  for (const char* format : kFormats) {
    std::error_code error;
    for (const auto& entry : fs::directory_iterator(directory / format, error)) {
      const uintmax_t size = entry.file_size(error);
      if (error) continue;
      if (size > kLargestFile) {
        QV_LOG_ERROR(logs::kSupport, "store catalogue %s is too large", entry.path().c_str());
        return false;
      }
      hasFile = true;
    }
  }
  return hasFile;
}

Pool openPool(const std::string& deviceRoot, const std::vector<std::string>& languages) {
  Pool pool(as_pool_new());
  as_pool_set_flags(pool.get(), AS_POOL_FLAG_NONE);
  as_pool_reset_extra_data_locations(pool.get());
  bool hasCatalogue = false;
  for (const char* catalogue : kCatalogues) {
    const std::string directory = deviceRoot + catalogue;
    if (!isReadable(directory)) continue;
    as_pool_add_extra_data_location(pool.get(), directory.c_str(), AS_FORMAT_STYLE_CATALOG);
    hasCatalogue = true;
  }
  std::string locale = languages.empty() ? "C" : languages.front();
  for (char& c : locale)
    if (c == '-') c = '_';
  as_pool_set_locale(pool.get(), locale.c_str());
  return hasCatalogue ? std::move(pool) : nullptr;
}

Components componentsOf(AsPool* pool, const std::string& bundleIdentifier) {
  Components found(as_pool_get_components_by_id(pool, bundleIdentifier.c_str()));
  if (found && found->len > 0) return found;
  return Components(as_pool_get_components_by_id(pool, (bundleIdentifier + ".desktop").c_str()));
}

std::optional<std::vector<std::string>> genresOf(AsComponent* component) {
  std::vector<std::string> genres;
  const GPtrArray* categories = as_component_get_categories(component);
  for (guint i = 0; categories != nullptr && i < categories->len && genres.size() < kMostGenres; ++i) {
    auto genre = presentableText(static_cast<const char*>(categories->pdata[i]));
    // Genres are listed with commas between them.
    if (genre && genre->find(',') == std::string::npos) genres.push_back(std::move(*genre));
  }
  return genres.empty() ? std::nullopt : std::optional(std::move(genres));
}

StoreLookupResult resultFrom(AsComponent* component) {
  StoreLookupResult result;
  const auto id = presentableText(as_component_get_id(component));
  if (id) result.shortProductURL = "appstream:" + *id;
  result.displayName = presentableText(as_component_get_name(component));
  result.artistName = presentableText(as_component_get_developer_name(component));
  result.genreNames = genresOf(component);
  return result;
}

Error catalogueError(int64_t code, const std::string& text) {
  return {"store", code, {{kLocalizedDescriptionKey, Value(text)}}};
}

}  // namespace

Result<StoreLookupResponse> lookUpInCatalogue(const std::string& deviceRoot, const std::vector<std::string>& languages,
                                              const StoreLookupRequest& request) {
  const Pool pool = openPool(deviceRoot, languages);
  if (!pool) return catalogueError(ENOENT, "no catalogue is installed");
  GError* raw = nullptr;
  const bool isLoaded = as_pool_load(pool.get(), nullptr, &raw) != FALSE;
  const std::unique_ptr<GError, Unref> error(raw);
  // A catalogue of which one file is broken still has the others.
  if (!isLoaded) QV_LOG_ERROR(logs::kSupport, "store catalogue: %s", error ? error->message : "not loaded");
  StoreLookupResponse response;
  for (const std::string& identifier : request.bundleIdentifiers) {
    if (identifier.empty() || identifier.size() > kLongestIdentifier) continue;
    const Components components = componentsOf(pool.get(), identifier);
    if (components && components->len > 0)
      response.results.push_back(resultFrom(static_cast<AsComponent*>(components->pdata[0])));
  }
  return response;
}

}  // namespace qv::platform::appstream
