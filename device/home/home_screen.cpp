#include "device/home/home_screen.h"

#include <cerrno>
#include <set>

#include "base/identifiers.h"
#include "device/home/icon_order.h"
#include "device/state/application_rows.h"
#include "platform/property_list_codec.h"

namespace appsync::device {
namespace {

constexpr HomeScreenService::Port ServerPort = 1;
constexpr int FlattenedFormat = 1;
constexpr std::string_view FolderContents = "iconLists";
constexpr AssertionOutcome UnknownError{3};

/// Appends the strings of a page, folder or whole layout; false for what is none of these.
bool flatten(const PropertyList& value, std::vector<std::string>& strings) {
  if (const std::string* text = value.asString()) {
    strings.push_back(*text);
    return true;
  }
  const PropertyList* contents = value.asArray() ? &value : value.find(FolderContents);
  const PropertyList::Array* items = contents ? contents->asArray() : nullptr;
  if (!items) return false;
  for (const PropertyList& item : *items) {
    if (!flatten(item, strings)) return false;
  }
  return true;
}

}  // namespace

std::optional<std::vector<std::string>> flattenIconLayout(const PropertyList& layout) {
  std::vector<std::string> strings;
  if (layout.asString() || !flatten(layout, strings)) return std::nullopt;
  std::vector<std::string> identifiers;
  std::set<std::string_view> seen;
  for (const std::string& text : strings) {
    // A name that no application can have is a thing of the desktop's; its neighbours still count.
    if (isUsableIdentifier(text) && seen.insert(text).second) identifiers.push_back(text);
  }
  return identifiers;
}

HomeScreenService::Port DeviceHomeScreen::serverPort() noexcept { return ServerPort; }

int DeviceHomeScreen::setIconState(Port port, ByteView layout) noexcept {
  if (port != ServerPort) return EINVAL;
  const std::optional<PropertyList> parsed = parsePropertyList(layout);
  const auto identifiers = parsed ? flattenIconLayout(*parsed) : std::nullopt;
  if (!identifiers) return EINVAL;
  const bool adopted =
      core_.database.change("the icon layout could not be kept", Database::Commit::Ordinary,
                            [&](Connection& database) { adoptIconOrder(database, *identifiers); });
  return adopted ? 0 : EIO;
}

std::optional<Bytes> DeviceHomeScreen::getFlattenedIconState(Port port, int format) noexcept {
  if (port != ServerPort || format != FlattenedFormat) return std::nullopt;
  auto order = readOrder();
  if (!order) return std::nullopt;
  PropertyList::Array identifiers;
  for (std::string& identifier : *order) identifiers.emplace_back(std::move(identifier));
  return serializePropertyList(std::move(identifiers), PropertyListFormat::Binary);
}

HomeScreenService::AssertionResult DeviceHomeScreen::createTerminationAssertion(
    std::string_view bundleId, std::uint32_t) noexcept {
  if (refusing_ || !core_.database.writable()) return {nullptr, UnknownError};
  const auto rows = readApplication(core_.database, bundleId);
  if (!rows) return {nullptr, UnknownError};
  if (!rows->installed) return {nullptr, AssertionOutcome::NotFound};
  Foreground::HoldResult result = core_.foreground.hold(std::string(bundleId));
  if (result.isRunning) {
    core_.watcher.assertionDenied(bundleId);
    return {nullptr, AssertionOutcome::Denied};
  }
  const AssertionOutcome outcome = result.hold ? AssertionOutcome::Success : UnknownError;
  return {std::move(result.hold), outcome};
}

std::vector<std::string> DeviceHomeScreen::order() noexcept {
  return readOrder().value_or(std::vector<std::string>{});
}

std::optional<std::vector<std::string>> DeviceHomeScreen::readOrder() noexcept {
  return core_.database.lookUp("the icon order could not be read", shownIconOrder);
}

}  // namespace appsync::device
