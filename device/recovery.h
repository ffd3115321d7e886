#pragma once

#include "device/state/device_core.h"

namespace appsync::device {

/// Finishes what a killed process left of a device that has just been opened for writing:
/// - rows of the registry whose bundle is gone are dropped,
/// - containers that no row names are removed, and data of applications that were being removed,
/// - installs under way are paused, since nobody carries them on: their placeholders stand and
///   whoever brings the package sets them going again; those without a placeholder are forgotten,
/// - half-written files, and what killed processes held or left in the foreground, go.
void finishInterruptedWork(DeviceCore& core);

}  // namespace appsync::device
