#pragma once

#include <cstdint>
#include <initializer_list>
#include <optional>
#include <string>
#include <vector>

#include "platform/property_list_codec.h"

namespace appsync {

/// Overrides what the file's trailer says.
struct BinaryFileTrailer {
  std::optional<std::uint64_t> objects = {}, top = {}, table = {};
  std::optional<std::uint8_t> offsetSize = {}, referenceSize = {};
};

/// Builds binary property lists byte by byte, valid or damaged. Object 0 is the top one.
class BinaryFileBuilder {
 public:
  explicit BinaryFileBuilder(std::size_t offsetSize = 2, std::size_t referenceSize = 2)
      : offsetSize_(offsetSize), referenceSize_(referenceSize) {}

  BinaryFileBuilder& object(std::string bytes) {
    offsets_.push_back(file_.size());
    file_ += bytes;
    return *this;
  }
  BinaryFileBuilder& array(std::initializer_list<std::uint64_t> references) {
    return container(0xa0, references.size(), references);
  }
  /// All keys, then all values.
  BinaryFileBuilder& dictionary(std::initializer_list<std::uint64_t> references) {
    return container(0xd0, references.size() / 2, references);
  }
  /// Makes the next object start where object `index` does.
  BinaryFileBuilder& alias(std::size_t index) {
    offsets_.push_back(offsets_[index]);
    return *this;
  }

  std::vector<std::uint64_t>& offsets() { return offsets_; }

  static std::string bigEndian(std::uint64_t value, std::size_t size) {
    std::string out(size, '\0');
    for (std::size_t i = 0; i < size && i < 8; ++i)
      out[size - 1 - i] = static_cast<char>(value >> 8 * i & 0xff);
    return out;
  }

  Bytes build(const BinaryFileTrailer& trailer = {}) const {
    std::string out = file_;
    for (const std::uint64_t offset : offsets_) out += bigEndian(offset, offsetSize_);
    out += std::string(6, '\0');
    out += static_cast<char>(trailer.offsetSize.value_or(std::uint8_t(offsetSize_)));
    out += static_cast<char>(trailer.referenceSize.value_or(std::uint8_t(referenceSize_)));
    out += bigEndian(trailer.objects.value_or(offsets_.size()), 8);
    out += bigEndian(trailer.top.value_or(0), 8);
    out += bigEndian(trailer.table.value_or(file_.size()), 8);
    return toBytes(out);
  }

 private:
  BinaryFileBuilder& container(unsigned marker, std::size_t count,
                               std::initializer_list<std::uint64_t> references) {
    std::string bytes(1, static_cast<char>(marker | (count < 15 ? count : 15)));
    if (count >= 15) bytes += '\x10' + bigEndian(count, 1);
    for (const std::uint64_t reference : references) bytes += bigEndian(reference, referenceSize_);
    return object(bytes);
  }

  std::size_t offsetSize_;
  std::size_t referenceSize_;
  std::string file_ = "bplist00";
  std::vector<std::uint64_t> offsets_;
};

}  // namespace appsync
