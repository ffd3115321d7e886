#include "host/drawing/home_screen_drawing.h"

#include <algorithm>
#include <memory>
#include <numbers>
#include <stdexcept>

#include "host/drawing/home_screen_surface.h"
#include "host/drawing/home_screen_text.h"

namespace appsync::host {
namespace {

// All lengths are in points; a picture has one or two pixels for each.
constexpr std::size_t Columns = 4;
constexpr double PageWidth = 376, PageHeight = 668, PageGap = 16, PageCorner = 30;
constexpr double FirstIconLeft = 29, FirstIconTop = 34, CellWidth = 86, CellHeight = 97;
constexpr double IconSide = ScreenView::IconPoints, IconCorner = 0.225 * IconSide;
constexpr double NameBaseline = IconSide + 17, DotsTop = PageHeight - 22;
constexpr HomeScreenText::Style NameStyle{12, 79};

constexpr std::size_t PagesPerRow = 8;
constexpr std::size_t MaximumDots = 24;

constexpr double Pi = std::numbers::pi;

struct Colour {
  double red, green, blue, alpha = 1;
};
constexpr Colour White{1, 1, 1}, Shade{0.05, 0.06, 0.12};
constexpr Colour ScreenTop{0.12, 0.20, 0.36}, ScreenMiddle{0.25, 0.33, 0.55},
    ScreenBottom{0.51, 0.43, 0.62};
constexpr Colour TileTop{0.62, 0.66, 0.74}, TileBottom{0.44, 0.48, 0.57};

using Drawing = std::unique_ptr<cairo_t, Releaser<cairo_destroy>>;
using Pattern = std::unique_ptr<cairo_pattern_t, Releaser<cairo_pattern_destroy>>;

bool isUsable(const std::optional<Image>& image) {
  return image && image->width > 0 && image->height > 0 &&
         image->pixels.size() == std::size_t{image->width} * image->height * 4;
}

/// Draws with the origin at a corner of what is being drawn.
class Place {
 public:
  Place(cairo_t* drawing, double x, double y) : drawing_(drawing) {
    cairo_save(drawing_);
    cairo_translate(drawing_, x, y);
  }
  ~Place() { cairo_restore(drawing_); }
  Place(const Place&) = delete;
  Place& operator=(const Place&) = delete;

 private:
  cairo_t* drawing_;
};

class Painter {
 public:
  explicit Painter(cairo_t* drawing) : drawing_(drawing), text_(drawing) {}

  void page(const ScreenView& view, std::size_t page, const ScreenIcon* icons, std::size_t count) {
    background();
    for (std::size_t i = 0; i < count; ++i) {
      const std::size_t row = i / Columns, column = i % Columns;
      const Place place(drawing_, FirstIconLeft + double(column) * CellWidth,
                        FirstIconTop + double(row) * CellHeight);
      icon(icons[i]);
    }
    if (view.pageCount > 1) dots(view.pageCount, page);
  }

 private:
  void use(const Colour& colour, double alpha = 1) {
    cairo_set_source_rgba(drawing_, colour.red, colour.green, colour.blue, colour.alpha * alpha);
  }

  void fillDownwards(double height, std::initializer_list<Colour> colours) {
    const Pattern gradient(cairo_pattern_create_linear(0, 0, 0, height));
    double at = 0;
    for (const Colour& colour : colours) {
      cairo_pattern_add_color_stop_rgb(gradient.get(), at, colour.red, colour.green, colour.blue);
      at += 1.0 / double(colours.size() - 1);
    }
    cairo_set_source(drawing_, gradient.get());
    cairo_fill(drawing_);
  }

  void roundedRectangle(double x, double y, double width, double height, double corner) {
    cairo_new_sub_path(drawing_);
    cairo_arc(drawing_, x + width - corner, y + corner, corner, -Pi / 2, 0);
    cairo_arc(drawing_, x + width - corner, y + height - corner, corner, 0, Pi / 2);
    cairo_arc(drawing_, x + corner, y + height - corner, corner, Pi / 2, Pi);
    cairo_arc(drawing_, x + corner, y + corner, corner, Pi, 3 * Pi / 2);
    cairo_close_path(drawing_);
  }

  void background() {
    roundedRectangle(0, 0, PageWidth, PageHeight, PageCorner);
    fillDownwards(PageHeight, {ScreenTop, ScreenMiddle, ScreenBottom});
  }

  void icon(const ScreenIcon& icon) {
    shadow();
    {
      const Place place(drawing_, 0, 0);
      roundedRectangle(0, 0, IconSide, IconSide, IconCorner);
      cairo_clip(drawing_);
      isUsable(icon.picture) ? picture(*icon.picture) : tile(icon.name);
      if (icon.state != ScreenIcon::State::Installed) dim();
    }
    mark(icon);
    name(icon);
  }

  void shadow() {
    for (const double spread : {0.0, 1.0, 2.0, 3.0}) {
      roundedRectangle(-spread, 1.5 - spread, IconSide + 2 * spread, IconSide + 2 * spread,
                       IconCorner + spread);
      use(Shade, 0.05);
      cairo_fill(drawing_);
    }
  }

  void picture(const Image& image) {
    const Surface surface = surfaceOf(image);
    const Place place(drawing_, 0, 0);
    cairo_scale(drawing_, IconSide / image.width, IconSide / image.height);
    cairo_set_source_surface(drawing_, surface.get(), 0, 0);
    cairo_pattern_set_extend(cairo_get_source(drawing_), CAIRO_EXTEND_PAD);
    cairo_paint(drawing_);
  }

  void tile(const std::string& name) {
    cairo_rectangle(drawing_, 0, 0, IconSide, IconSide);
    fillDownwards(IconSide, {TileTop, TileBottom});
    use(White);
    text_.writeLetter(initialOf(name), IconSide / 2, IconSide / 2, 32);
  }

  /// Takes half of the colour and most of the light away.
  void dim() {
    cairo_set_operator(drawing_, CAIRO_OPERATOR_HSL_SATURATION);
    cairo_set_source_rgba(drawing_, 0.5, 0.5, 0.5, 0.5);
    cairo_paint(drawing_);
    cairo_set_operator(drawing_, CAIRO_OPERATOR_OVER);
    use(Shade, 0.48);
    cairo_paint(drawing_);
  }

  void mark(const ScreenIcon& icon) {
    const Place centre(drawing_, IconSide / 2, IconSide / 2);
    switch (icon.state) {
      case ScreenIcon::State::Installed:
        break;
      case ScreenIcon::State::Waiting:
        ring(0.6);
        break;
      case ScreenIcon::State::Loading:
        ring(0.95);
        wedge(icon.progress);
        break;
      case ScreenIcon::State::Paused:
        ring(0.95);
        for (const double x : {-5.5, 1.5}) {
          cairo_rectangle(drawing_, x, -6.5, 4, 13);
          cairo_fill(drawing_);
        }
        break;
      case ScreenIcon::State::Away:
        cloud();
        break;
    }
  }

  void ring(double alpha) {
    use(White, alpha);
    cairo_set_line_width(drawing_, 2);
    cairo_new_sub_path(drawing_);
    cairo_arc(drawing_, 0, 0, 17, 0, 2 * Pi);
    cairo_stroke(drawing_);
  }

  void wedge(double progress) {
    if (!(progress > 0)) return;  // NaN too
    cairo_move_to(drawing_, 0, 0);
    cairo_arc(drawing_, 0, 0, 13.5, -Pi / 2, -Pi / 2 + 2 * Pi * std::min(progress, 1.0));
    cairo_close_path(drawing_);
    cairo_fill(drawing_);
  }

  void cloud() {
    use(White, 0.95);
    cairo_set_line_width(drawing_, 2);
    cairo_set_line_join(drawing_, CAIRO_LINE_JOIN_ROUND);
    cairo_set_line_cap(drawing_, CAIRO_LINE_CAP_ROUND);
    // From the arrow's left round to its right.
    cairo_move_to(drawing_, -5, 7);
    cairo_arc(drawing_, -10, 0.5, 6.5, Pi / 2, 1.55 * Pi);
    cairo_arc(drawing_, -1, -5, 9, 1.08 * Pi, 1.87 * Pi);
    cairo_arc(drawing_, 10, 0, 7, 1.45 * Pi, 0.5 * Pi);
    cairo_line_to(drawing_, 5, 7);
    cairo_stroke(drawing_);
    cairo_move_to(drawing_, 0, -1);
    cairo_line_to(drawing_, 0, 13);
    cairo_move_to(drawing_, -4.5, 8.5);
    cairo_line_to(drawing_, 0, 13);
    cairo_line_to(drawing_, 4.5, 8.5);
    cairo_stroke(drawing_);
  }

  void name(const ScreenIcon& icon) {
    use(Shade, 0.45);
    text_.write(icon.name, IconSide / 2, NameBaseline + 0.75, NameStyle);
    use(White, icon.state == ScreenIcon::State::Installed ? 1 : 0.8);
    text_.write(icon.name, IconSide / 2, NameBaseline, NameStyle);
  }

  /// Which page of how many this is.
  void dots(std::size_t pages, std::size_t page) {
    if (pages > MaximumDots) {
      use(White, 0.8);
      text_.write(std::to_string(page + 1) + " / " + std::to_string(pages), PageWidth / 2,
                  DotsTop + 4, {11, PageWidth});
      return;
    }
    constexpr double Distance = 13;
    for (std::size_t i = 0; i < pages; ++i) {
      use(White, i == page ? 1 : 0.4);
      cairo_new_sub_path(drawing_);
      cairo_arc(drawing_, PageWidth / 2 + (double(i) - double(pages - 1) / 2) * Distance, DotsTop,
                3, 0, 2 * Pi);
      cairo_fill(drawing_);
    }
  }

  cairo_t* drawing_;
  HomeScreenText text_;
};

}  // namespace

Image drawHomeScreen(const ScreenView& view, const std::vector<ScreenIcon>& icons) {
  const double scale = view.pixelsPerPoint();
  const auto pixels = [scale](std::size_t count, double length) {
    return static_cast<std::uint32_t>(scale * (double(count) * (length + PageGap) - PageGap));
  };
  const std::size_t shown = std::clamp<std::size_t>(view.pagesShown, 1, ScreenView::MaximumPages);
  const std::size_t rows = (shown + PagesPerRow - 1) / PagesPerRow;
  const Surface surface =
      makeSurface(pixels(std::min(shown, PagesPerRow), PageWidth), pixels(rows, PageHeight));
  const Drawing drawing(cairo_create(surface.get()));
  cairo_scale(drawing.get(), scale, scale);
  Painter painter(drawing.get());
  for (std::size_t i = 0; i < shown; ++i) {
    const std::size_t row = i / PagesPerRow, column = i % PagesPerRow;
    const Place page(drawing.get(), double(column) * (PageWidth + PageGap),
                     double(row) * (PageHeight + PageGap));
    const std::size_t first = std::min(i * IconsPerPage, icons.size());
    painter.page(view, view.firstPage + i, icons.data() + first,
                 std::min(IconsPerPage, icons.size() - first));
  }
  if (const auto status = cairo_status(drawing.get())) {
    throw std::runtime_error(cairo_status_to_string(status));
  }
  return imageOf(surface);
}

}  // namespace appsync::host
