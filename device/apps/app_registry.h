#pragma once

#include "device/apps/installers.h"
#include "device/state/device_core.h"
#include "platform/app_registry.h"

namespace appsync::device {

/// The registry in the device's database. Installs of different applications run beside one
/// another; what changes one application waits its turn.
class DeviceAppRegistry final : public AppRegistry {
 public:
  explicit DeviceAppRegistry(DeviceCore& core) : core_(core) {}

  void addObserver(AppRegistryObserver* observer) noexcept override;
  void removeObserver(AppRegistryObserver* observer) noexcept override;
  bool isApplicationInstalled(std::string_view bundleId) noexcept override;
  std::optional<AppRecord> recordForIdentifier(std::string_view bundleId,
                                               bool placeholder) noexcept override;
  void enumerateBundles(BundleKind kind, const Visitor& visitor) noexcept override;
  bool installApplication(const FileLocation& package, const PropertyList::Dictionary& options,
                          std::optional<Error>* error) noexcept override;
  bool uninstallApplication(std::string_view bundleId,
                            const PropertyList::Dictionary& options) noexcept override;
  std::shared_ptr<InstallProgress> installProgress(const AppRecord& record,
                                                   InstallPhase phase) noexcept override;
  std::shared_ptr<InstallProgress> installProgressSync(const AppRecord& record) noexcept override;
  void installPhaseFinished(InstallProgress& progress) noexcept override;

  /// Installs a package of which more is said than in its file, like installApplication.
  [[nodiscard]] bool installPackageWith(const FileLocation& package, const std::string& identifier,
                                        const InstallDetails& details,
                                        std::optional<Error>* error) noexcept;

  /// Installs a placeholder and makes its bundle.
  [[nodiscard]] bool buildPlaceholder(const std::string& identifier, const PlaceholderFace& face,
                                      const InstallDetails& details,
                                      std::optional<Error>* error) noexcept;

  using Change = std::function<bool(DeviceCore& core, const std::string& identifier,
                                    std::optional<Error>* error)>;
  /// Runs a change of one application, alone on it. False with an error for an identifier that
  /// cannot be used, a device opened for reading, or a change that failed.
  [[nodiscard]] bool change(std::string_view bundleId, const Change& change,
                            std::optional<Error>* error) noexcept;

  /// Whether only the placeholder and the data are left of it until somebody asks for it.
  bool isDemoted(std::string_view bundleId) noexcept;
  /// Whether an install is under way; not while a placeholder only waits for somebody to begin one.
  bool isBeingInstalled(std::string_view bundleId) noexcept;
  /// Every record, the placeholder after the installed version of the same identifier. None, with
  /// an error, when they cannot be read.
  [[nodiscard]] std::vector<AppRecord> records(std::optional<Error>* error = nullptr) noexcept;
  /// The opaque blob of the installed version or, failing that, of the placeholder; nullopt for
  /// none, and with an error when it cannot be read.
  [[nodiscard]] std::optional<Bytes> opaqueBlob(std::string_view bundleId,
                                                std::optional<Error>* error) noexcept;

 private:
  DeviceCore& core_;
};

}  // namespace appsync::device
