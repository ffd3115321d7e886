#include "transfer/status_names.h"

#include <array>
#include <string_view>

#include "client/log_message.h"

namespace appsync {
namespace {

constexpr std::array<std::string_view, 8> TypeNames{
    "SWInstallTypeNone",      "SWInstallTypeStoreDownload",
    "SWInstallTypeRestore",   "SWInstallTypeAutomaticDownload",
    "SWInstallTypeSync",      "SWInstallTypeAutomaticUpdate",
    "SWInstallTypeMigration", "SWInstallTypeDowngrade",
};
constexpr std::array<std::string_view, 6> StateNames{
    "SWInstallStateWaiting",  "SWInstallStateActive", "SWInstallStatePaused",
    "SWInstallStateCanceled", "SWInstallStateFailed", "SWInstallStateFinished",
};
constexpr std::array<std::string_view, 4> PhaseNames{
    "SWInstallPhaseLoading",
    "SWInstallPhaseInstalling",
    "SWInstallPhaseRestoringData",
    "SWInstallPhaseInstallingPlaceholder",
};

}  // namespace

std::string installTypeName(InstallType type) {
  const auto value = static_cast<std::uint64_t>(type);
  if (value < TypeNames.size()) return std::string(TypeNames[value]);
  return logMessage("Unknown Install Type: %lu", value);
}

std::string installStateName(InstallState state) {
  const auto value = static_cast<std::uint64_t>(state);
  if (value < StateNames.size()) return std::string(StateNames[value]);
  return logMessage("Unknown Install State: %lu", value);
}

std::string installPhaseName(InstallPhase phase) {
  const auto value = static_cast<std::uint64_t>(phase);
  if (value < PhaseNames.size()) return std::string(PhaseNames[value]);
  return logMessage("Unknown Install Phase: %lu", value);
}

}  // namespace appsync
