#pragma once

#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/property_list.h"

namespace appsync {

/// Domain of the errors with which the installer refuses a package.
inline constexpr std::string_view InstallerServiceErrorDomain = "InstallerServiceErrorDomain";

/// The installer's memory of applications that were uninstalled. Called from any thread.
class InstallerService {
 public:
  virtual ~InstallerService() = default;

  /// The applications uninstalled and not yet cleared, keyed by bundle identifier; an application
  /// that was installed again is not among them. nullopt when the installer does not answer.
  virtual std::optional<PropertyList::Dictionary> lookupUninstalled() noexcept = 0;

  /// Forgets these; unknown ones are passed over. 0 on success.
  virtual int clearUninstalled(const std::vector<std::string>& bundleIds) noexcept = 0;
};

}  // namespace appsync
