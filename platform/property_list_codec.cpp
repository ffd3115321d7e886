#include "platform/property_list_codec.h"

#include <locale.h>
#include <plist/plist.h>

#include <bit>
#include <cmath>
#include <cstdlib>
#include <limits>
#include <memory>

#include "platform/property_list_bounds.h"
#include "platform/property_list_xml_values.h"
#include "platform/utf8.h"

namespace appsync {
namespace {

struct NodeDeleter {
  using pointer = plist_t;
  void operator()(plist_t node) const { plist_free(node); }
};
using Node = std::unique_ptr<void, NodeDeleter>;

struct Freed {
  void operator()(void* memory) const { std::free(memory); }
};
template <class T>
using Allocated = std::unique_ptr<T, Freed>;

/// The library reads and prints reals with the decimal point of the thread's locale.
class PlainLocale {
 public:
  PlainLocale() : previous_(uselocale(plain())) {}
  ~PlainLocale() { uselocale(previous_); }
  PlainLocale(const PlainLocale&) = delete;
  PlainLocale& operator=(const PlainLocale&) = delete;

 private:
  static locale_t plain() {
    static const locale_t locale = newlocale(LC_ALL_MASK, "C", nullptr);
    return locale;
  }
  locale_t previous_;
};

Error failure(std::string_view text) {
  return Error::withDescription(PropertyListErrorDomain, 0, text);
}

// The library's own calls lose the sign bit's meaning of an integer above the signed range, and all
// of a date beyond 32-bit seconds. The binary form of the single value keeps both, so such values
// cross the border as a file of one object: header, marker and contents, offset table, trailer.

constexpr unsigned char UnsignedMarker = 0x14;
constexpr unsigned char DateMarker = 0x33;
constexpr std::size_t MarkerAt = 8;

unsigned char markerOf(std::string_view file) { return static_cast<unsigned char>(file[MarkerAt]); }

std::string binaryFileOf(plist_t node) {
  char* bytes = nullptr;
  std::uint32_t size = 0;
  plist_to_bin(node, &bytes, &size);
  const Allocated<char> owned(bytes);
  return std::string(bytes, bytes ? size : 0);
}

std::string bigEndian(std::uint64_t value) {
  std::string out;
  for (int shift = 56; shift >= 0; shift -= 8) out += static_cast<char>(value >> shift & 0xff);
  return out;
}

Node nodeOfBinaryObject(unsigned char marker, const std::string& contents) {
  std::string file = "bplist00";
  file += static_cast<char>(marker);
  file += contents;
  const std::uint64_t table = file.size();
  file += static_cast<char>(MarkerAt);
  file += std::string(6, '\0') + "\x01\x01" + bigEndian(1) + bigEndian(0) + bigEndian(table);
  plist_t node = nullptr;
  plist_from_bin(file.data(), static_cast<std::uint32_t>(file.size()), &node);
  return Node(node);
}

/// Turns the library's tree into ours.
class TreeReader {
 public:
  explicit TreeReader(bool dictionariesAreArrays) : dictionariesAreArrays_(dictionariesAreArrays) {}

  /// nullopt when the tree holds what no property list has.
  std::optional<PropertyList> read(plist_t node) {
    PropertyList value = valueOf(node);
    return complete_ ? std::optional(std::move(value)) : std::nullopt;
  }

 private:
  PropertyList valueOf(plist_t node) {
    switch (plist_get_node_type(node)) {
      case PLIST_BOOLEAN: {
        std::uint8_t value = 0;
        plist_get_bool_val(node, &value);
        return value != 0;
      }
      case PLIST_UINT:
        return integerOf(node);
      case PLIST_REAL: {
        double value = 0;
        plist_get_real_val(node, &value);
        return value;
      }
      case PLIST_STRING:
        return textOf(node);
      case PLIST_DATA: {
        std::uint64_t size = 0;
        const auto* bytes = reinterpret_cast<const std::byte*>(plist_get_data_ptr(node, &size));
        return PropertyList::Data(bytes, bytes + size);
      }
      case PLIST_DATE:
        return dateOf(node);
      case PLIST_ARRAY:
        return arrayOf(node);
      case PLIST_DICT:
        return dictionaryOf(node);
      default:
        complete_ = false;
        return {};
    }
  }

  static std::string textOf(plist_t node) {
    std::uint64_t size = 0;
    const char* text = plist_get_string_ptr(node, &size);
    return std::string(text, static_cast<std::size_t>(size));
  }

  PropertyList integerOf(plist_t node) {
    std::uint64_t value = 0;
    plist_get_uint_val(node, &value);
    const bool plain = value <= std::uint64_t{std::numeric_limits<std::int64_t>::max()};
    if (plain || markerOf(binaryFileOf(node)) == UnsignedMarker) return value;
    return static_cast<std::int64_t>(value);
  }

  PropertyList dateOf(plist_t node) {
    const std::string file = binaryFileOf(node);
    std::uint64_t bits = 0;
    for (std::size_t i = 1; i <= sizeof bits; ++i)
      bits = bits << 8 | static_cast<unsigned char>(file[MarkerAt + i]);
    const PropertyList::Date date{std::bit_cast<double>(bits)};
    if (!std::isfinite(date.secondsSince2001)) complete_ = false;
    return date;
  }

  PropertyList arrayOf(plist_t node) {
    plist_array_iter position = nullptr;
    plist_array_new_iter(node, &position);
    const Allocated<void> owned(position);
    const auto next = [&] {
      plist_t item = nullptr;
      plist_array_next_item(node, position, &item);
      return item;
    };
    if (dictionariesAreArrays_ && plist_bool_val_is_true(next())) return dictionaryOf(next);
    PropertyList::Array array;
    array.reserve(plist_array_get_size(node));
    while (const plist_t item = next()) array.push_back(valueOf(item));
    return array;
  }

  template <class Next>
  PropertyList dictionaryOf(const Next& next) {
    PropertyList::Dictionary dictionary;
    while (const plist_t key = next()) dictionary.insert_or_assign(textOf(key), valueOf(next()));
    return dictionary;
  }

  PropertyList dictionaryOf(plist_t node) {
    PropertyList::Dictionary dictionary;
    plist_dict_iter position = nullptr;
    plist_dict_new_iter(node, &position);
    const Allocated<void> owned(position);
    for (;;) {
      char* key = nullptr;
      plist_t item = nullptr;
      plist_dict_next_item(node, position, &key, &item);
      const Allocated<char> ownedKey(key);
      if (!item) return dictionary;
      dictionary.insert_or_assign(key, valueOf(item));
    }
  }

  const bool dictionariesAreArrays_;
  bool complete_ = true;
};

/// Turns our tree into the library's.
class TreeWriter {
 public:
  explicit TreeWriter(PropertyListFormat format) : isXml_(format == PropertyListFormat::Xml) {}

  /// Null when the tree cannot be written; `problem` says why.
  Node write(const PropertyList& value) {
    Node node = nodeOf(value, 0);
    return problem_ ? nullptr : std::move(node);
  }
  const char* problem() const { return problem_ ? problem_ : "out of memory"; }

 private:
  Node fail(const char* problem) {
    if (!problem_) problem_ = problem;
    return nullptr;
  }

  /// True when the tree stays within what the parser accepts, with `bytes` more in it.
  bool count(std::size_t bytes) {
    ++objects_;
    bytes_ += bytes;
    if (objects_ > limits_.objects) fail("it holds too many objects");
    if (bytes_ > limits_.bytes) fail("it is too large");
    return !problem_;
  }

  bool checkText(const std::string& text) {
    if (text.find('\0') != text.npos) fail("a string holds a NUL character");
    if (!isUtf8(text)) fail("a string is not valid UTF-8");
    if (isXml_ && !isXmlText(text)) fail("a string holds a control character");
    return count(text.size());
  }

  Node nodeOf(const PropertyList& value, std::size_t depth) {
    switch (value.type()) {
      case PropertyList::Type::Null:
        return fail("it holds a null");
      case PropertyList::Type::Boolean:
        return count(0) ? Node(plist_new_bool(*value.asBoolean())) : nullptr;
      case PropertyList::Type::Integer:
        return count(0) ? integerNode(value) : nullptr;
      case PropertyList::Type::Real:
        return count(0) ? Node(plist_new_real(*value.asReal())) : nullptr;
      case PropertyList::Type::String:
        return checkText(*value.asString()) ? Node(plist_new_string(value.asString()->c_str()))
                                            : nullptr;
      case PropertyList::Type::Data:
        return count(value.asData()->size()) ? dataNode(*value.asData()) : nullptr;
      case PropertyList::Type::Date:
        return count(0) ? dateNode(value.asDate()->secondsSince2001) : nullptr;
      case PropertyList::Type::Array:
        return enter(depth) ? arrayNode(*value.asArray(), depth + 1) : nullptr;
      case PropertyList::Type::Dictionary:
        return enter(depth) ? dictionaryNode(*value.asDictionary(), depth + 1) : nullptr;
    }
    return nullptr;
  }

  bool enter(std::size_t depth) {
    if (depth >= limits_.depth) fail("it is nested too deeply");
    return count(0);
  }

  Node integerNode(const PropertyList& value) {
    if (const auto number = value.asInteger())
      return Node(plist_new_uint(static_cast<std::uint64_t>(*number)));
    return nodeOfBinaryObject(UnsignedMarker, bigEndian(0) + bigEndian(*value.asUnsigned()));
  }

  Node dataNode(const PropertyList::Data& data) {
    const auto* bytes = reinterpret_cast<const char*>(data.data());
    return Node(plist_new_data(data.empty() ? "" : bytes, data.size()));
  }

  Node dateNode(double seconds) {
    constexpr double year1000 = -31588963200.0, year10000 = 252423993600.0;
    if (!std::isfinite(seconds)) return fail("a date is no finite number");
    if (isXml_) seconds = std::floor(seconds);
    if (isXml_ && (seconds < year1000 || seconds >= year10000))
      return fail("a date is outside the years 1000 to 9999");
    return nodeOfBinaryObject(DateMarker, bigEndian(std::bit_cast<std::uint64_t>(seconds)));
  }

  Node arrayNode(const PropertyList::Array& array, std::size_t depth) {
    Node node(plist_new_array());
    for (const PropertyList& element : array) {
      Node item = nodeOf(element, depth);
      if (!item) return nullptr;
      plist_array_append_item(node.get(), item.release());
    }
    return node;
  }

  Node dictionaryNode(const PropertyList::Dictionary& dictionary, std::size_t depth) {
    Node node(plist_new_dict());
    for (const auto& [key, value] : dictionary) {
      Node item = checkText(key) ? nodeOf(value, depth) : nullptr;
      if (!item) return nullptr;
      plist_dict_set_item(node.get(), key.c_str(), item.release());
    }
    return node;
  }

  const PropertyListLimits limits_;
  bool isXml_;
  std::size_t objects_ = 0;
  std::size_t bytes_ = 0;
  const char* problem_ = nullptr;
};

constexpr std::string_view ByteOrderMark = "\xef\xbb\xbf";

/// The library's tree of bytes that have passed every check; null with `problem` otherwise.
Node parsedNode(ByteView bytes, const PropertyListLimits& limits, std::string& problem) {
  std::string_view text = asText(bytes);
  plist_t node = nullptr;
  if (BinaryPropertyList::isMeant(bytes)) {
    BinaryPropertyList list;
    const char* found = list.open(bytes);
    if (!found) found = problemOf(list, limits);
    if (found) {
      problem = found;
      return nullptr;
    }
    plist_from_bin(text.data(), static_cast<std::uint32_t>(text.size()), &node);
  } else {
    if (text.starts_with(ByteOrderMark)) text.remove_prefix(ByteOrderMark.size());
    if (!text.substr(std::min(text.find_first_not_of(" \t\r\n"), text.size())).starts_with('<')) {
      problem = "it is neither XML nor binary";
      return nullptr;
    }
    const auto canonical = canonicalXmlPropertyList(text, limits, problem);
    if (!canonical) return nullptr;
    if (canonical->size() > std::numeric_limits<std::uint32_t>::max()) {
      problem = "it is too large";
      return nullptr;
    }
    plist_from_xml(canonical->data(), static_cast<std::uint32_t>(canonical->size()), &node);
  }
  problem = "it cannot be read";
  return Node(node);
}

}  // namespace

std::optional<PropertyList> parsePropertyList(ByteView bytes, std::optional<Error>* error,
                                              const PropertyListLimits& limits) {
  std::string problem = "it is too large";
  const bool fits =
      bytes.size() <= limits.bytes && bytes.size() <= std::numeric_limits<std::uint32_t>::max();
  const PlainLocale locale;
  if (const Node node = fits ? parsedNode(bytes, limits, problem) : nullptr) {
    if (auto value = TreeReader(!BinaryPropertyList::isMeant(bytes)).read(node.get())) return value;
  }
  setError(error, failure("not a usable property list: " + problem));
  return std::nullopt;
}

std::optional<PropertyList::Dictionary> parseDictionary(ByteView bytes, std::optional<Error>* error,
                                                        const PropertyListLimits& limits) {
  std::optional<PropertyList> parsed = parsePropertyList(bytes, error, limits);
  if (!parsed) return std::nullopt;
  if (PropertyList::Dictionary* dictionary = parsed->asDictionary()) return std::move(*dictionary);
  setError(error, Error::withDescription(PropertyListErrorDomain, 0, "not a dictionary"));
  return std::nullopt;
}

std::optional<Bytes> serializePropertyList(const PropertyList& value, PropertyListFormat format,
                                           std::optional<Error>* error) {
  const PlainLocale locale;
  TreeWriter writer(format);
  const Node node = writer.write(value);
  char* bytes = nullptr;
  std::uint32_t size = 0;
  if (node)
    (format == PropertyListFormat::Xml ? plist_to_xml : plist_to_bin)(node.get(), &bytes, &size);
  const Allocated<char> owned(bytes);
  if (!bytes || size > PropertyListLimits{}.bytes) {
    setError(error, failure(std::string("the property list cannot be written: ") +
                            (bytes ? "it is too large" : writer.problem())));
    return std::nullopt;
  }
  const ByteView view = asBytes(std::string_view(bytes, size));
  return Bytes(view.begin(), view.end());
}

}  // namespace appsync
