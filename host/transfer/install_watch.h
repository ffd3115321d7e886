#pragma once

#include <map>
#include <optional>
#include <set>
#include <string>
#include <string_view>

#include "base/interruption.h"
#include "host/library/events.h"
#include "host/phone/phone_state.h"
#include "platform/mutex.h"

namespace appsync::host {

/// Watches a phone for as long as it lives: tells of its installs, remembers why some failed, and
/// expedites the phone when the person interrupts. Borrows everything. Called from any thread.
class InstallWatch : public PhoneWatcher {
 public:
  InstallWatch(const Phone& phone, Reporter& reporter, Interruption& interruption);
  ~InstallWatch() override;
  InstallWatch(const InstallWatch&) = delete;
  InstallWatch& operator=(const InstallWatch&) = delete;

  void assertionDenied(std::string_view bundleId) noexcept override;
  void installFinished(std::string_view bundleId,
                       const std::optional<Error>& error) noexcept override;
  /// Failed installs are told with the files of these packages from now on.
  void nameFilesOf(const Library& library);
  /// Tells of installs that were over before it watched.
  void tellInstalled(const std::set<std::string>& identifiers);
  /// Reason by identifier.
  std::map<std::string, std::string> failures() const;

 private:
  const Phone& phone_;
  Reporter& reporter_;
  Interruption& interruption_;
  mutable Mutex mutex_;
  std::map<std::string, std::string> failures_ APPSYNC_GUARDED_BY(mutex_);
  std::set<std::string> installed_ APPSYNC_GUARDED_BY(mutex_);
  std::map<std::string, std::string> files_ APPSYNC_GUARDED_BY(mutex_);  // by identifier
};

}  // namespace appsync::host
