#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "platform/icon_renderer.h"

namespace appsync::host {

/// What a person sees of an application on the home screen.
struct ScreenIcon {
  enum class State {
    Installed,
    Waiting,  ///< a placeholder whose package will come: an empty ring
    Loading,  ///< its package is coming: a ring that fills
    Paused,   ///< a ring with two bars
    Away      ///< nobody is bringing its package: a cloud with an arrow
  };

  std::string name;  ///< any bytes
  /// Square; its corners are rounded here. none: a tile with the name's first letter.
  std::optional<Image> picture;
  State state = State::Installed;
  double progress = 0;  ///< while loading, from 0 to 1
};

inline constexpr std::size_t IconsPerPage = 24;

/// The pages that so many icons need; one even for none.
inline std::size_t pagesFor(std::size_t iconCount) {
  return iconCount == 0 ? 1 : (iconCount + IconsPerPage - 1) / IconsPerPage;
}

/// The part of a home screen that a picture shows.
struct ScreenView {
  /// The most pages that one picture holds.
  static constexpr std::size_t MaximumPages = 96;
  /// As many are drawn with two pixels for a point.
  static constexpr std::size_t LargePages = 24;
  static constexpr std::uint32_t IconPoints = 60;

  std::size_t pageCount = 1;  ///< of the whole home screen
  std::size_t firstPage = 0;
  std::size_t pagesShown = 1;

  std::uint32_t pixelsPerPoint() const { return pagesShown <= LargePages ? 2 : 1; }
  /// Pixels on each side of an icon.
  std::uint32_t iconSide() const { return IconPoints * pixelsPerPoint(); }
};

}  // namespace appsync::host
