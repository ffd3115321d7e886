#pragma once

#include <functional>
#include <mutex>

#include "platform/app_registry.h"
#include "tests/fakes/call_trace.h"

namespace appsync::fakes {

/// The progress of one install. Its setters are traced as "InstallProgress.setInstallState(id, 1)".
class FakeInstallProgress : public InstallProgress {
 public:
  /// `changed` runs, with no lock held, after every change while the install goes on.
  FakeInstallProgress(CallTrace& trace, std::string identifier,
                      std::function<void(bool canceled)> changed)
      : trace_(trace), identifier_(std::move(identifier)), changed_(std::move(changed)) {}

  InstallState installState() const noexcept override;
  void setInstallState(InstallState state) noexcept override;
  InstallPhase installPhase() const noexcept override;
  void setInstallPhase(InstallPhase phase) noexcept override;
  std::int64_t totalUnitCount() const noexcept override;
  void setTotalUnitCount(std::int64_t count) noexcept override;
  std::int64_t completedUnitCount() const noexcept override;
  void setCompletedUnitCount(std::int64_t count) noexcept override;
  void cancel() noexcept override;
  std::string description() const override;

  const std::string& identifier() const { return identifier_; }
  bool isOver() const;

  // The registry's own changes: not traced, and nobody is told.
  void begin(InstallState state, InstallPhase phase);
  /// A Loading phase that ended well is followed by Installing.
  void finishPhase();
  void end(InstallState state);

 private:
  struct Values {
    InstallState state = InstallState::Waiting;
    InstallPhase phase = InstallPhase::Loading;
    std::int64_t total = 0;
    std::int64_t completed = 0;
  };
  template <typename Change>
  void change(std::string line, bool canceled, Change change);
  Values values() const;

  CallTrace& trace_;
  const std::string identifier_;
  mutable std::mutex mutex_;
  Values values_;
  std::function<void(bool)> changed_;
  bool over_ = false;
};

}  // namespace appsync::fakes
