#pragma once

/// Where a device keeps what this daemon reads and writes, beside the temporary store (QVTemporaryFiles.h). Directories
/// without a separator at their end, under the device root. One policy: the daemon's entry gives them to the services.
namespace qv {

/// What belongs to the user. Extensions see nothing of it but their containers.
inline constexpr const char kDataDirectory[] = "/private/var/mobile";
inline constexpr const char kPreferencesDirectory[] = "/private/var/mobile/Library/Preferences";
inline constexpr const char kPhotoLibraryDirectory[] = "/private/var/mobile/Media/Movies";
inline constexpr const char kMetricsDirectory[] = "/private/var/mobile/Library/Logs/Quorvel";

/// The preference domain of this daemon.
inline constexpr const char kPreferenceDomain[] = "com.tarnwick.quorveld";

}  // namespace qv
