// The home screen's order of applications, and what it is told of a sync.

#include <tuple>

#include "client/apps_client.h"
#include "client/paths.h"
#include "platform/property_list_codec.h"

namespace appsync {
namespace {

constexpr std::string_view SyncNotification = "com.corvane.dashel.twc.wsyncnotify";
constexpr int FlattenedIconStateFormat = 1;

PropertyList::Array currentOrder(const Platform& platform, const ClientLog& log) {
  const HomeScreenService::Port port = platform.homeScreen.serverPort();
  const std::optional<Bytes> state =
      platform.homeScreen.getFlattenedIconState(port, FlattenedIconStateFormat);
  if (!state) {
    log.normal("got no icon sort order from DS");
    return {};
  }
  log.normal("saved icon sort order");
  // Kept for those who look for mistakes; the order goes on without it.
  std::ignore = platform.files.writeAtomically(paths::SortOrder, *state);
  std::optional<PropertyList> parsed = parsePropertyList(*state);
  PropertyList::Array* order = parsed ? parsed->asArray() : nullptr;
  return order ? std::move(*order) : PropertyList::Array{};
}

}  // namespace

std::vector<PropertyList> AppsClient::_orderTheItems(PropertyList::Dictionary& items) const {
  std::vector<PropertyList> ordered;
  ordered.reserve(items.size());
  for (const PropertyList& element : currentOrder(_platform, _log)) {
    const std::string* identifier = element.asString();
    const auto item = identifier ? items.find(*identifier) : items.end();
    if (item == items.end()) continue;
    _log.normal("prioritize %{public}@", *identifier);
    ordered.push_back(std::move(item->second));
    items.erase(item);
  }
  for (const auto& [identifier, item] : items) {
    _log.normal("lastly %{public}@", identifier);
    ordered.push_back(item);
  }
  return ordered;
}

void AppsClient::_notifyDashel(bool starting) const {
  SystemNotifier& notifier = _platform.systemNotifier;
  const SystemNotifier::Registration registration = notifier.registerCheck(SyncNotification);
  _log.normal("Notifying DS we are %s syncing", starting ? "starting" : "done");
  // Only makes sure that the home screen can be reached before the state changes.
  _platform.homeScreen.serverPort();
  if (registration.status != 0) {
    _log.error("Uh Oh...can't send notification to DS:%d",
               static_cast<std::int32_t>(registration.status));
    return;
  }
  notifier.setState(registration.token, starting ? 1 : 0);
  notifier.post(SyncNotification);
}

}  // namespace appsync
