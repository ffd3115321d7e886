#include "host/transfer/install_watch.h"

#include "base/text.h"

namespace appsync::host {

InstallWatch::InstallWatch(const Phone& phone, Reporter& reporter, Interruption& interruption)
    : phone_(phone), reporter_(reporter), interruption_(interruption) {
  phone_.activity.setWatcher(this);
  interruption_.setListener([this] {
    reporter_.report(Interrupted{});
    phone_.activity.expedite();
  });
}

InstallWatch::~InstallWatch() {
  interruption_.setListener({});
  phone_.activity.setWatcher(nullptr);
}

void InstallWatch::assertionDenied(std::string_view bundleId) noexcept {
  reporter_.report(InstallWaiting{std::string(bundleId)});
}

void InstallWatch::installFinished(std::string_view bundleId,
                                   const std::optional<Error>& error) noexcept {
  InstallEnded ended{std::string(bundleId), std::nullopt};
  if (error) ended.failure = oneLine(error->localizedDescription());
  {
    const Lock lock(mutex_);
    if (ended.failure) failures_[ended.identifier] = *ended.failure;
    if (!ended.failure) installed_.insert(ended.identifier);
    const auto file = files_.find(ended.identifier);
    if (file != files_.end()) ended.file = file->second;
  }
  reporter_.report(ended);
}

void InstallWatch::nameFilesOf(const Library& library) {
  const Lock lock(mutex_);
  for (const auto& [identifier, package] : library.packages) {
    files_.emplace(identifier, package.file.filename().string());
  }
}

void InstallWatch::tellInstalled(const std::set<std::string>& identifiers) {
  for (const std::string& identifier : identifiers) {
    const bool isTold = [&] {
      const Lock lock(mutex_);
      return !installed_.insert(identifier).second;
    }();
    if (!isTold) reporter_.report(InstallEnded{identifier, std::nullopt});
  }
}

std::map<std::string, std::string> InstallWatch::failures() const {
  const Lock lock(mutex_);
  return failures_;
}

}  // namespace appsync::host
