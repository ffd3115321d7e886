#include "device/coordination/coordination_rows.h"

#include "platform/property_list_codec.h"

namespace appsync::device {
namespace {

// Rows of what is over stay until the device is next opened for writing, so that whoever still
// holds it reads the last values; those of coordinators with events to deliver stay longer.
constexpr const char* Schema = R"(
CREATE TABLE IF NOT EXISTS install_coordinators (
  number INTEGER PRIMARY KEY AUTOINCREMENT,
  identifier TEXT NOT NULL,
  kind INTEGER NOT NULL,
  creator INTEGER NOT NULL,
  stage INTEGER NOT NULL,
  options BLOB,                  -- property list
  initial_promises BLOB,         -- property list: their numbers
  package_promise INTEGER,
  responsible_client INTEGER NOT NULL,
  user_data_promise INTEGER,
  placeholder INTEGER,
  error BLOB                     -- property list
);
CREATE UNIQUE INDEX IF NOT EXISTS install_coordinators_live
  ON install_coordinators (identifier) WHERE stage IN (0, 1);
-- Who uses a promise is asked with each of its changes.
CREATE INDEX IF NOT EXISTS install_coordinators_package ON install_coordinators (package_promise);
CREATE INDEX IF NOT EXISTS install_coordinators_data ON install_coordinators (user_data_promise);
CREATE INDEX IF NOT EXISTS install_coordinators_placeholder ON install_coordinators (placeholder);

CREATE TABLE IF NOT EXISTS data_promises (
  number INTEGER PRIMARY KEY AUTOINCREMENT,
  sort INTEGER NOT NULL,
  name TEXT NOT NULL,
  client INTEGER NOT NULL,
  disk_space INTEGER NOT NULL,   -- bytes
  path TEXT,
  path_is_directory INTEGER NOT NULL,
  percent REAL NOT NULL,         -- 1.0 is all
  complete INTEGER NOT NULL,
  began INTEGER NOT NULL,        -- its coordinator's client was told so
  over INTEGER NOT NULL
);

CREATE TABLE IF NOT EXISTS install_placeholders (
  number INTEGER PRIMARY KEY AUTOINCREMENT,
  identifier TEXT NOT NULL,
  name TEXT NOT NULL,
  install_type INTEGER NOT NULL,
  client INTEGER NOT NULL,
  icon_promise INTEGER,
  attributes BLOB,               -- property list
  metadata BLOB,                 -- property list
  sinf BLOB,
  configured INTEGER NOT NULL,
  presence INTEGER NOT NULL,
  over INTEGER NOT NULL
);
CREATE INDEX IF NOT EXISTS install_placeholders_icon ON install_placeholders (icon_promise);

-- What is still to be told to somebody.
CREATE TABLE IF NOT EXISTS coordinator_events (
  number INTEGER PRIMARY KEY AUTOINCREMENT,
  coordinator INTEGER NOT NULL,
  kind INTEGER NOT NULL,
  promise INTEGER NOT NULL,
  reason BLOB,                   -- property list
  client INTEGER NOT NULL
);
)";

#define COORDINATOR_COLUMNS                                                             \
  "c.number, c.identifier, c.kind, c.creator, c.stage, c.options, c.initial_promises, " \
  "c.package_promise, c.responsible_client, c.user_data_promise, c.placeholder, c.error"
constexpr int CoordinatorColumns = 12;

CoordinatorRow coordinatorIn(const Query& query) {
  CoordinatorRow row;
  query.take(0, row.number, row.identifier, row.kind, row.creator, row.stage, row.options,
             row.initialPromises, row.package, row.responsible, row.userData, row.placeholder,
             row.error);
  return row;
}

std::optional<CoordinatorRow> firstOf(Query query) {
  return query.next() ? std::optional(coordinatorIn(query)) : std::nullopt;
}

/// A row without a number gets the next one.
std::optional<std::int64_t> keyOf(std::int64_t number) {
  return number == 0 ? std::nullopt : std::optional(number);
}

void take(std::int64_t& number, const Connection& database) {
  if (number == 0) number = database.getLastInsertRowid();
}

constexpr PropertyListFormat Format = PropertyListFormat::Binary;

PropertyList::Dictionary treeOf(const Error& error) {
  PropertyList::Dictionary tree{
      {"Domain", error.domain}, {"Code", error.code}, {"UserInfo", error.userInfo}};
  if (error.underlying) tree.emplace("Underlying", treeOf(*error.underlying));
  return tree;
}

std::optional<Error> errorIn(const PropertyList::Dictionary& tree) {
  const std::string* domain = findString(tree, "Domain");
  const PropertyList* code = find(tree, "Code");
  const auto* info = findDictionary(tree, "UserInfo");
  if (!domain || !code || !code->asInteger() || !info) return std::nullopt;
  Error error{*domain, *code->asInteger(), *info, nullptr};
  const auto* underlying = findDictionary(tree, "Underlying");
  const auto cause = underlying ? errorIn(*underlying) : std::nullopt;
  if (cause) error.underlying = std::make_shared<const Error>(*cause);
  return error;
}

}  // namespace

void makeCoordinationTables(Connection& database) { database.exec(Schema); }

std::optional<CoordinatorRow> findCoordinator(Connection& database, std::int64_t number) {
  return firstOf(Query(database,
                       "SELECT " COORDINATOR_COLUMNS " FROM install_coordinators c "
                       "WHERE c.number = ?",
                       number));
}

std::optional<CoordinatorRow> findLiveCoordinator(Connection& database,
                                                  std::string_view identifier) {
  return firstOf(Query(database,
                       "SELECT " COORDINATOR_COLUMNS " FROM install_coordinators c "
                       "WHERE c.identifier = ? AND c.stage IN (0, 1)",
                       identifier));
}

std::vector<CoordinatorRow> allCoordinators(Connection& database) {
  return Query(database,
               "SELECT " COORDINATOR_COLUMNS " FROM install_coordinators c ORDER BY c.number")
      .all(coordinatorIn);
}

std::vector<CoordinatorRow> coordinatorsUsingPromise(Connection& database, std::int64_t promise) {
  return Query(database,
               "SELECT " COORDINATOR_COLUMNS
               " FROM install_coordinators c "
               "WHERE c.stage IN (0, 1) AND (c.package_promise = ?1 OR c.user_data_promise = ?1 "
               "OR c.placeholder IN "
               "(SELECT number FROM install_placeholders WHERE icon_promise = ?1)) "
               "ORDER BY c.number",
               promise)
      .all(coordinatorIn);
}

std::optional<CoordinatorRow> coordinatorWithPlaceholder(Connection& database,
                                                         std::int64_t placeholder) {
  return firstOf(Query(database,
                       "SELECT " COORDINATOR_COLUMNS " FROM install_coordinators c "
                       "WHERE c.stage IN (0, 1) AND c.placeholder = ?",
                       placeholder));
}

void put(Connection& database, CoordinatorRow& row) {
  Query(database,
        "INSERT OR REPLACE INTO install_coordinators VALUES (?, ?, ?, ?, ?, ?, ?, ?, ?, ?, ?, ?)",
        keyOf(row.number), row.identifier, row.kind, row.creator, row.stage, row.options,
        row.initialPromises, row.package, row.responsible, row.userData, row.placeholder, row.error)
      .run();
  take(row.number, database);
}

std::optional<PromiseRow> findPromise(Connection& database, std::optional<std::int64_t> number) {
  Query query(database,
              "SELECT number, sort, name, client, disk_space, path, path_is_directory, percent, "
              "complete, began, over FROM data_promises WHERE number = ?",
              number);
  if (!query.next()) return std::nullopt;
  PromiseRow row;
  query.take(0, row.number, row.sort, row.name, row.client, row.diskSpace, row.path,
             row.pathIsDirectory, row.percent, row.complete, row.began, row.over);
  return row;
}

void put(Connection& database, PromiseRow& row) {
  Query(database, "INSERT OR REPLACE INTO data_promises VALUES (?, ?, ?, ?, ?, ?, ?, ?, ?, ?, ?)",
        keyOf(row.number), row.sort, row.name, row.client, row.diskSpace, row.path,
        row.pathIsDirectory, row.percent, row.complete, row.began, row.over)
      .run();
  take(row.number, database);
}

std::optional<PlaceholderRow> findPlaceholder(Connection& database,
                                              std::optional<std::int64_t> number) {
  Query query(database,
              "SELECT number, identifier, name, install_type, client, icon_promise, attributes, "
              "metadata, sinf, configured, presence, over FROM install_placeholders "
              "WHERE number = ?",
              number);
  if (!query.next()) return std::nullopt;
  PlaceholderRow row;
  query.take(0, row.number, row.identifier, row.name, row.installType, row.client, row.icon,
             row.attributes, row.metadata, row.sinf, row.configured, row.presence, row.over);
  return row;
}

void put(Connection& database, PlaceholderRow& row) {
  Query(database,
        "INSERT OR REPLACE INTO install_placeholders VALUES (?, ?, ?, ?, ?, ?, ?, ?, ?, ?, ?, ?)",
        keyOf(row.number), row.identifier, row.name, row.installType, row.client, row.icon,
        row.attributes, row.metadata, row.sinf, row.configured, row.presence, row.over)
      .run();
  take(row.number, database);
}

void addEvent(Connection& database, const CoordinatorRow& coordinator, EventKind kind,
              std::uint64_t promise, const std::optional<Bytes>& reason,
              CoordinationClientId client) {
  Query(database, "INSERT INTO coordinator_events VALUES (NULL, ?, ?, ?, ?, ?)", coordinator.number,
        kind, promise, reason, client)
      .run();
}

std::vector<EventRow> pendingEvents(Connection& database) {
  return Query(database, "SELECT " COORDINATOR_COLUMNS
                         ", e.number, e.kind, e.promise, e.reason, e.client "
                         "FROM coordinator_events e JOIN install_coordinators c "
                         "ON c.number = e.coordinator ORDER BY e.number")
      .all([](const Query& query) {
        EventRow event;
        event.coordinator = coordinatorIn(query);
        query.take(CoordinatorColumns, event.number, event.kind, event.promise, event.reason,
                   event.client);
        return event;
      });
}

void removeEvent(Connection& database, std::int64_t number) {
  Query(database, "DELETE FROM coordinator_events WHERE number = ?", number).run();
}

Bytes bytesOf(const Error& error) {
  if (const auto bytes = serializePropertyList(treeOf(error), Format)) return *bytes;
  const Error plain =
      Error::withDescription(error.domain, error.code, error.localizedDescription());
  if (const auto bytes = serializePropertyList(treeOf(plain), Format)) return *bytes;
  const Error bare{std::string(POSIXErrorDomain), error.code, {}, nullptr};
  return serializePropertyList(treeOf(bare), Format).value_or(Bytes{});
}

std::optional<Error> errorFrom(const Bytes& bytes) {
  const auto tree = parseDictionary(bytes);
  return tree ? errorIn(*tree) : std::nullopt;
}

std::optional<Bytes> bytesOf(const InstallOptions& options, std::optional<Error>* error) {
  PropertyList::Dictionary tree{{"InstallType", static_cast<std::uint64_t>(options.installType)},
                                {"TargetType", options.installTargetType}};
  if (options.storeMetadata) tree.emplace("StoreMetadata", options.storeMetadata->values);
  if (options.sinfData) tree.emplace("Sinf", *options.sinfData);
  return serializePropertyList(std::move(tree), Format, error);
}

std::optional<InstallOptions> optionsFrom(const Bytes& bytes) {
  const auto tree = parseDictionary(bytes);
  if (!tree) return std::nullopt;
  const PropertyList* type = find(*tree, "InstallType");
  const PropertyList* target = find(*tree, "TargetType");
  if (!type || !type->asUnsigned() || !target || !target->asUnsigned()) return std::nullopt;
  InstallOptions options;
  options.installType = static_cast<InstallType>(*type->asUnsigned());
  options.installTargetType = *target->asUnsigned();
  if (const auto* metadata = findDictionary(*tree, "StoreMetadata")) {
    options.storeMetadata = StoreMetadata::fromDictionary(*metadata);
  }
  options.sinfData = findData(*tree, "Sinf");
  return options;
}

std::optional<Bytes> bytesOf(const PlaceholderAttributes& attributes, std::optional<Error>* error) {
  PropertyList::Dictionary tree{{"Info", attributes.infoDictionary},
                                {"LaunchProhibited", attributes.launchProhibited}};
  if (attributes.bundleVersion) tree.emplace("Version", *attributes.bundleVersion);
  return serializePropertyList(std::move(tree), Format, error);
}

std::optional<PlaceholderAttributes> attributesFrom(const Bytes& bytes) {
  const auto tree = parseDictionary(bytes);
  const auto* info = tree ? findDictionary(*tree, "Info") : nullptr;
  const PropertyList* prohibited = tree ? find(*tree, "LaunchProhibited") : nullptr;
  if (!info || !prohibited) return std::nullopt;
  PlaceholderAttributes attributes = PlaceholderAttributes::fromInfoDictionary(*info);
  attributes.setLaunchProhibited(prohibited->booleanValue());
  if (const std::string* version = findString(*tree, "Version")) {
    attributes.setBundleVersion(*version);
  }
  return attributes;
}

std::optional<Bytes> bytesOf(const StoreMetadata& metadata, std::optional<Error>* error) {
  return serializePropertyList(metadata.values, Format, error);
}

std::optional<StoreMetadata> metadataFrom(const Bytes& bytes) {
  auto tree = parseDictionary(bytes);
  if (!tree) return std::nullopt;
  return StoreMetadata::fromDictionary(std::move(*tree));
}

std::optional<Bytes> bytesOf(const std::vector<std::int64_t>& numbers) {
  return serializePropertyList(PropertyList::Array(numbers.begin(), numbers.end()), Format);
}

std::optional<std::vector<std::int64_t>> numbersFrom(const Bytes& bytes) {
  const std::optional<PropertyList> value = parsePropertyList(bytes);
  if (!value || !value->asArray()) return std::nullopt;
  std::vector<std::int64_t> numbers;
  for (const PropertyList& item : *value->asArray()) {
    const std::optional<std::int64_t> number = item.asInteger();
    if (!number) return std::nullopt;
    numbers.push_back(*number);
  }
  return numbers;
}

}  // namespace appsync::device
