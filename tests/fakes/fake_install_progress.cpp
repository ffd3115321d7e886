#include "tests/fakes/fake_install_progress.h"

#include <utility>

namespace appsync::fakes {

namespace {

template <typename Enum>
std::uint64_t number(Enum value) {
  return static_cast<std::uint64_t>(value);
}

}  // namespace

template <typename Change>
void FakeInstallProgress::change(std::string line, bool canceled, Change apply) {
  trace_.add(TraceCall, std::move(line));
  std::function<void(bool)> changed;
  {
    const std::scoped_lock lock(mutex_);
    if (over_) return;
    apply(values_);
    changed = changed_;
  }
  if (changed) changed(canceled);
}

FakeInstallProgress::Values FakeInstallProgress::values() const {
  const std::scoped_lock lock(mutex_);
  return values_;
}

InstallState FakeInstallProgress::installState() const noexcept { return values().state; }

void FakeInstallProgress::setInstallState(InstallState state) noexcept {
  change(callText("InstallProgress.setInstallState", identifier_, number(state)), false,
         [&](Values& values) { values.state = state; });
}

InstallPhase FakeInstallProgress::installPhase() const noexcept { return values().phase; }

void FakeInstallProgress::setInstallPhase(InstallPhase phase) noexcept {
  change(callText("InstallProgress.setInstallPhase", identifier_, number(phase)), false,
         [&](Values& values) { values.phase = phase; });
}

std::int64_t FakeInstallProgress::totalUnitCount() const noexcept { return values().total; }

void FakeInstallProgress::setTotalUnitCount(std::int64_t count) noexcept {
  change(callText("InstallProgress.setTotalUnitCount", identifier_, count), false,
         [&](Values& values) { values.total = count; });
}

std::int64_t FakeInstallProgress::completedUnitCount() const noexcept { return values().completed; }

void FakeInstallProgress::setCompletedUnitCount(std::int64_t count) noexcept {
  change(callText("InstallProgress.setCompletedUnitCount", identifier_, count), false,
         [&](Values& values) { values.completed = count; });
}

void FakeInstallProgress::cancel() noexcept {
  change(callText("InstallProgress.cancel", identifier_), true,
         [](Values& values) { values.state = InstallState::Canceled; });
}

std::string FakeInstallProgress::description() const {
  return "<InstallProgress " + identifier_ + ">";
}

bool FakeInstallProgress::isOver() const {
  const std::scoped_lock lock(mutex_);
  return over_;
}

void FakeInstallProgress::begin(InstallState state, InstallPhase phase) {
  const std::scoped_lock lock(mutex_);
  values_.state = state;
  values_.phase = phase;
}

void FakeInstallProgress::finishPhase() {
  const std::scoped_lock lock(mutex_);
  const bool failed =
      values_.state == InstallState::Failed || values_.state == InstallState::Canceled;
  if (!over_ && !failed && values_.phase == InstallPhase::Loading) {
    values_.phase = InstallPhase::Installing;
  }
}

void FakeInstallProgress::end(InstallState state) {
  const std::scoped_lock lock(mutex_);
  if (over_) return;
  values_.state = state;
  over_ = true;
  changed_ = nullptr;
}

}  // namespace appsync::fakes
