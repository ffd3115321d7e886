#include "platform/binary_property_list.h"

#include <algorithm>

namespace appsync {
namespace {

constexpr std::size_t HeaderSize = 8;
constexpr std::size_t TrailerSize = 32;
// Places in the trailer.
constexpr std::size_t OffsetSizeAt = 6;
constexpr std::size_t ReferenceSizeAt = 7;
constexpr std::size_t CountAt = 8;
constexpr std::size_t TopAt = 16;
constexpr std::size_t TableAt = 24;

/// In a marker's low half: the count stands in an integer object after the marker.
constexpr unsigned LongCount = 15;

constexpr const char* Outside = "an object lies outside the file";

bool fits(std::uint64_t value, std::size_t size) { return size >= 8 || value >> 8 * size == 0; }

bool isAscii(std::string_view text) {
  return std::ranges::all_of(text, [](unsigned char c) { return c > 0 && c < 0x80; });
}

}  // namespace

const char* BinaryPropertyList::open(ByteView bytes) {
  bytes_ = bytes;
  if (bytes.size() < HeaderSize + 1 + TrailerSize) return "the file is cut off";
  const std::size_t trailer = bytes.size() - TrailerSize;
  offsetSize_ = byte(trailer + OffsetSizeAt);
  referenceSize_ = byte(trailer + ReferenceSizeAt);
  const std::uint64_t objects = number(trailer + CountAt, 8);
  const std::uint64_t top = number(trailer + TopAt, 8);
  const std::uint64_t table = number(trailer + TableAt, 8);
  if (offsetSize_ < 1 || offsetSize_ > 8 || referenceSize_ < 1 || referenceSize_ > 8)
    return "the trailer is damaged";
  if (table <= HeaderSize || table >= trailer || objects > (trailer - table) / offsetSize_)
    return "the offset table lies outside the file";
  if (top >= objects) return "the top object does not exist";
  objectCount_ = static_cast<std::size_t>(objects);
  topIndex_ = static_cast<std::size_t>(top);
  tableStart_ = static_cast<std::size_t>(table);
  return nullptr;
}

const char* BinaryPropertyList::read(std::size_t index, Object& object) const {
  const std::uint64_t offset = number(tableStart_ + index * offsetSize_, offsetSize_);
  if (offset < HeaderSize || offset >= tableStart_) return Outside;
  const auto at = static_cast<std::size_t>(offset);
  object = {byte(at) >> 4, byte(at) & 15, byte(at) & 15, at + 1, 0};
  if (object.kind < Data) {
    object.count = object.kind == Constant ? 0 : 1;
  } else if (object.info == LongCount) {
    if (const char* problem = readCount(object)) return problem;
  }
  const std::size_t room = tableStart_ - object.start, unit = unitSize(object);
  if (unit > 0 && (object.count > room || object.count * unit > room)) return Outside;
  object.size = static_cast<std::size_t>(object.count) * unit;
  return nullptr;
}

const char* BinaryPropertyList::readCount(Object& object) const {
  if (object.start >= tableStart_) return Outside;
  const unsigned marker = byte(object.start);
  const std::size_t size = std::size_t{1} << (marker & 15);
  if (marker >> 4 != Integer || size > 8) return "an object has no valid length";
  if (size > tableStart_ - object.start - 1) return Outside;
  object.count = number(object.start + 1, size);
  object.start += 1 + size;
  return nullptr;
}

std::size_t BinaryPropertyList::unitSize(const Object& object) const {
  switch (object.kind) {
    case Integer:
    case Real:
    case Date:
      return std::size_t{1} << object.info;
    case Data:
    case Text:
      return 1;
    case Utf16:
      return 2;
    case Array:
      return referenceSize_;
    case Dictionary:
      return 2 * referenceSize_;
    default:
      return 0;
  }
}

bool BinaryPropertyList::objectsLieApart() const {
  std::size_t end = HeaderSize;
  Object object;
  for (std::size_t index = 0; index < objectCount_; ++index) {
    const std::uint64_t offset = number(tableStart_ + index * offsetSize_, offsetSize_);
    if (offset < end || read(index, object)) return false;
    end = object.start + object.size;
  }
  return true;
}

std::optional<std::size_t> BinaryPropertyListEditor::indexOfText(std::string_view text) {
  BinaryPropertyList list;
  if (text.size() >= LongCount || !isAscii(text) || list.open(file_)) return std::nullopt;
  // What was added before stands last.
  BinaryPropertyList::Object object;
  for (std::size_t index = list.objectCount(); index-- > 0;) {
    if (!list.read(index, object) && object.kind == BinaryPropertyList::Text &&
        asText(list.contents(object)) == text)
      return index;
  }
  return add(list, text);
}

std::optional<std::size_t> BinaryPropertyListEditor::add(const BinaryPropertyList& list,
                                                         std::string_view text) {
  const std::size_t index = list.objectCount_, offset = list.tableStart_;
  const std::size_t tableEnd = offset + index * list.offsetSize_;
  const std::size_t offsetSize = list.offsetSize_;
  if (!fits(index, list.referenceSize_) || !fits(offset, offsetSize)) return std::nullopt;

  const std::size_t added = 1 + text.size();
  Bytes grown;
  grown.reserve(file_.size() + added + offsetSize);
  const auto old = file_.begin();
  const auto at = [&](std::size_t place) { return old + static_cast<std::ptrdiff_t>(place); };
  grown.assign(old, at(offset));
  grown.push_back(std::byte(BinaryPropertyList::Text << 4 | text.size()));
  grown.insert(grown.end(), asBytes(text).begin(), asBytes(text).end());
  grown.insert(grown.end(), at(offset), at(tableEnd));
  grown.insert(grown.end(), offsetSize, std::byte{});
  grown.insert(grown.end(), at(tableEnd), file_.end());
  file_ = std::move(grown);

  put(tableEnd + added, offsetSize, offset);
  const std::size_t trailer = file_.size() - TrailerSize;
  put(trailer + CountAt, 8, index + 1);
  put(trailer + TableAt, 8, offset + added);
  return index;
}

void BinaryPropertyListEditor::refer(std::size_t place, std::size_t index) {
  const std::size_t trailer = file_.size() - TrailerSize;
  put(place, std::to_integer<std::size_t>(file_[trailer + ReferenceSizeAt]), index);
}

void BinaryPropertyListEditor::put(std::size_t at, std::size_t size, std::uint64_t value) {
  for (std::size_t i = size; i-- > 0; value >>= 8) file_[at + i] = std::byte(value & 0xff);
}

}  // namespace appsync
