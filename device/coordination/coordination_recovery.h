#pragma once

#include "device/coordination/coordination_state.h"
#include "device/state/device_core.h"

namespace appsync::device {

// What is done to the coordination service's store when a device is opened for writing, before
// anything else works on it.

/// Repairs what a killed process left half done, or cancels the coordinator, and logs which. What
/// follows is for the caller to do. nullopt when nothing could be repaired.
std::optional<Consequences> repairCoordination(DeviceCore& device);

/// Removes what nobody can reach any more. Coordinators that are over stay while there are events
/// of theirs to deliver, or something of theirs to tidy up.
void sweepCoordination(DeviceCore& device);

}  // namespace appsync::device
