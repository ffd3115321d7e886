#pragma once

#include <optional>
#include <string>

#include "device/state/device_core.h"

namespace appsync::device {

// What a person wants of an application of which only a placeholder is left: that it comes, or not.
// Whoever changes something holds the lock of the application, whose identifier is usable.

/// What taking a wish back would do.
enum class Cancelling {
  Nothing,     ///< there is no wish, or an install is under way
  Undoing,     ///< the placeholder becomes what it was before it was asked for
  Forgetting,  ///< the application goes like one that is uninstalled: it only waits to be restored
};

/// A demoted or restored application is to come: its placeholder becomes that of a download from
/// the store. False when there is no such placeholder, and with an error when that is not known or
/// cannot be written.
[[nodiscard]] bool askFor(DeviceCore& core, const std::string& identifier,
                          std::optional<Error>* error);

/// nullopt (with an error) when it cannot be told.
[[nodiscard]] std::optional<Cancelling> effectOfCancelling(DeviceCore& core,
                                                           const std::string& identifier,
                                                           std::optional<Error>* error);

/// Takes the wish back. False when there is none, and with an error when that is forbidden, not
/// known or cannot be written.
[[nodiscard]] bool cancelWish(DeviceCore& core, const std::string& identifier,
                              std::optional<Error>* error);

/// Of an application that was asked for: its placeholder is what it was before. False with an
/// error.
[[nodiscard]] bool undoAsking(DeviceCore& core, const std::string& identifier,
                              std::optional<Error>* error);

}  // namespace appsync::device
