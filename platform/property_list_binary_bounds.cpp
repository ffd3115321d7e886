#include <algorithm>
#include <cstdint>
#include <limits>
#include <vector>

#include "platform/binary_property_list.h"
#include "platform/property_list_bounds.h"
#include "platform/utf8.h"

namespace appsync {
namespace {

using Object = BinaryPropertyList::Object;

/// What an object becomes when it is built as a tree of its own.
struct Expansion {
  std::uint32_t objects = 0;
  std::uint32_t bytes = 0;
  std::uint16_t height = 0;  ///< 0 for all but arrays and dictionaries
  bool open = false;         ///< being visited; met again it closes a cycle
  bool isText = false;
  bool done() const { return objects != 0; }
};

class BinaryCheck {
 public:
  BinaryCheck(const BinaryPropertyList& list, const PropertyListLimits& limits)
      : list_(list),
        objectLimit_(std::min(limits.objects, Most)),
        byteLimit_(std::min(limits.bytes, Most)),
        depthLimit_(std::min(limits.depth, MaximumPropertyListDepth)) {}

  const char* run() {
    if (list_.objectCount() > objectLimit_) return TooManyObjects;
    expansions_.resize(list_.objectCount());
    return visit(list_.topIndex(), 0) ? nullptr : problem_;
  }

  bool foundSharedContainers() const { return foundSharedContainers_; }

 private:
  static constexpr std::size_t Most = std::numeric_limits<std::uint32_t>::max();
  static constexpr const char* TooManyObjects = "it holds too many objects";
  static constexpr const char* TooLarge = "it is too large";

  /// Objects and bytes of a container's elements so far.
  struct Sum {
    std::uint64_t objects = 1;
    std::uint64_t bytes = 0;
    std::uint16_t height = 1;
  };

  bool fail(const char* problem) {
    problem_ = problem;
    return false;
  }

  /// Fills the expansion of an object that is `depth` containers below the top.
  bool visit(std::size_t index, std::size_t depth) {
    Expansion& own = expansions_[index];
    if (own.open) return fail("it refers to itself");
    if (own.done()) {
      foundSharedContainers_ |= own.height > 0;
      return depth + own.height <= depthLimit_ || fail("it is nested too deeply");
    }
    Object object;
    if (const char* problem = list_.read(index, object)) return fail(problem);
    if (object.kind == BinaryPropertyList::Array || object.kind == BinaryPropertyList::Dictionary) {
      own.open = true;
      return visitChildren(object, depth + 1, own);
    }
    own.objects = 1;
    own.isText =
        object.kind == BinaryPropertyList::Text || object.kind == BinaryPropertyList::Utf16;
    return checkScalar(object, own.bytes);
  }

  bool visitChildren(const Object& object, std::size_t depth, Expansion& own) {
    if (depth > depthLimit_) return fail("it is nested too deeply");
    const bool dictionary = object.kind == BinaryPropertyList::Dictionary;
    const auto keys = static_cast<std::size_t>(dictionary ? object.count : 0);
    const auto references = static_cast<std::size_t>(object.count) + keys;
    Sum sum;
    for (std::size_t i = 0; i < references; ++i) {
      const std::uint64_t child = list_.reference(list_.placeOfReference(object, i));
      if (child >= list_.objectCount()) return fail("it refers to an object that does not exist");
      const auto index = static_cast<std::size_t>(child);
      if (!visit(index, depth)) return false;
      if (i < keys && !expansions_[index].isText) return fail("a dictionary key is no string");
      if (!add(expansions_[index], sum)) return false;
    }
    own = {static_cast<std::uint32_t>(sum.objects), static_cast<std::uint32_t>(sum.bytes),
           sum.height};
    return true;
  }

  bool add(const Expansion& child, Sum& sum) {
    sum.objects += child.objects;
    sum.bytes += child.bytes;
    sum.height = std::max(sum.height, static_cast<std::uint16_t>(child.height + 1));
    if (sum.objects > objectLimit_) return fail(TooManyObjects);
    return sum.bytes <= byteLimit_ || fail(TooLarge);
  }

  bool checkScalar(const Object& object, std::uint32_t& bytes) {
    switch (object.kind) {
      case BinaryPropertyList::Constant:
        if (object.info == 8 || object.info == 9) return true;
        return fail("it holds an object of an unknown type");
      case BinaryPropertyList::Integer:
        return checkInteger(object);
      case BinaryPropertyList::Real:
        return object.info == 2 || object.info == 3 || fail("a real has no valid size");
      case BinaryPropertyList::Date:
        return checkDate(object);
      case BinaryPropertyList::Data:
        return take(object.count, bytes);
      case BinaryPropertyList::Text:
        return take(object.count, bytes) && checkText(object);
      case BinaryPropertyList::Utf16:
        return take(object.count * 3, bytes) && checkUtf16(object);  // a unit as UTF-8
      case BinaryPropertyList::Uid:
        return fail("it holds a UID");
      default:
        return fail("it holds an object of an unknown type");
    }
  }

  /// Counts contents before they are looked at: objects may overlap, and looking takes time.
  bool take(std::uint64_t count, std::uint32_t& bytes) {
    bytesSeen_ += count;
    if (bytesSeen_ > byteLimit_) return fail(TooLarge);
    bytes = static_cast<std::uint32_t>(count);
    return true;
  }

  bool checkInteger(const Object& object) {
    if (object.info > 4) return fail("an integer has no valid size");
    if (object.info == 4 && list_.number(object.start, 8) != 0)
      return fail("an integer is too large");
    return true;
  }

  bool checkDate(const Object& object) {
    if (object.info != 3) return fail("a date has no valid size");
    constexpr std::uint64_t exponent = 0x7ff;
    const std::uint64_t bits = list_.number(object.start, 8);
    return (bits >> 52 & exponent) != exponent || fail("a date is no finite number");
  }

  bool checkText(const Object& object) {
    const std::string_view text = asText(list_.contents(object));
    if (text.find('\0') != text.npos) return fail("a string holds a NUL character");
    return isUtf8(text) || fail("a string is not valid text");
  }

  bool checkUtf16(const Object& object) {
    // The library reads no empty one, and nobody writes one.
    if (object.count == 0) return fail("a string is not valid text");
    bool afterHigh = false;
    for (std::size_t at = object.start; at < object.start + object.size; at += 2) {
      const std::uint64_t unit = list_.number(at, 2);
      if (unit == 0) return fail("a string holds a NUL character");
      const bool high = unit >= 0xd800 && unit < 0xdc00;
      const bool low = unit >= 0xdc00 && unit < 0xe000;
      if (low != afterHigh) return fail("a string is not valid text");
      afterHigh = high;
    }
    return !afterHigh || fail("a string is not valid text");
  }

  const BinaryPropertyList& list_;
  const std::size_t objectLimit_;
  const std::size_t byteLimit_;
  const std::size_t depthLimit_;
  std::vector<Expansion> expansions_;
  std::uint64_t bytesSeen_ = 0;
  bool foundSharedContainers_ = false;
  const char* problem_ = "";
};

}  // namespace

const char* problemOf(const BinaryPropertyList& list, const PropertyListLimits& limits,
                      bool* sharesContainers) {
  BinaryCheck check(list, limits);
  const char* problem = check.run();
  if (sharesContainers) *sharesContainers = check.foundSharedContainers();
  return problem;
}

}  // namespace appsync
