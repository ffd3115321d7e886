#include "tests/host/host_files.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <fstream>
#include <iterator>
#include <random>

#include "packages/archive_writer.h"
#include "packages/package_facts.h"
#include "platform/bundle.h"
#include "platform/property_list_codec.h"

namespace appsync::host::testing {
namespace fs = std::filesystem;

void pack(const fs::path& file, const Entries& entries) {
  const Folder sources;
  const int fd = ::open(file.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0644);
  {
    ArchiveWriter writer(fd, packageEnding(file.filename().string()));
    for (const auto& [name, contents] : entries) {
      putFile(sources / "entry", contents);
      writer.addFile(name, sources / "entry", false);
      fs::remove(sources / "entry");  // written over, it would wait for the disk
    }
    EXPECT_TRUE(writer.finish()) << writer.problem();
  }
  ::close(fd);
}

PropertyList::Dictionary appInfo(std::string_view identifier, std::string_view version,
                                 std::string_view name) {
  return {{std::string(KBBundleIdentifier), identifier},
          {std::string(KBBundleVersion), version},
          {std::string(KBBundleDisplayName), name},
          {std::string(KBBundleExecutable), "run"},
          {std::string(KBBundleIconFile), "Icon.png"}};
}

std::string xmlText(const PropertyList& value) {
  const auto bytes = serializePropertyList(value, PropertyListFormat::Xml);
  return bytes ? std::string(asText(*bytes)) : std::string();
}

Entries sampleEntries(std::string_view identifier, std::string_view version,
                      std::string_view name) {
  return {{"Sample.app/Info.plist", xmlText(appInfo(identifier, version, name))},
          {"Sample.app/Icon.png", "icon of " + std::string(identifier)},
          {"Sample.app/run", "#!/bin/sh\n"},
          {"HalvoMetadata.plist", xmlText(PropertyList::Dictionary{{"itemId", 7}})},
          {"HalvoArtwork", "artwork"}};
}

void packSample(const fs::path& file, std::string_view identifier, std::string_view version,
                std::size_t bodySize) {
  Entries entries = sampleEntries(identifier, version);
  std::mt19937 random(1);
  std::string body(bodySize, '\0');
  for (char& c : body) c = static_cast<char>(random());
  if (bodySize > 0) entries["Sample.app/body"] = body;
  pack(file, entries);
}

}  // namespace appsync::host::testing
