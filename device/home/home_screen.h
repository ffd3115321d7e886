#pragma once

#include <atomic>
#include <optional>
#include <string>
#include <vector>

#include "device/state/device_core.h"
#include "platform/home_screen_service.h"
#include "platform/property_list.h"

namespace appsync::device {

/// The home screen: its icon layout is kept in the device's database.
class DeviceHomeScreen final : public HomeScreenService {
 public:
  explicit DeviceHomeScreen(DeviceCore& core) : core_(core) {}

  Port serverPort() noexcept override;
  /// Takes an array, or a dictionary with "iconLists", of identifiers, pages (arrays) and folders
  /// (dictionaries with "iconLists"). An errno value on failure, with nothing changed.
  int setIconState(Port port, ByteView layout) noexcept override;
  std::optional<Bytes> getFlattenedIconState(Port port, int format) noexcept override;
  AssertionResult createTerminationAssertion(std::string_view bundleId,
                                             std::uint32_t flags) noexcept override;

  /// Refuses all assertions from now on.
  void refuseAssertions() noexcept { refusing_ = true; }
  /// The applications and placeholders on the device, in the order of their icons.
  std::vector<std::string> order() noexcept;

 private:
  /// nullopt when it cannot be read.
  std::optional<std::vector<std::string>> readOrder() noexcept;

  DeviceCore& core_;
  std::atomic<bool> refusing_ = false;
};

/// The identifiers of an icon layout in the order in which they are shown, each once; nullopt for
/// what is no layout.
std::optional<std::vector<std::string>> flattenIconLayout(const PropertyList& layout);

}  // namespace appsync::device
