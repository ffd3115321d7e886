#include "transfer/transfer_rules.h"

namespace appsync {
namespace {

using Verdict = std::optional<TransferVerdict>;

Verdict skip(std::string line) { return TransferVerdict{true, std::move(line)}; }

Verdict installationDisabled(const TransferCandidate& app, const TransferContext& context) {
  if (context.installationAllowed || app.isRestore) return std::nullopt;
  return skip(logMessage("skipping %{public}@ - its not a restore and app installation is disabled",
                         app.identifier));
}

Verdict ignoredRestore(const TransferCandidate& app, const TransferContext& context) {
  if (!app.isRestore || !context.qlpAppsToIgnore.contains(app.identifier)) return std::nullopt;
  return skip(logMessage("%{public}@ is currenlty marked as to be ignored for download - skipping",
                         app.identifier));
}

/// With coordination on, the store drives restores.
Verdict coordinatedRestore(const TransferCandidate& app, const TransferContext& context) {
  if (!app.isRestore || !context.useInstallCoordinator) return std::nullopt;
  return skip(logMessage(
      "%{public}@ is currenlty marked to be restored and will be handled by kioskd - skipping",
      app.identifier));
}

Verdict coordinatedSystemApp(const TransferCandidate& app, const TransferContext& context) {
  if (!app.isSystemApp || !context.useInstallCoordinator) return std::nullopt;
  return skip(
      logMessage("%{public}@ is auto demoted: %d, manual demoted: %d, system app:%d - skipping",
                 app.identifier, app.isAutoDemoted, app.isIntentionallyDemoted, 1));
}

Verdict systemAppPlaceholder(const TransferCandidate& app, const TransferContext& context) {
  if (!context.systemAppPlaceholders.contains(app.identifier)) return std::nullopt;
  return skip(logMessage("%{public}@ is system app placeholder - skipping", app.identifier));
}

/// Both lines print the automatic flag first, against their labels: readers of old logs expect the
/// values in these places.
Verdict demoted(const TransferCandidate& app, const TransferContext& context) {
  const bool isDemoted = app.isAutoDemoted || app.isIntentionallyDemoted;
  if (!isDemoted || !context.useInstallCoordinator) return std::nullopt;
  if (!context.wanted.contains(app.identifier)) {
    return skip(logMessage("%{public}@ is currenlty demoted (manual:%d, auto:%d) - skipping",
                           app.identifier, app.isAutoDemoted, app.isIntentionallyDemoted));
  }
  return TransferVerdict{
      false, logMessage("%{public}@ is currenlty demoted (manual:%d, auto:%d) - but will be "
                        "installed as it's requested by client",
                        app.identifier, app.isAutoDemoted, app.isIntentionallyDemoted)};
}

constexpr TransferRule Rules[] = {
    {"installation disabled", installationDisabled},
    {"restore to be ignored", ignoredRestore},
    {"restore driven by the store", coordinatedRestore},
    {"system application", coordinatedSystemApp},
    {"system application's placeholder", systemAppPlaceholder},
    {"demoted", demoted},
};

}  // namespace

std::span<const TransferRule> transferRules() { return Rules; }

bool isWanted(const TransferCandidate& candidate, const TransferContext& context,
              const ClientLog& log) {
  for (const TransferRule& rule : transferRules()) {
    const Verdict verdict = rule.judge(candidate, context);
    if (!verdict) continue;
    log.write(LogLevel::Default, verdict->line);
    if (verdict->skip) return false;
  }
  return true;
}

}  // namespace appsync
