#include "device/home/icon_order.h"

namespace appsync::device {
void appendToIconOrder(Connection& database, std::string_view identifier) {
  Query(database, "INSERT OR IGNORE INTO icon_order (identifier) VALUES (?)", identifier).run();
}

void removeFromIconOrder(Connection& database, std::string_view identifier) {
  Query(database, "DELETE FROM icon_order WHERE identifier = ?", identifier).run();
}

void adoptIconOrder(Connection& database, const std::vector<std::string>& identifiers) {
  const std::vector<std::string> before =
      Query(database, "SELECT identifier FROM icon_order ORDER BY position").texts();
  Query(database, "DELETE FROM icon_order").run();
  for (const std::string& identifier : identifiers) appendToIconOrder(database, identifier);
  for (const std::string& identifier : before) appendToIconOrder(database, identifier);
}

std::vector<std::string> shownIconOrder(Connection& database) {
  return Query(database,
               "SELECT identifier FROM icon_order WHERE identifier IN "
               "(SELECT identifier FROM applications) ORDER BY position")
      .texts();
}

}  // namespace appsync::device
