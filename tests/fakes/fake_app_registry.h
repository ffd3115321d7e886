#pragma once

#include <condition_variable>
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <set>
#include <vector>

#include "platform/app_registry.h"
#include "tests/fakes/event_thread.h"
#include "tests/fakes/fake_file_manager.h"
#include "tests/fakes/fake_install_progress.h"
#include "tests/fakes/fake_installer_service.h"

namespace appsync::fakes {

/// The registry in memory: for each identifier an installed version, a placeholder, or both.
/// Containers are "/var/mobile/Containers/Applications/<identifier>" and ".../Placeholders/<...>";
/// an installed placeholder's bundle and store metadata are copied there.
class FakeAppRegistry : public AppRegistry {
 public:
  FakeAppRegistry(CallTrace& trace, FakeFileManager& files, FakeInstallerService& installerService)
      : trace_(trace), files_(files), installerService_(installerService) {}
  /// Lets blocked installs go on and ends every progress.
  ~FakeAppRegistry() override;

  // AppRegistry
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

  // What is there before a test's action. Missing paths and the bundle identifier are filled in.
  void seedInstalled(AppRecord record);
  void seedInstalled(std::string_view identifier, std::string_view version = "1.0");
  /// With a progress that waits and loads.
  void seedPlaceholder(AppRecord record);
  void seedPlaceholder(std::string_view identifier, InstallType installType = InstallType::Sync,
                       std::string_view version = "1.0");
  /// Changes the records of an application as they stand, also what was filled in.
  void edit(std::string_view identifier, const std::function<void(AppRecord&)>& change);
  /// The application and its placeholder are gone, as if the person had removed them.
  void removeAll(std::string_view identifier);
  /// What uninstallApplication takes away, untraced; false when there is nothing.
  bool remove(std::string_view identifier, bool placeholderOnly);
  /// A record that only BundleKind::All visits, such as an extension's.
  void seedOther(AppRecord record);

  // What is there.
  std::optional<AppRecord> installed(std::string_view identifier) const;
  std::optional<AppRecord> placeholder(std::string_view identifier) const;
  std::vector<std::string> installedIdentifiers() const;
  std::vector<std::string> placeholderIdentifiers() const;
  /// The current progress or the last one; nullptr when there never was one.
  std::shared_ptr<FakeInstallProgress> progress(std::string_view identifier) const;
  void dropProgress(std::string_view identifier);
  std::size_t observerCount() const;

  // What packages are and how installs end.
  struct Package {
    std::string identifier;
    std::optional<std::string> version = "1.0";
    std::string displayName;
  };
  /// Without it a package is the application that the options name, in the version of its
  /// placeholder or "1.0".
  void whenPackageInstalled(std::string_view path, Package package);
  void failInstall(std::string_view identifier, Error error);
  void failPlaceholder(std::string_view identifier, Error error);
  void failUninstall(std::string_view identifier);

  // Package installs that overlap.
  /// From now on package installs wait inside the registry until they are released.
  void blockInstalls();
  void releaseInstalls();
  /// Waits until so many installs are inside the registry at once; false when that takes a minute.
  bool waitForInstalls(std::size_t count);
  std::size_t installsStarted() const;
  std::size_t mostInstallsAtOnce() const;

  // Events.
  /// From now on observers get this first report instead of the real one.
  void scriptReport(std::vector<AppRecord> prioritized, std::vector<AppRecord> paused);
  /// Tells all observers, and waits until they have been told.
  void reportInstalls(const std::vector<AppRecord>& prioritized,
                      const std::vector<AppRecord>& paused);
  void reportCancellation(const std::vector<AppRecord>& records);
  /// Waits until every event so far has been delivered.
  void waitForEvents() { events_.drain(); }

 private:
  struct Application {
    std::optional<AppRecord> installed;
    std::optional<AppRecord> placeholder;
    std::shared_ptr<FakeInstallProgress> progress;
    std::size_t order = 0;  // of its placeholder, which is its priority
  };
  struct Report {
    std::vector<AppRecord> prioritized;
    std::vector<AppRecord> paused;
  };
  struct Observer {
    AppRegistryObserver* observer;
    std::optional<std::vector<std::string>> lastReport;
  };
  using Applications = std::map<std::string, Application, std::less<>>;

  // The lock is held.
  void placePlaceholder(AppRecord record);
  void placeInstalled(AppRecord record);
  void eraseContainer(const AppRecord& record);
  Report currentReport() const;
  std::optional<AppRecord> packageRecord(const std::string& identifier, std::string_view path,
                                         std::optional<Error>* error) const;

  bool installPlaceholder(const std::string& identifier, const FileLocation& package,
                          const PropertyList::Dictionary& options, std::optional<Error>* error);
  bool installPackage(const std::string& identifier, const FileLocation& package,
                      std::optional<Error>* error);
  void waitWhileBlocked();
  void progressChanged(const std::string& identifier, bool canceled);
  void postReport();
  void deliverReport();
  /// Calls every observer that is registered, one after another.
  void deliver(const std::function<void(AppRegistryObserver&)>& event);

  CallTrace& trace_;
  FakeFileManager& files_;
  FakeInstallerService& installerService_;
  mutable std::mutex mutex_;
  Applications applications_;
  std::vector<AppRecord> others_;
  std::size_t nextOrder_ = 0;
  std::map<std::string, Package, std::less<>> packages_;
  std::map<std::string, Error, std::less<>> installFailures_;
  std::map<std::string, Error, std::less<>> placeholderFailures_;
  std::set<std::string, std::less<>> uninstallFailures_;

  std::condition_variable installsChanged_;
  bool blocked_ = false;
  std::size_t installsRunning_ = 0;
  std::size_t installsStarted_ = 0;
  std::size_t mostInstallsAtOnce_ = 0;

  std::condition_variable delivered_;
  std::vector<Observer> observers_;
  const AppRegistryObserver* delivering_ = nullptr;
  std::optional<Report> scripted_;
  EventThread events_;  // last: its events use all of the above
};

}  // namespace appsync::fakes
