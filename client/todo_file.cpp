#include "client/todo_file.h"

#include <algorithm>
#include <utility>

#include "platform/property_list_bounds.h"
#include "platform/sync_files.h"

namespace appsync {
namespace {

using Object = BinaryPropertyList::Object;

/// Half of what a property list may hold, so that no change makes one too large to be read.
constexpr PropertyListLimits Limits{.bytes = PropertyListLimits{}.bytes / 2,
                                    .objects = PropertyListLimits{}.objects / 2};

/// The object that the reference at `place` of a checked list leads to.
Object objectAt(const BinaryPropertyList& list, std::size_t place) {
  Object object;
  list.read(static_cast<std::size_t>(list.reference(place)), object);
  return object;
}

/// The text that the reference at `place` leads to, as long as the file's bytes are its characters.
std::optional<std::string_view> textAt(const BinaryPropertyList& list, std::size_t place) {
  const Object object = objectAt(list, place);
  if (object.kind != BinaryPropertyList::Text) return std::nullopt;
  return asText(list.contents(object));
}

/// Where an entry refers to what a todo list is read for.
struct EntryPlaces {
  std::size_t identifier = 0;
  std::size_t operation = 0;
};

/// nullopt unless the object is a dictionary that holds both, once each.
std::optional<EntryPlaces> placesIn(const BinaryPropertyList& list, const Object& entry) {
  if (entry.kind != BinaryPropertyList::Dictionary) return std::nullopt;
  const auto count = static_cast<std::size_t>(entry.count);
  EntryPlaces places;
  for (std::size_t i = 0; i < count; ++i) {
    const auto key = textAt(list, list.placeOfReference(entry, i));
    if (!key) return std::nullopt;
    std::size_t* place = *key == exchange::TodoIdentifierKey  ? &places.identifier
                         : *key == exchange::TodoOperationKey ? &places.operation
                                                              : nullptr;
    if (!place) continue;
    if (*place) return std::nullopt;
    *place = list.placeOfReference(entry, count + i);
  }
  return places.identifier && places.operation ? std::optional(places) : std::nullopt;
}

Object entryAt(const BinaryPropertyList& list, const Object& array, std::size_t position) {
  return objectAt(list, list.placeOfReference(array, position));
}

Object topOf(const BinaryPropertyList& list) {
  Object top;
  list.read(list.topIndex(), top);
  return top;
}

/// True for a sound file of which a part may be changed without any other.
bool isPlain(ByteView bytes, BinaryPropertyList& list) {
  bool sharesContainers = false;
  return BinaryPropertyList::isMeant(bytes) && !list.open(bytes) &&
         !problemOf(list, Limits, &sharesContainers) && !sharesContainers && list.objectsLieApart();
}

/// nullopt when it is not plain, or no array of entries that are as they should be.
std::optional<std::vector<std::uint32_t>> entriesByIdentifier(ByteView bytes) {
  BinaryPropertyList list;
  if (!isPlain(bytes, list)) return std::nullopt;
  const Object top = topOf(list);
  if (top.kind != BinaryPropertyList::Array) return std::nullopt;
  std::vector<std::pair<std::string_view, std::uint32_t>> entries;
  entries.reserve(static_cast<std::size_t>(top.count));
  for (std::uint32_t position = 0; position < top.count; ++position) {
    const auto places = placesIn(list, entryAt(list, top, position));
    const auto identifier = places ? textAt(list, places->identifier) : std::nullopt;
    if (!identifier || !textAt(list, places->operation)) return std::nullopt;
    entries.emplace_back(*identifier, position);
  }
  std::ranges::sort(entries);
  std::vector<std::uint32_t> positions;
  positions.reserve(entries.size());
  for (const auto& entry : entries) positions.push_back(entry.second);
  return positions;
}

}  // namespace

bool TodoFile::take(Bytes& list) {
  if (!bytes_.empty() && asText(bytes_) == asText(list)) {
    list = Bytes();
    return true;
  }
  bytes_ = Bytes();
  byIdentifier_.clear();
  auto sorted = entriesByIdentifier(list);
  if (!sorted) return false;
  byIdentifier_ = std::move(*sorted);
  bytes_ = std::exchange(list, Bytes());
  return true;
}

BinaryPropertyList TodoFile::list() const {
  BinaryPropertyList list;
  list.open(bytes_);
  return list;
}

std::optional<std::size_t> TodoFile::placeOfOperation(std::string_view identifier) const {
  if (byIdentifier_.empty()) return std::nullopt;
  const BinaryPropertyList file = list();
  const Object top = topOf(file);
  const auto placesOf = [&](std::uint32_t position) {
    return *placesIn(file, entryAt(file, top, position));
  };
  const auto identifierOf = [&](std::uint32_t position) {
    return *textAt(file, placesOf(position).identifier);
  };
  const auto found = std::ranges::lower_bound(byIdentifier_, identifier, {}, identifierOf);
  if (found == byIdentifier_.end() || identifierOf(*found) != identifier) return std::nullopt;
  return placesOf(*found).operation;
}

std::optional<std::string_view> TodoFile::operationOf(std::string_view identifier) const {
  const auto place = placeOfOperation(identifier);
  return place ? textAt(list(), *place) : std::nullopt;
}

bool TodoFile::setOperation(std::string_view identifier, std::string_view operation) {
  const auto place = placeOfOperation(identifier);
  BinaryPropertyListEditor editor(bytes_);
  const auto index = place ? editor.indexOfText(operation) : std::nullopt;
  if (index) editor.refer(*place, *index);
  return index.has_value();
}

}  // namespace appsync
