#include <cstdint>
#include <vector>

#include "platform/property_list_bounds.h"
#include "platform/utf8.h"

namespace appsync {
namespace {

constexpr std::size_t HeaderSize = 8;
constexpr std::size_t TrailerSize = 32;

/// What an object becomes when it is built as a tree of its own.
struct Expansion {
  std::uint64_t objects = 0;
  std::uint64_t bytes = 0;
  std::uint32_t height = 0;
  bool open = false;  ///< being visited; met again it closes a cycle
  bool done() const { return objects != 0; }
};

class BinaryCheck {
 public:
  BinaryCheck(ByteView bytes, const PropertyListLimits& limits)
      : bytes_(bytes),
        limits_(limits),
        depthLimit_(std::min(limits.depth, MaximumPropertyListDepth)) {}

  const char* run() {
    if (const char* problem = readTrailer()) return problem;
    expansions_.resize(objectCount_);
    return visit(rootIndex_, 0) ? nullptr : problem_;
  }

 private:
  struct Object {
    unsigned kind;        ///< high half of the marker
    unsigned info;        ///< low half
    std::uint64_t count;  ///< of units in a string, data, array or dictionary
    std::size_t start;    ///< where the contents begin
  };

  std::uint64_t number(std::size_t at, std::size_t size) const {
    std::uint64_t value = 0;
    for (std::size_t i = 0; i < size; ++i) value = value << 8 | byte(at + i);
    return value;
  }
  unsigned byte(std::size_t at) const { return std::to_integer<unsigned>(bytes_[at]); }

  bool fail(const char* problem) {
    problem_ = problem;
    return false;
  }

  const char* readTrailer() {
    if (bytes_.size() < HeaderSize + 1 + TrailerSize) return "the file is cut off";
    const std::size_t trailer = bytes_.size() - TrailerSize;
    offsetSize_ = byte(trailer + 6);
    referenceSize_ = byte(trailer + 7);
    const std::uint64_t objects = number(trailer + 8, 8);
    const std::uint64_t root = number(trailer + 16, 8);
    const std::uint64_t table = number(trailer + 24, 8);
    if (offsetSize_ < 1 || offsetSize_ > 8 || referenceSize_ < 1 || referenceSize_ > 8)
      return "the trailer is damaged";
    if (table <= HeaderSize || table >= trailer || objects > (trailer - table) / offsetSize_)
      return "the offset table lies outside the file";
    if (objects > limits_.objects) return "it holds too many objects";
    if (root >= objects) return "the top object does not exist";
    objectCount_ = static_cast<std::size_t>(objects);
    rootIndex_ = static_cast<std::size_t>(root);
    tableStart_ = static_cast<std::size_t>(table);
    return nullptr;
  }

  bool readObject(std::size_t index, Object& object) {
    const std::uint64_t offset = number(tableStart_ + index * offsetSize_, offsetSize_);
    if (offset < HeaderSize || offset >= tableStart_)
      return fail("an object lies outside the file");
    const auto at = static_cast<std::size_t>(offset);
    object = {byte(at) >> 4, byte(at) & 15, byte(at) & 15, at + 1};
    return object.info != 15 || object.kind < 4 || readCount(object);
  }

  /// Counts from 15 on stand in an integer object after the marker.
  bool readCount(Object& object) {
    if (object.start >= tableStart_) return fail("an object lies outside the file");
    const unsigned marker = byte(object.start);
    const std::size_t size = std::size_t{1} << (marker & 15);
    if (marker >> 4 != 1 || size > 8) return fail("an object has no valid length");
    if (size > tableStart_ - object.start - 1) return fail("an object lies outside the file");
    object.count = number(object.start + 1, size);
    object.start += 1 + size;
    return true;
  }

  /// True when `count` units of `size` bytes fit between the object's start and the offset table.
  bool fits(const Object& object, std::uint64_t count, std::size_t size) {
    if (count <= (tableStart_ - object.start) / size) return true;
    return fail("an object lies outside the file");
  }

  /// Counts contents before they are looked at: objects may overlap, and looking takes time.
  bool take(const Object& object, std::size_t unitSize, std::uint64_t& bytes) {
    if (!fits(object, object.count, unitSize)) return false;
    bytes = unitSize == 1 ? object.count : object.count * 3;  // a unit of UTF-16 as UTF-8
    bytesSeen_ += bytes;
    return bytesSeen_ <= limits_.bytes || fail("it is too large");
  }

  bool checkScalar(const Object& object, std::uint64_t& bytes) {
    switch (object.kind) {
      case 0x0:
        if (object.info == 8 || object.info == 9) return true;
        return fail("it holds an object of an unknown type");
      case 0x1:
        return checkInteger(object);
      case 0x2:
        if (object.info != 2 && object.info != 3) return fail("a real has no valid size");
        return fits(object, 1, std::size_t{1} << object.info);
      case 0x3:
        if (object.info != 3) return fail("a date has no valid size");
        return fits(object, 1, 8);
      case 0x4:
        return take(object, 1, bytes);
      case 0x5:
        return take(object, 1, bytes) && checkText(object);
      case 0x6:
        return take(object, 2, bytes) && checkUtf16(object);
      case 0x8:
        return fail("it holds a UID");
      default:
        return fail("it holds an object of an unknown type");
    }
  }

  bool checkInteger(const Object& object) {
    if (object.info > 4) return fail("an integer has no valid size");
    if (!fits(object, 1, std::size_t{1} << object.info)) return false;
    if (object.info == 4 && number(object.start, 8) != 0) return fail("an integer is too large");
    return true;
  }

  bool checkText(const Object& object) {
    const std::string_view text =
        asText(bytes_.subspan(object.start, static_cast<std::size_t>(object.count)));
    if (text.find('\0') != text.npos) return fail("a string holds a NUL character");
    return isUtf8(text) || fail("a string is not valid text");
  }

  bool checkUtf16(const Object& object) {
    bool afterHigh = false;
    for (std::uint64_t i = 0; i < object.count; ++i) {
      const std::uint64_t unit = number(object.start + static_cast<std::size_t>(i) * 2, 2);
      if (unit == 0) return fail("a string holds a NUL character");
      const bool high = unit >= 0xd800 && unit < 0xdc00;
      const bool low = unit >= 0xdc00 && unit < 0xe000;
      if (low != afterHigh) return fail("a string is not valid text");
      afterHigh = high;
    }
    return !afterHigh || fail("a string is not valid text");
  }

  /// Fills the expansion of an object that is `depth` containers below the top.
  bool visit(std::size_t index, std::size_t depth) {
    Expansion& own = expansions_[index];
    if (own.open) return fail("it refers to itself");
    if (own.done()) return depth + own.height <= depthLimit_ || fail("it is nested too deeply");
    Object object;
    if (!readObject(index, object)) return false;
    Expansion sum{1, 0, 0, false};
    if (object.kind == 0xa || object.kind == 0xd) {
      own.open = true;
      if (!visitChildren(object, depth + 1, sum)) return false;
    } else if (!checkScalar(object, sum.bytes)) {
      return false;
    }
    own = sum;
    return true;
  }

  bool visitChildren(const Object& object, std::size_t depth, Expansion& sum) {
    if (depth > depthLimit_) return fail("it is nested too deeply");
    const bool dictionary = object.kind == 0xd;
    if (!fits(object, object.count, referenceSize_ * (dictionary ? 2 : 1))) return false;
    const auto keys = static_cast<std::size_t>(dictionary ? object.count : 0);
    const auto references = static_cast<std::size_t>(object.count) + keys;
    sum.height = 1;
    for (std::size_t i = 0; i < references; ++i) {
      const std::uint64_t child = number(object.start + i * referenceSize_, referenceSize_);
      if (child >= objectCount_) return fail("it refers to an object that does not exist");
      const auto index = static_cast<std::size_t>(child);
      if (!visit(index, depth)) return false;
      if (i < keys && !isString(index)) return fail("a dictionary key is no string");
      sum.objects += expansions_[index].objects;
      sum.bytes += expansions_[index].bytes;
      sum.height = std::max(sum.height, expansions_[index].height + 1);
      if (sum.objects > limits_.objects) return fail("it holds too many objects");
      if (sum.bytes > limits_.bytes) return fail("it is too large");
    }
    return true;
  }

  bool isString(std::size_t index) {
    Object object;
    return readObject(index, object) && (object.kind == 0x5 || object.kind == 0x6);
  }

  ByteView bytes_;
  PropertyListLimits limits_;
  std::size_t depthLimit_;
  std::size_t offsetSize_ = 0;
  std::size_t referenceSize_ = 0;
  std::size_t objectCount_ = 0;
  std::size_t rootIndex_ = 0;
  std::size_t tableStart_ = 0;
  std::vector<Expansion> expansions_;
  std::uint64_t bytesSeen_ = 0;
  const char* problem_ = "";
};

}  // namespace

std::optional<std::string> binaryPropertyListProblem(ByteView bytes,
                                                     const PropertyListLimits& limits) {
  const char* problem = BinaryCheck(bytes, limits).run();
  return problem ? std::optional<std::string>(problem) : std::nullopt;
}

}  // namespace appsync
