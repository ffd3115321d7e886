#include "host/home_screen/home_screen_text.h"

#include <fontconfig/fontconfig.h>
#include <pango/pangocairo.h>

#include <algorithm>
#include <filesystem>
#include <stdexcept>
#include <string>
#include <vector>

#include "host/base/text.h"
#include "host/home_screen/home_screen_surface.h"

namespace appsync::host {
namespace {
namespace fs = std::filesystem;

// Debian's fonts-noto-core and fonts-droid-fallback (Chinese, Japanese, Korean).
constexpr const char* MainFonts = "/usr/share/fonts/truetype/noto";
constexpr const char* EastAsianFont =
    "/usr/share/fonts-droid-fallback/truetype/DroidSansFallback.ttf";
constexpr const char* Family = "Noto Sans";
/// Nobody sees more of a name than this, and laying out a huge one takes long.
constexpr std::size_t BytesLaidOut = 400;

template <class T>
using Object = std::unique_ptr<T, Releaser<g_object_unref>>;
using Description = std::unique_ptr<PangoFontDescription, Releaser<pango_font_description_free>>;
using FontOptions = std::unique_ptr<cairo_font_options_t, Releaser<cairo_font_options_destroy>>;

std::vector<std::string> fontFiles() {
  std::vector<std::string> files;
  std::error_code error;
  for (fs::directory_iterator item(MainFonts, error), end; !error && item != end;
       item.increment(error)) {
    const std::string name = item->path().filename();
    if (name.starts_with("NotoSans") && name.ends_with("-Regular.ttf")) {
      files.push_back(item->path());
    }
  }
  std::sort(files.begin(), files.end());
  files.push_back(EastAsianFont);
  return files;
}

/// Makes these fonts the only ones of this process: neither the machine's settings nor its other
/// fonts change a picture, and no cache is needed. False when there are none.
bool useFonts() {
  FcConfig* config = FcConfigCreate();
  std::size_t added = 0;
  for (const std::string& file : fontFiles()) {
    if (FcConfigAppFontAddFile(config, reinterpret_cast<const FcChar8*>(file.c_str()))) ++added;
  }
  const bool usable = added > 0 && FcConfigSetCurrent(config);
  FcConfigDestroy(config);  // the process keeps its own reference
  return usable;
}

Object<PangoFontMap> makeFontMap() {
  static const bool usable = useFonts();
  if (!usable) {
    throw std::runtime_error(
        "no fonts to write with: install the packages fonts-noto-core and fonts-droid-fallback");
  }
  return Object<PangoFontMap>(pango_cairo_font_map_new_for_font_type(CAIRO_FONT_TYPE_FT));
}

}  // namespace

struct HomeScreenText::Fonts {
  explicit Fonts(cairo_t* target) : drawing(target), map(makeFontMap()) {
    if (map) context.reset(pango_font_map_create_context(map.get()));
    if (!context) throw std::runtime_error("the text library cannot be used");
    // The same shapes at every size and place, whatever the person's language.
    const FontOptions options(cairo_font_options_create());
    cairo_font_options_set_antialias(options.get(), CAIRO_ANTIALIAS_GRAY);
    cairo_font_options_set_hint_style(options.get(), CAIRO_HINT_STYLE_NONE);
    cairo_font_options_set_hint_metrics(options.get(), CAIRO_HINT_METRICS_OFF);
    pango_cairo_context_set_font_options(context.get(), options.get());
    pango_context_set_language(context.get(), pango_language_from_string("en"));
    pango_cairo_update_context(drawing, context.get());
  }

  Object<PangoLayout> lay(std::string_view text, double size) const {
    Object<PangoLayout> layout(pango_layout_new(context.get()));
    const std::string safe = printable(text.substr(0, BytesLaidOut));
    const Description font(pango_font_description_from_string(Family));
    pango_font_description_set_absolute_size(font.get(), size * PANGO_SCALE);
    pango_layout_set_font_description(layout.get(), font.get());
    pango_layout_set_single_paragraph_mode(layout.get(), TRUE);
    pango_layout_set_text(layout.get(), safe.data(), static_cast<int>(safe.size()));
    return layout;
  }

  cairo_t* drawing;
  Object<PangoFontMap> map;
  Object<PangoContext> context;
};

HomeScreenText::HomeScreenText(cairo_t* drawing) : fonts_(std::make_unique<Fonts>(drawing)) {}
HomeScreenText::~HomeScreenText() = default;

void HomeScreenText::write(std::string_view text, double centre, double baseline,
                           const Style& style) {
  const auto layout = fonts_->lay(text, style.size);
  pango_layout_set_width(layout.get(), static_cast<int>(style.width * PANGO_SCALE));
  pango_layout_set_ellipsize(layout.get(), PANGO_ELLIPSIZE_END);
  pango_layout_set_alignment(layout.get(), PANGO_ALIGN_CENTER);
  const double left = centre - style.width / 2;
  cairo_t* drawing = fonts_->drawing;
  cairo_save(drawing);
  cairo_rectangle(drawing, left, baseline - 1.2 * style.size, style.width, 1.7 * style.size);
  cairo_clip(drawing);
  cairo_move_to(drawing, left,
                baseline - double(pango_layout_get_baseline(layout.get())) / PANGO_SCALE);
  pango_cairo_show_layout(drawing, layout.get());
  cairo_restore(drawing);
}

void HomeScreenText::writeLetter(std::string_view letter, double x, double y, double size) {
  const auto layout = fonts_->lay(letter, size);
  if (pango_layout_get_unknown_glyphs_count(layout.get()) > 0) return;
  PangoRectangle ink;
  pango_layout_get_extents(layout.get(), &ink, nullptr);
  cairo_move_to(fonts_->drawing, x - (ink.x + ink.width / 2.0) / PANGO_SCALE,
                y - (ink.y + ink.height / 2.0) / PANGO_SCALE);
  pango_cairo_show_layout(fonts_->drawing, layout.get());
}

std::string initialOf(std::string_view name) {
  const std::string safe = printable(name.substr(0, BytesLaidOut));
  for (const char* at = safe.c_str(); *at; at = g_utf8_next_char(at)) {
    const gunichar character = g_utf8_get_char(at);
    if (!g_unichar_isalnum(character)) continue;
    std::string initial(6, '\0');
    initial.resize(
        static_cast<std::size_t>(g_unichar_to_utf8(g_unichar_toupper(character), initial.data())));
    return initial;
  }
  return {};
}

}  // namespace appsync::host
