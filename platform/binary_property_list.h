#pragma once

#include <bit>
#include <cstdint>
#include <cstring>
#include <optional>
#include <string_view>

#include "platform/bytes.h"

namespace appsync {

/// A binary property list read where it lies: nothing is built or copied. Borrows the bytes, which
/// may come from anywhere: each offset, size, count and reference is checked when it is followed.
/// What is wrong is told in one line, as a pointer to text that lives for ever; nullptr: nothing
/// is.
///
/// The file: eight bytes of name, the objects, the table of their offsets, a trailer. An array
/// holds references to its elements, a dictionary references to all its keys and then to all its
/// values.
class BinaryPropertyList {
 public:
  enum Kind : unsigned {
    Constant = 0x0,
    Integer = 0x1,
    Real = 0x2,
    Date = 0x3,
    Data = 0x4,
    Text = 0x5,   ///< ASCII, or UTF-8
    Utf16 = 0x6,  ///< big-endian
    Uid = 0x8,
    Array = 0xa,
    Dictionary = 0xd,
  };
  struct Object {
    unsigned kind = 0;        ///< one of Kind, or what no property list has
    unsigned info = 0;        ///< the marker's low half
    std::uint64_t count = 0;  ///< bytes or units of a text, elements or pairs of a container
    std::size_t start = 0;    ///< where the contents begin,
    std::size_t size = 0;     ///< and how many bytes they take: all of them lie in the file
  };

  /// True for bytes that begin as a binary property list does.
  static bool isMeant(ByteView bytes) { return asText(bytes).starts_with("bplist00"); }

  /// Reads the trailer of a file that is meant to be one.
  const char* open(ByteView bytes);

  std::size_t objectCount() const { return objectCount_; }
  std::size_t topIndex() const { return topIndex_; }

  /// The object of an index below objectCount().
  const char* read(std::size_t index, Object& object) const;

  /// Where reference `number` of an array or dictionary lies; it must be one of theirs.
  std::size_t placeOfReference(const Object& container, std::size_t number) const {
    return container.start + number * referenceSize_;
  }
  /// The index that the reference there tells; it may be that of no object.
  std::uint64_t reference(std::size_t place) const { return number(place, referenceSize_); }

  /// A big-endian number of one to eight bytes within the objects.
  std::uint64_t number(std::size_t at, std::size_t size) const {
    // The eight bytes that end with it: the file's own eight bytes of name lie before any number.
    std::uint64_t value;
    std::memcpy(&value, bytes_.data() + at + size - sizeof value, sizeof value);
    if constexpr (std::endian::native == std::endian::little) value = __builtin_bswap64(value);
    return value & ~std::uint64_t{0} >> (64 - 8 * size);
  }
  ByteView contents(const Object& object) const {
    return bytes_.subspan(object.start, object.size);
  }

  /// True when each object begins behind the end of the one before, as all common writers have it:
  /// then no two share a byte, and one may be changed without the others.
  bool objectsLieApart() const;

 private:
  friend class BinaryPropertyListEditor;

  const char* readCount(Object& object) const;
  /// Bytes that a unit of the object's count takes.
  std::size_t unitSize(const Object& object) const;
  unsigned byte(std::size_t at) const { return std::to_integer<unsigned>(bytes_[at]); }

  ByteView bytes_;
  std::size_t offsetSize_ = 0;
  std::size_t referenceSize_ = 0;
  std::size_t objectCount_ = 0;
  std::size_t topIndex_ = 0;
  std::size_t tableStart_ = 0;
};

/// Changes single values of a checked binary property list whose objects lie apart.
class BinaryPropertyListEditor {
 public:
  explicit BinaryPropertyListEditor(Bytes& file) : file_(file) {}

  /// The index of an object with this text, which is added when there is none. nullopt, with
  /// nothing changed, for a text that is long or not ASCII, and when the file's sizes leave no
  /// room.
  std::optional<std::size_t> indexOfText(std::string_view text);
  /// Makes the reference at `place` one to the object `index`.
  void refer(std::size_t place, std::size_t index);

 private:
  std::optional<std::size_t> add(const BinaryPropertyList& list, std::string_view text);
  void put(std::size_t at, std::size_t size, std::uint64_t value);

  Bytes& file_;
};

}  // namespace appsync
