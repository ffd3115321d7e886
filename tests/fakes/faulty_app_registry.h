#pragma once

#include "platform/app_registry.h"
#include "tests/fakes/fault_plan.h"

namespace appsync::fakes {

/// Passes every call on, but for those that the plan lets fail; a failed call changes nothing.
class FaultyAppRegistry : public AppRegistry {
 public:
  FaultyAppRegistry(AppRegistry& registry, FaultPlan& plan) : registry_(registry), plan_(plan) {}

  void addObserver(AppRegistryObserver* observer) noexcept override {
    registry_.addObserver(observer);
  }
  void removeObserver(AppRegistryObserver* observer) noexcept override {
    registry_.removeObserver(observer);
  }
  bool isApplicationInstalled(std::string_view bundleId) noexcept override {
    return !plan_.next("AppRegistry.isApplicationInstalled", bundleId) &&
           registry_.isApplicationInstalled(bundleId);
  }
  std::optional<AppRecord> recordForIdentifier(std::string_view bundleId,
                                               bool placeholder) noexcept override {
    if (plan_.next("AppRegistry.recordForIdentifier", bundleId)) return std::nullopt;
    return registry_.recordForIdentifier(bundleId, placeholder);
  }
  void enumerateBundles(BundleKind kind, const Visitor& visitor) noexcept override {
    registry_.enumerateBundles(kind, visitor);
  }
  bool installApplication(const FileLocation& package, const PropertyList::Dictionary& options,
                          std::optional<Error>* error) noexcept override {
    return !plan_.strikes("AppRegistry.installApplication", package.path, error) &&
           registry_.installApplication(package, options, error);
  }
  bool uninstallApplication(std::string_view bundleId,
                            const PropertyList::Dictionary& options) noexcept override {
    return !plan_.next("AppRegistry.uninstallApplication", bundleId) &&
           registry_.uninstallApplication(bundleId, options);
  }
  std::shared_ptr<InstallProgress> installProgress(const AppRecord& record,
                                                   InstallPhase phase) noexcept override {
    if (plan_.next("AppRegistry.installProgress", record.applicationIdentifier)) return nullptr;
    return registry_.installProgress(record, phase);
  }
  std::shared_ptr<InstallProgress> installProgressSync(const AppRecord& record) noexcept override {
    if (plan_.next("AppRegistry.installProgressSync", record.applicationIdentifier)) return nullptr;
    return registry_.installProgressSync(record);
  }
  void installPhaseFinished(InstallProgress& progress) noexcept override {
    registry_.installPhaseFinished(progress);
  }

 private:
  AppRegistry& registry_;
  FaultPlan& plan_;
};

}  // namespace appsync::fakes
