#pragma once

#include <string>

#include "device/journal/records.h"
#include "device/state/application_rows.h"
#include "device/state/device_core.h"
#include "packages/package_extractor.h"

namespace appsync::device {

// Ways for an application to come onto the device. Each is on disk when it returns true and leaves
// everything as it was when it returns false or the machine goes down before. The identifier is
// usable and the caller holds its application lock.

/// What is said of an application beside its bundle.
struct InstallDetails {
  InstallType installType = InstallType::None;
  std::optional<Bytes> metadata;  ///< becomes the container's HalvoMetadata.plist
  std::optional<Bytes> sinf;
  HistoryOrigin origin = HistoryOrigin::Sync;  ///< who brings a package
};

/// Installs an application package in the place of the installed version and of the placeholder.
/// What `details` leave open is taken over from those.
[[nodiscard]] bool installPackage(DeviceCore& core, const std::string& package,
                                  const std::string& identifier, const InstallDetails& details,
                                  std::optional<Error>* error);

/// Installs a placeholder from its bundle directory, which it copies, and begins the application's
/// install. It replaces an earlier placeholder and lies over an installed version.
[[nodiscard]] bool installPlaceholder(DeviceCore& core, const std::string& bundleDirectory,
                                      const std::string& identifier, const InstallDetails& details,
                                      std::optional<Error>* error);

/// What a placeholder shows that has no bundle yet.
struct PlaceholderFace {
  std::string name;
  std::optional<std::string> version;
  std::string icon;                 ///< a file, which is copied; may be empty
  PropertyList::Dictionary info{};  ///< what else its Info.plist says
};

/// Installs a placeholder and makes its bundle.
[[nodiscard]] bool buildPlaceholder(DeviceCore& core, const std::string& identifier,
                                    const PlaceholderFace& face, const InstallDetails& details,
                                    std::optional<Error>* error);

/// Registers an application that comes with the system.
[[nodiscard]] bool installSystemApplication(DeviceCore& core, const std::string& identifier,
                                            const std::string& displayName,
                                            const std::string& version,
                                            std::optional<Error>* error);

/// A refusal with a text that begins with its name.
Error refusal(PackageRefusal reason, std::string_view detail);

}  // namespace appsync::device
