#pragma once

#include <functional>
#include <map>
#include <mutex>
#include <set>
#include <string>
#include <vector>

#include "host/phone/sync_host.h"
#include "host/sync/session.h"
#include "tests/fakes/fake_platform.h"
#include "tests/host/fake_phone.h"
#include "tests/host/host_files.h"
#include "tests/test_pch.h"

namespace appsync::host::testing {

/// A client that writes every call into the trace and does as much of a real one's work as a host
/// can see: it takes the staging area over, removes, asks for packages and settles the todo list.
class RecordingClient : public SyncClient {
 public:
  RecordingClient(fakes::FakePlatform& phone, SyncHost& host) : phone_(phone), host_(host) {}

  std::vector<std::string> supportedDataclasses() noexcept override;
  std::string currentSyncAnchor() noexcept override;
  bool prepareForSyncWithHostAnchor(std::string_view hostAnchor, const ProgressCallback& progress,
                                    std::optional<Error>* error) noexcept override;
  std::optional<std::set<std::string>> disabledAssetTypes() noexcept override;
  PropertyList::Dictionary installedAssets() noexcept override;
  PropertyList::Dictionary installedAssetMetrics() noexcept override { return {}; }
  std::set<std::string> corvaneIDsForAssets() noexcept override { return {}; }
  bool reconcileSync(const PropertyList& syncDescription, std::string_view newAnchor,
                     const ProgressCallback& progress,
                     std::optional<Error>* error) noexcept override;
  bool reconcileRestoreOfType(std::int32_t, std::optional<Error>*) noexcept override {
    return false;
  }
  std::vector<SyncAssetPtr> outstandingAssetTransfers() noexcept override;
  void assetTransferUpdatedProgress(const SyncAssetPtr& asset, double fraction) noexcept override;
  void assetTransferSucceeded(const SyncAssetPtr& asset, bool succeeded,
                              const std::optional<Error>& error) noexcept override;
  void assetTransferEndedWithSuccess(bool success) noexcept override;
  void assetInstallSucceeded(const SyncAssetPtr&) noexcept override {}
  void assetInstallFailed(const SyncAssetPtr&, const Error&) noexcept override {}
  void syncEndedWithSuccess(bool success) noexcept override;
  void clearSyncData() noexcept override {}
  void prepareForBackup() noexcept override {}

  // How it behaves.
  std::vector<std::string> dataclasses = {"Application"};
  std::optional<std::set<std::string>> disabled;
  std::vector<std::string> deleted;
  std::optional<Error> prepareError;
  std::optional<Error> reconcileError;
  std::set<std::string> notAskedFor;
  std::set<std::string> alsoAskedFor;
  std::map<std::string, Error> refusedPackages;
  /// Where a call is given, it runs inside that call.
  std::function<void()> onInventory;
  std::function<void()> onTakingOver;  ///< in reconcileSync
  std::function<void()> onOutstanding;
  std::function<void(const SyncAssetPtr&, double)> onProgress;
  std::function<void(const SyncAssetPtr&)> onSent;
  std::function<void()> onTransfersEnd;
  bool installsAtOnce = true;
  bool removes = true;
  PhoneWatcher* watcher = nullptr;

 private:
  void note(const std::string& line) { phone_.trace.add(fakes::TraceCall, "client." + line); }
  void setOperation(const std::string& identifier, const std::string& operation);
  void install(const SyncAsset& asset);

  fakes::FakePlatform& phone_;
  SyncHost& host_;
};

/// Events as short lines, in the order in which they came.
class RecordingReporter : public Reporter {
 public:
  void report(const Event& event) override;
  std::vector<std::string> lines() const;
  /// The lines that begin so.
  std::vector<std::string> lines(std::string_view beginning) const;

 private:
  mutable std::mutex mutex_;
  std::vector<std::string> lines_;
};

/// "installed: a b; failed: c (reason)": only the lists that are not empty.
std::string text(const Summary& summary);

/// A sync of a real library folder with a fake phone.
class SessionTest : public ::testing::Test {
 protected:
  SessionTest();

  static constexpr std::string_view Root = "/var/mobile/Media/PublicStaging/";

  /// Plans and runs a whole sync of what lies in `folder`.
  SyncResult sync();
  void offer(const std::string& identifier, const std::string& version = "1.0",
             std::size_t bodySize = 0);
  /// As the client would leave the todo list.
  void putTodo(const std::vector<TodoState>& entries);
  std::shared_ptr<InstallCoordinator> makeCoordinator(std::string_view identifier);

  /// Calls of all services, "STAGING" for the staging root.
  std::vector<std::string> trace() const;
  std::vector<std::string> trace(std::string_view beginning) const;

  Folder folder;
  fakes::FakePlatform phone;
  Interruption interruption;
  HostProcess host{SyncHostBundleIdentifier, "com.corvane.twc.AppsClient", interruption};
  RecordingClient client{phone, host};
  RecordingReporter reporter;
  PlanOptions options;
  std::optional<Bytes> iconLayout;
  FakePhone hostsView{phone};
  bool& coordination = hostsView.coordination;
  FakePhone::Texts& waiting = hostsView.waiting;
  FakePhone::Texts& owned = hostsView.owned;
  std::function<bool(std::string_view)>& isBusyWith = hostsView.isBusyWith;
};

}  // namespace appsync::host::testing
