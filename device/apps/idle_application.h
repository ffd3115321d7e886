#pragma once

#include <memory>
#include <optional>
#include <string>

#include "device/state/application_rows.h"
#include "device/state/device_core.h"

namespace appsync::device {

/// An installed application that nothing is done with meanwhile: it does not run and cannot be
/// brought to the foreground for as long as this lives.
struct IdleApplication {
  ApplicationRow row;
  std::unique_ptr<TerminationAssertion> hold;
};

/// nullopt (with a reason) when it is not installed, is open or is being updated. The identifier is
/// usable and the caller holds its application lock.
[[nodiscard]] std::optional<IdleApplication> holdIdle(DeviceCore& core,
                                                      const std::string& identifier,
                                                      std::optional<Error>* error);

/// "<identifier> <reason>"
Error objection(int code, std::string_view identifier, std::string_view reason);

}  // namespace appsync::device
