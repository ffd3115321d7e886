#include "host/restore/restore_list.h"

#include "base/identifiers.h"
#include "base/text.h"
#include "platform/property_list_codec.h"
#include "platform/sync_files.h"

namespace appsync::host {
namespace {

const std::string* nameIn(const PropertyList::Dictionary& metadata) {
  const std::string* title = findString(metadata, "title");
  return title ? title : findString(metadata, "itemName");
}

BackedUpApplication describe(const std::string& identifier, const PropertyList& entry) {
  BackedUpApplication app{identifier, {}, identifier, {}};
  const auto* known = entry.asDictionary();
  const auto bytes = known ? findData(*known, exchange::RestoreMetadataKey) : std::nullopt;
  const auto metadata = bytes ? parseDictionary(*bytes) : std::nullopt;
  if (!isSendableIdentifier(identifier)) {
    app.flaw = "no application can have this identifier";
  } else if (!bytes) {
    app.flaw = "the backup holds no metadata of it";
  } else if (!metadata) {
    app.flaw = "its metadata cannot be read";
  }
  if (!metadata) return app;
  const std::string* version = findString(*metadata, "bundleVersion");
  const std::string* name = nameIn(*metadata);
  if (version) app.version = *version;
  if (name) app.name = *name;
  if (app.flaw.empty() && !version) app.flaw = "its metadata tells no version";
  if (app.flaw.empty() && !name) app.flaw = "its metadata tells no name";
  return app;
}

}  // namespace

std::optional<RestoreList> RestoreList::of(const Backup& backup, std::string& problem) {
  auto entries = parseDictionary(backup.applications);
  if (!entries) {
    problem = "the backup's list of applications cannot be read";
    return std::nullopt;
  }
  RestoreList list;
  list.entries_ = std::move(*entries);
  for (const auto& [identifier, entry] : list.entries_) {
    list.applications_.push_back(describe(identifier, entry));
  }
  return list;
}

bool RestoreList::keepOnly(const std::set<std::string>& identifiers, std::string& problem) {
  for (const std::string& identifier : identifiers) {
    if (names(identifier)) continue;
    problem = "the backup has no application " + printable(identifier);
    return false;
  }
  std::erase_if(entries_, [&](const auto& entry) { return !identifiers.contains(entry.first); });
  std::erase_if(applications_, [&](const BackedUpApplication& app) {
    return !identifiers.contains(app.identifier);
  });
  isPart_ = true;
  return true;
}

std::optional<Bytes> RestoreList::only(const std::set<std::string>& identifiers,
                                       std::optional<Error>* error) const {
  PropertyList::Dictionary chosen;
  for (const auto& entry : entries_) {
    if (identifiers.contains(entry.first)) chosen.insert(entry);
  }
  return serializePropertyList(std::move(chosen), PropertyListFormat::Binary, error);
}

}  // namespace appsync::host
