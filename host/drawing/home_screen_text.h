#pragma once

#include <cairo.h>

#include <memory>
#include <string>
#include <string_view>

namespace appsync::host {

/// Writes on a home screen, in fonts that cover most scripts and that are the same on every
/// machine. Made for one drawing, on one thread; a std::runtime_error when the fonts are not there.
class HomeScreenText {
 public:
  /// Borrows the drawing.
  explicit HomeScreenText(cairo_t* drawing);
  ~HomeScreenText();
  HomeScreenText(const HomeScreenText&) = delete;
  HomeScreenText& operator=(const HomeScreenText&) = delete;

  struct Style {
    double size;   ///< of the letters
    double width;  ///< longer text is cut, with "…"
  };
  /// One line of any bytes in the current colour, centred on a point of its baseline. However tall
  /// its characters, it stays in a line's height; those that no font has are left out.
  void write(std::string_view text, double centre, double baseline, const Style& style);

  /// A letter of this size, centred in both directions; nothing if no font has it.
  void writeLetter(std::string_view letter, double x, double y, double size);

 private:
  struct Fonts;
  const std::unique_ptr<Fonts> fonts_;
};

/// The letter that stands for a name: its first letter or digit, as a capital. Empty for none.
std::string initialOf(std::string_view name);

}  // namespace appsync::host
