#include <gtest/gtest.h>

#include "transfer/status_names.h"

namespace appsync {
namespace {

InstallType type(std::uint64_t value) { return static_cast<InstallType>(value); }
InstallState state(std::uint64_t value) { return static_cast<InstallState>(value); }
InstallPhase phase(std::uint64_t value) { return static_cast<InstallPhase>(value); }

TEST(StatusNames, EveryInstallTypeHasItsName) {
  const char* const names[] = {"SWInstallTypeNone",      "SWInstallTypeStoreDownload",
                               "SWInstallTypeRestore",   "SWInstallTypeAutomaticDownload",
                               "SWInstallTypeSync",      "SWInstallTypeAutomaticUpdate",
                               "SWInstallTypeMigration", "SWInstallTypeDowngrade"};
  for (std::uint64_t value = 0; value < 8; ++value) {
    EXPECT_EQ(installTypeName(type(value)), names[value]);
  }
}

TEST(StatusNames, EveryInstallStateHasItsName) {
  const char* const names[] = {"SWInstallStateWaiting", "SWInstallStateActive",
                               "SWInstallStatePaused",  "SWInstallStateCanceled",
                               "SWInstallStateFailed",  "SWInstallStateFinished"};
  for (std::uint64_t value = 0; value < 6; ++value) {
    EXPECT_EQ(installStateName(state(value)), names[value]);
  }
}

TEST(StatusNames, EveryInstallPhaseHasItsName) {
  const char* const names[] = {"SWInstallPhaseLoading", "SWInstallPhaseInstalling",
                               "SWInstallPhaseRestoringData",
                               "SWInstallPhaseInstallingPlaceholder"};
  for (std::uint64_t value = 0; value < 4; ++value) {
    EXPECT_EQ(installPhaseName(phase(value)), names[value]);
  }
}

TEST(StatusNames, UnknownValuesAreNamedByTheirNumber) {
  EXPECT_EQ(installTypeName(type(9)), "Unknown Install Type: 9");
  // Intentional demotion has no name of its own.
  EXPECT_EQ(installTypeName(type(8)), "Unknown Install Type: 8");
  EXPECT_EQ(installStateName(state(6)), "Unknown Install State: 6");
  EXPECT_EQ(installPhaseName(phase(4)), "Unknown Install Phase: 4");
}

}  // namespace
}  // namespace appsync
