#include "host/transfer/install_watch.h"

#include "host/base/text.h"

namespace appsync::host {

InstallWatch::InstallWatch(const Phone& phone, Reporter& reporter, Interruption& interruption)
    : phone_(phone), reporter_(reporter), interruption_(interruption) {
  phone_.setWatcher(this);
  interruption_.setListener([this] {
    reporter_.report(Interrupted{});
    phone_.hurry();
  });
}

InstallWatch::~InstallWatch() {
  interruption_.setListener({});
  phone_.setWatcher(nullptr);
}

void InstallWatch::assertionDenied(std::string_view bundleId) noexcept {
  reporter_.report(InstallWaiting{std::string(bundleId)});
}

void InstallWatch::installFinished(std::string_view bundleId,
                                   const std::optional<Error>& error) noexcept {
  const std::string identifier(bundleId);
  std::optional<std::string> reason;
  if (error) reason = oneLine(error->localizedDescription());
  {
    const std::lock_guard lock(mutex_);
    if (reason) failures_[identifier] = *reason;
    if (!reason) installed_.insert(identifier);
  }
  reporter_.report(InstallEnded{identifier, std::move(reason)});
}

void InstallWatch::tellInstalled(const std::set<std::string>& identifiers) {
  for (const std::string& identifier : identifiers) {
    const bool isTold = [&] {
      const std::lock_guard lock(mutex_);
      return !installed_.insert(identifier).second;
    }();
    if (!isTold) reporter_.report(InstallEnded{identifier, std::nullopt});
  }
}

std::map<std::string, std::string> InstallWatch::failures() const {
  const std::lock_guard lock(mutex_);
  return failures_;
}

}  // namespace appsync::host
