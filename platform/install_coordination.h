#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <vector>

#include "platform/app_registry.h"
#include "platform/bytes.h"
#include "platform/error.h"
#include "platform/file_manager.h"
#include "platform/property_list.h"

namespace appsync {

/// Who creates, owes or cancels something in the coordination service.
using CoordinationClientId = std::uint64_t;
inline constexpr CoordinationClientId KQClientKiosk = 1;     ///< the store
inline constexpr CoordinationClientId SyncHostClientID = 3;  ///< the sync host and its clients

enum class CoordinatorKind {
  Any,         ///< lookup only: an existing coordinator of whatever kind
  Initiating,  ///< first install of an application that is not on the device
  Updating,    ///< the application is installed already
  Restoring,
  RestoringDemoted,
};

/// The store's description of an application, as found in HalvoMetadata.plist. May be empty.
struct StoreMetadata {
  PropertyList::Dictionary values;
  static StoreMetadata fromDictionary(PropertyList::Dictionary values) {
    return {std::move(values)};
  }
  bool operator==(const StoreMetadata&) const = default;
};

struct InstallOptions {
  std::optional<StoreMetadata> storeMetadata;
  InstallType installType = InstallType::None;
  std::uint64_t installTargetType = 0;  ///< 1: the device itself
  std::optional<Bytes> sinfData;        ///< opaque, handed on unchanged
  bool operator==(const InstallOptions&) const = default;
};

/// What a placeholder shows and allows.
struct PlaceholderAttributes {
  PropertyList::Dictionary infoDictionary;
  bool launchProhibited = false;
  std::optional<std::string> bundleVersion;

  static PlaceholderAttributes fromInfoDictionary(PropertyList::Dictionary info) {
    return {std::move(info), false, std::nullopt};
  }
  void setLaunchProhibited(bool prohibited) { launchProhibited = prohibited; }
  void setBundleVersion(std::optional<std::string> version) { bundleVersion = std::move(version); }
  bool operator==(const PlaceholderAttributes&) const = default;
};

std::string description(const PlaceholderAttributes& attributes);

/// Data that a client owes to a coordinator, and to one only: another one refuses it. Objects of
/// this family are shared, live and callable from any thread. After the service has settled or
/// cancelled them they stay readable; operations that give a result then fail with an error, the
/// others do nothing.
class DataPromise {
 public:
  virtual ~DataPromise() = default;

  virtual std::string name() const = 0;
  virtual std::uint64_t identifier() const noexcept = 0;
  virtual double percentComplete() const noexcept = 0;
  /// A fraction: 1.0 is all.
  virtual void setPercentComplete(double fraction) noexcept = 0;
  virtual bool isComplete() const noexcept = 0;
  /// Complete means: the data is there; the service may take it at once.
  virtual void setComplete(bool complete) noexcept = 0;
  virtual void cancel(const Error& reason, CoordinationClientId client) noexcept = 0;
  virtual std::string description() const = 0;
};

/// A promise kept by putting a file at a place. The service takes the file over when it is
/// complete.
class PathTransferPromise : public DataPromise {
 public:
  /// none: the place is not known yet.
  virtual std::optional<FileLocation> transferPath() const = 0;
  virtual void setTransferPath(const FileLocation& location) noexcept = 0;
};

/// A promise kept by somebody else's means; only its progress and completion are told.
class OutOfBandTransferPromise : public DataPromise {};

/// The application shown on the home screen until its package is installed. Where nothing but a
/// placeholder of another sort is left of the application (demoted, or waiting for its restore),
/// that one is shown instead of a sync's, and stays as it was if the install fails or is cancelled.
/// That of a restore stays if only its package fails.
class InstallPlaceholder {
 public:
  virtual ~InstallPlaceholder() = default;

  virtual std::string bundleIdentifier() const = 0;
  [[nodiscard]] virtual bool setIconPromise(const std::shared_ptr<PathTransferPromise>& promise,
                                            std::optional<Error>* error) noexcept = 0;
  [[nodiscard]] virtual bool setPlaceholderAttributes(const PlaceholderAttributes& attributes,
                                                      std::optional<Error>* error) noexcept = 0;
  [[nodiscard]] virtual bool setMetadata(const StoreMetadata& metadata,
                                         std::optional<Error>* error) noexcept = 0;
  [[nodiscard]] virtual bool setSinfData(ByteView sinf, std::optional<Error>* error) noexcept = 0;
  /// Nothing more will be set; the placeholder may be handed over.
  [[nodiscard]] virtual bool setConfigurationComplete(std::optional<Error>* error) noexcept = 0;
  virtual bool cancel(const Error& reason, CoordinationClientId client) noexcept = 0;
  virtual std::string description() const = 0;
};

class InstallCoordinator;

/// Receives coordinator events, one after another, on a service thread. The coordinator is valid
/// for the call. An event comes once; a process that dies while it receives one gets it anew,
/// unless it is a cancellation.
class CoordinatorObserver {
 public:
  virtual ~CoordinatorObserver() = default;
  virtual void promiseDidBeginFulfillmentWithIdentifier(std::uint64_t identifier) noexcept = 0;
  virtual void coordinatorDidInstallPlaceholder(InstallCoordinator& coordinator) noexcept = 0;
  /// Also sent when the install failed: the coordinator then carries the error.
  virtual void coordinatorDidCompleteSuccessfully(InstallCoordinator& coordinator) noexcept = 0;
  /// The person asks for this application first.
  virtual void coordinatorShouldPrioritize(InstallCoordinator& coordinator) noexcept = 0;
  /// Comes only while the process lives in which it was cancelled; a creator's own cancel is not
  /// told to it.
  virtual void coordinatorCanceledWithReason(InstallCoordinator& coordinator, const Error& reason,
                                             CoordinationClientId client) noexcept = 0;
};

/// One application's install, update or restore, owned by the coordination service; this is a
/// shared handle to it. Setters give false and an error when the service refuses, or when the
/// coordinator is over. One whose placeholder was taken out of the registry goes on until its
/// client asks to make one anew, or the service is started anew: then it is over, untold.
class InstallCoordinator {
 public:
  virtual ~InstallCoordinator() = default;

  /// none: the event's coordinator is not known any more.
  virtual std::optional<std::string> bundleIdentifier() const = 0;
  virtual CoordinationClientId creatorIdentifier() const noexcept = 0;
  /// Why the install failed, was cancelled or cannot go on now; none while all is well.
  virtual std::optional<Error> error() const = 0;
  /// Borrows the observer (nullptr: no observer) until it is replaced or unregistered by
  /// InstallCoordination::removeObserver.
  virtual void setObserver(CoordinatorObserver* observer) noexcept = 0;

  virtual bool hasInstallOptions() const noexcept = 0;
  [[nodiscard]] virtual bool setInstallOptions(const InstallOptions& options,
                                               std::optional<Error>* error) noexcept = 0;

  virtual bool hasInitialQPKAssetPromises() const noexcept = 0;
  [[nodiscard]] virtual bool setInitialQPKAssetPromises(
      const std::vector<std::shared_ptr<DataPromise>>& promises,
      std::optional<Error>* error) noexcept = 0;

  virtual bool hasAppAssetPromise() const noexcept = 0;
  /// The application package; nullptr when there is none or it cannot be had (then with an error).
  [[nodiscard]] virtual std::shared_ptr<PathTransferPromise> appAssetPromise(
      std::optional<Error>* error) noexcept = 0;
  [[nodiscard]] virtual bool setAppAssetPromise(const std::shared_ptr<PathTransferPromise>& promise,
                                                std::optional<Error>* error) noexcept = 0;
  /// The client that brings the application package; 0 when nobody was named.
  virtual CoordinationClientId appAssetPromiseResponsibleClient() const noexcept = 0;
  [[nodiscard]] virtual bool setAppAssetPromiseResponsibleClient(
      CoordinationClientId client, std::optional<Error>* error) noexcept = 0;

  virtual bool hasUserDataPromise() const noexcept = 0;
  [[nodiscard]] virtual bool setUserDataPromise(
      const std::shared_ptr<OutOfBandTransferPromise>& promise,
      std::optional<Error>* error) noexcept = 0;

  virtual bool hasPlaceholderPromise() const noexcept = 0;
  /// Refused with an error: none, one of another application, and one whose configuration is not
  /// complete, which nobody might ever complete.
  [[nodiscard]] virtual bool setPlaceholderPromise(
      const std::shared_ptr<InstallPlaceholder>& placeholder,
      std::optional<Error>* error) noexcept = 0;

  virtual bool cancel(const Error& reason, CoordinationClientId client) noexcept = 0;
  virtual std::string description() const = 0;
};

/// Delivers the events of coordinators that have no observer of their own, for the client
/// identifiers it was made for, also those that nobody was there to hear before. Destroying it ends
/// delivery; no event runs after the destructor has returned.
class CoordinatorEventListener {
 public:
  virtual ~CoordinatorEventListener() = default;
};

/// The platform's install coordination service. Called from any thread.
class InstallCoordination {
 public:
  virtual ~InstallCoordination() = default;

  /// Whether installs are to be driven through coordinators; constant for the life of the process.
  virtual bool coordinationIsEnabled() noexcept = 0;

  /// The application's coordinator: the live one, whatever its kind and whoever made it, else a new
  /// one of this kind. Only the demoted restore, which ends without a package, and the other kinds
  /// do not stand in for one another: asked to make one, the service ends a live one of the other
  /// sort that is this client's own, untold, and refuses to while it is another client's or past
  /// cancelling. nullptr when there is none and none is to be made, or when it failed (with an
  /// error). `created` may be null.
  [[nodiscard]] virtual std::shared_ptr<InstallCoordinator> coordinatorFor(
      CoordinatorKind kind, std::string_view bundleId, CoordinationClientId client,
      bool createIfNotExisting, bool* created, std::optional<Error>* error) noexcept = 0;

  /// No event reaches the observer after this has returned.
  virtual void removeObserver(CoordinatorObserver* observer) noexcept = 0;

  /// nullptr when the service refuses.
  virtual std::shared_ptr<PathTransferPromise> createPathTransferPromise(
      std::string_view name, CoordinationClientId client,
      const std::optional<FileLocation>& transferPath, std::uint64_t diskSpaceNeeded) noexcept = 0;
  virtual std::shared_ptr<OutOfBandTransferPromise> createOutOfBandTransferPromise(
      std::string_view name, CoordinationClientId client,
      std::uint64_t diskSpaceNeeded) noexcept = 0;
  virtual std::shared_ptr<InstallPlaceholder> createAppPlaceholder(
      std::string_view appName, std::string_view bundleId, InstallType installType,
      CoordinationClientId client) noexcept = 0;

  /// Returns at once; the completion runs once, on a service thread, with none on success.
  virtual void uninstallApp(
      std::string_view bundleId, bool requestUserConfirmation,
      std::function<void(const std::optional<Error>&)> completion) noexcept = 0;

  /// An error fit to be shown to the person.
  virtual Error createUserPresentableError(std::int64_t code, std::uint64_t flag,
                                           const std::optional<Error>& underlying) noexcept = 0;

  /// Borrows the delegate for the listener's life.
  virtual std::unique_ptr<CoordinatorEventListener> createEventListener(
      std::string_view serviceName, const std::set<CoordinationClientId>& clients,
      CoordinatorObserver& delegate) noexcept = 0;
};

}  // namespace appsync
