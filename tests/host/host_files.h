#pragma once

#include <filesystem>
#include <map>
#include <string>
#include <string_view>

#include "platform/property_list.h"
#include "tests/fakes/temporary_folder.h"

namespace appsync::host::testing {

using Folder = fakes::TemporaryFolder;
using fakes::fileText;
using fakes::memoryFolder;
using fakes::putFile;

/// What an archive holds: entry name to contents.
using Entries = std::map<std::string, std::string>;
/// Packs the entries in the format that the file's ending names. Nothing is checked.
void pack(const std::filesystem::path& file, const Entries& entries);

PropertyList::Dictionary appInfo(std::string_view identifier, std::string_view version,
                                 std::string_view name);
std::string xmlText(const PropertyList& value);
/// "Sample.app" of this application with an icon, a program and both metadata files.
Entries sampleEntries(std::string_view identifier, std::string_view version = "1.0",
                      std::string_view name = "Sample");
/// A package of the sample with a body of so many bytes that do not compress.
void packSample(const std::filesystem::path& file, std::string_view identifier,
                std::string_view version = "1.0", std::size_t bodySize = 0);

}  // namespace appsync::host::testing
