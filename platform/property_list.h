#pragma once

#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <variant>
#include <vector>

#include "platform/bytes.h"

namespace appsync {

/// A property-list tree: the form of every state file, metadata file, options dictionary and icon
/// layout. A value type: copies are deep, equality compares trees, no call throws but for memory.
///
/// Null stands for "a value is expected here and there is none". It may be held and passed on, but
/// no file can hold it: serialising a tree with a null anywhere in it fails.
class PropertyList {
 public:
  using Array = std::vector<PropertyList>;
  /// Enumerated in the order of its keys' bytes.
  using Dictionary = std::map<std::string, PropertyList, std::less<>>;
  using Data = Bytes;
  struct Date {
    /// Seconds since 2001-01-01T00:00:00Z; may be negative.
    double secondsSince2001 = 0;
    bool operator==(const Date&) const = default;
  };
  enum class Type { Null, Boolean, Integer, Real, String, Data, Date, Array, Dictionary };

  PropertyList() noexcept = default;
  // Out of line, so that not every user compiles the code for nine types.
  PropertyList(const PropertyList& other);
  PropertyList(PropertyList&& other) noexcept;
  PropertyList& operator=(const PropertyList& other);
  PropertyList& operator=(PropertyList&& other) noexcept;
  ~PropertyList();

  PropertyList(bool value) : value_(value) {}
  PropertyList(int value) : value_(std::int64_t{value}) {}
  PropertyList(std::int64_t value) : value_(value) {}
  /// An integer above the signed range keeps its value and is only reachable by asUnsigned().
  PropertyList(std::uint64_t value);
  PropertyList(double value) : value_(value) {}
  PropertyList(const char* text) : value_(std::string(text)) {}
  PropertyList(std::string_view text) : value_(std::string(text)) {}
  PropertyList(std::string text) : value_(std::move(text)) {}
  PropertyList(Data data) : value_(std::move(data)) {}
  PropertyList(Date date) : value_(date) {}
  PropertyList(Array array) : value_(std::move(array)) {}
  PropertyList(Dictionary dictionary) : value_(std::move(dictionary)) {}
  /// Any other pointer would silently become a boolean.
  PropertyList(const void*) = delete;

  static PropertyList null() { return {}; }

  Type type() const;
  bool isNull() const { return type() == Type::Null; }

  // Typed access: nullptr or nullopt when the value is of another type.
  const std::string* asString() const { return std::get_if<std::string>(&value_); }
  const Data* asData() const { return std::get_if<Data>(&value_); }
  const Array* asArray() const { return std::get_if<Array>(&value_); }
  Array* asArray() { return std::get_if<Array>(&value_); }
  const Dictionary* asDictionary() const { return std::get_if<Dictionary>(&value_); }
  Dictionary* asDictionary() { return std::get_if<Dictionary>(&value_); }
  std::optional<bool> asBoolean() const;
  /// nullopt also for an integer above the signed 64-bit range.
  std::optional<std::int64_t> asInteger() const;
  /// nullopt also for a negative integer.
  std::optional<std::uint64_t> asUnsigned() const;
  /// A real, or an integer as a real.
  std::optional<double> asReal() const;
  std::optional<Date> asDate() const;

  /// The value read as a boolean: a boolean itself, a number that is not zero, a string that begins
  /// (after blanks, a sign and zeros) with one of "YyTt" or a digit from 1 to 9. False for all
  /// else.
  bool booleanValue() const;

  /// The value under `key` of a dictionary; nullptr when there is none or this is no dictionary.
  const PropertyList* find(std::string_view key) const;

  bool operator==(const PropertyList& other) const;

 private:
  std::variant<std::monostate, bool, std::int64_t, std::uint64_t, double, std::string, Data, Date,
               Array, Dictionary>
      value_;
};

/// The value under `key`, or nullptr.
const PropertyList* find(const PropertyList::Dictionary& dictionary, std::string_view key);
/// The string under `key`; nullptr when there is none or it is of another type.
const std::string* findString(const PropertyList::Dictionary& dictionary, std::string_view key);
/// The dictionary under `key`; nullptr when there is none or it is of another type.
const PropertyList::Dictionary* findDictionary(const PropertyList::Dictionary& dictionary,
                                               std::string_view key);
/// The data under `key`; nullopt when there is none or it is of another type.
std::optional<PropertyList::Data> findData(const PropertyList::Dictionary& dictionary,
                                           std::string_view key);
/// The strings of the array under `key`; none when there is no array.
std::vector<std::string> findStrings(const PropertyList::Dictionary& dictionary,
                                     std::string_view key);
/// Whether there is a value under `key` that read as a boolean is true.
[[nodiscard]] bool findFlag(const PropertyList::Dictionary& dictionary, std::string_view key);

/// One line for log messages and errors: "(a, b)" for arrays, "{k = v; l = w}" for dictionaries,
/// "<0a0b>" for data (shortened past 16 bytes: "<0a0b... 4096 bytes>"), "1" and "0" for booleans,
/// "2026-01-31T12:00:00Z" for dates, "(null)" for null.
std::string description(const PropertyList& value);
std::string description(const PropertyList::Array& array);
std::string description(const PropertyList::Dictionary& dictionary);

}  // namespace appsync
