#pragma once

#include <cstdint>
#include <filesystem>
#include <optional>
#include <string>

namespace appsync {

struct WrittenPackage {
  std::string identifier;
  std::string version;  ///< empty when the bundle gives none
  std::uint64_t bytes = 0;
  std::size_t entries = 0;
};

/// Makes a package of an application folder "Name.app" and of the HalvoMetadata.plist and
/// HalvoArtwork beside it, in the format that the output's ending names. The same folder always
/// gives the same bytes. What the phone would refuse is refused here; the output appears whole or
/// not at all. nullopt with one line for people on failure.
[[nodiscard]] std::optional<WrittenPackage> writePackage(const std::filesystem::path& folder,
                                                         const std::filesystem::path& output,
                                                         std::string& problem);

}  // namespace appsync
