// Parses arbitrary bytes; what parses must survive both formats unchanged.
//
// With APPSYNC_FUZZ_MAIN this is a program that runs the files given to it once.

#include <cstdint>
#include <cstdlib>

#include "platform/property_list_codec.h"

namespace {

using appsync::ByteView;
using appsync::PropertyList;
using appsync::PropertyListFormat;

void require(bool condition) {
  if (!condition) std::abort();
}

/// Files are compared, not trees: a NaN differs from itself.
void checkRoundTrip(const PropertyList& tree, PropertyListFormat format) {
  const auto file = appsync::serializePropertyList(tree, format);
  require(file || format == PropertyListFormat::Xml);  // XML holds less
  if (!file) return;
  const auto again = appsync::parsePropertyList(*file);
  require(again.has_value());
  require(appsync::serializePropertyList(*again, format) == file);
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  if (const auto tree = appsync::parsePropertyList(std::as_bytes(std::span(data, size)))) {
    (void)description(*tree);
    checkRoundTrip(*tree, PropertyListFormat::Binary);
    checkRoundTrip(*tree, PropertyListFormat::Xml);
  }
  return 0;
}

#ifdef APPSYNC_FUZZ_MAIN
#include <fstream>
#include <iostream>
#include <iterator>

int main(int count, char** files) {
  for (int i = 1; i < count; ++i) {
    std::ifstream in(files[i], std::ios::binary);
    if (!in) return std::cerr << files[i] << ": cannot be read\n", 1;
    const std::string bytes((std::istreambuf_iterator<char>(in)), {});
    LLVMFuzzerTestOneInput(reinterpret_cast<const std::uint8_t*>(bytes.data()), bytes.size());
  }
  std::cout << count - 1 << " files\n";
}
#endif
