#include "device/apps/installer_service.h"

#include "device/state/clock.h"

namespace appsync::device {

std::optional<PropertyList::Dictionary> DeviceInstallerService::lookupUninstalled() noexcept {
  return database_.lookUp(
      "the uninstalled applications could not be read", [](Connection& database) {
        PropertyList::Dictionary found;
        Query query(database, "SELECT identifier, time FROM uninstalled");
        while (query.next()) {
          const PropertyList::Date date{query.real(1) - PropertyListEpoch};
          found.emplace(query.text(0), PropertyList::Dictionary{{"Date", date}});
        }
        return found;
      });
}

int DeviceInstallerService::clearUninstalled(const std::vector<std::string>& bundleIds) noexcept {
  std::optional<Error> error;
  const bool cleared = database_.change(
      "the uninstalled applications could not be cleared", Database::Commit::Ordinary,
      [&](Connection& database) {
        for (const std::string& identifier : bundleIds) forgetUninstalled(database, identifier);
      },
      &error);
  return cleared ? 0 : static_cast<int>(error->code);
}

void recordUninstalled(Connection& database, std::string_view identifier) {
  Query(database, "INSERT OR REPLACE INTO uninstalled VALUES (?, ?)", identifier,
        secondsSince1970())
      .run();
}

void forgetUninstalled(Connection& database, std::string_view identifier) {
  Query(database, "DELETE FROM uninstalled WHERE identifier = ?", identifier).run();
}

}  // namespace appsync::device
