#include "host/drawing/home_screen_text.h"

#include <fontconfig/fontconfig.h>
#include <pango/pangocairo.h>

#include <algorithm>
#include <filesystem>
#include <stdexcept>
#include <string>
#include <vector>

#include "base/text.h"
#include "host/drawing/home_screen_surface.h"

namespace appsync::host {
namespace {
namespace fs = std::filesystem;

// Debian's fonts-noto-core, fonts-noto-color-emoji and fonts-droid-fallback (Chinese, Japanese,
// Korean).
constexpr const char* MainFonts = "/usr/share/fonts/truetype/noto";
constexpr const char* EastAsianFont =
    "/usr/share/fonts-droid-fallback/truetype/DroidSansFallback.ttf";
constexpr std::string_view EmojiFont = "NotoColorEmoji.ttf";
constexpr const char* Family = "Noto Sans";
/// Emoji are pictures of one size, and are to be as large as the letters.
constexpr const char* ScalingRule = R"(<fontconfig><match target="font">
  <test name="outline" compare="eq"><bool>false</bool></test>
  <edit name="matrix" mode="assign"><times><name>matrix</name><matrix>
    <divide><name target="pattern">pixelsize</name><name target="font">pixelsize</name></divide>
    <double>0</double> <double>0</double>
    <divide><name target="pattern">pixelsize</name><name target="font">pixelsize</name></divide>
  </matrix></times></edit>
</match></fontconfig>)";
/// Nobody sees more of a name than this, and laying out a huge one takes long.
constexpr std::size_t BytesLaidOut = 400;

template <class T>
using Object = std::unique_ptr<T, Releaser<g_object_unref>>;
using Description = std::unique_ptr<PangoFontDescription, Releaser<pango_font_description_free>>;
using CharacterSet = std::unique_ptr<FcCharSet, Releaser<FcCharSetDestroy>>;
using FontOptions = std::unique_ptr<cairo_font_options_t, Releaser<cairo_font_options_destroy>>;

std::vector<std::string> fontFiles() {
  std::vector<std::string> files;
  std::error_code error;
  for (fs::directory_iterator item(MainFonts, error), end; !error && item != end;
       item.increment(error)) {
    const std::string name = item->path().filename();
    const bool isLetters = name.starts_with("NotoSans") && name.ends_with("-Regular.ttf");
    if (isLetters || name == EmojiFont) files.push_back(item->path());
  }
  std::sort(files.begin(), files.end());
  files.push_back(EastAsianFont);
  return files;
}

const FcChar8* forFontconfig(const char* text) { return reinterpret_cast<const FcChar8*>(text); }

/// Makes these fonts the only ones of this process: neither the machine's settings nor its other
/// fonts change a picture, and no cache is needed. The characters that they have; none when they
/// cannot be used.
CharacterSet useFonts() {
  FcConfig* config = FcConfigCreate();
  CharacterSet characters;
  for (const std::string& file : fontFiles()) {
    FcConfigAppFontAddFile(config, forFontconfig(file.c_str()));
  }
  const FcFontSet* fonts = FcConfigGetFonts(config, FcSetApplication);
  const bool usable = fonts && fonts->nfont > 0 &&
                      FcConfigParseAndLoadFromMemory(config, forFontconfig(ScalingRule), FcTrue) &&
                      FcConfigSetCurrent(config);
  if (usable) characters.reset(FcCharSetCreate());
  for (int i = 0; usable && i < fonts->nfont; ++i) {
    FcCharSet* own = nullptr;
    FcPatternGetCharSet(fonts->fonts[i], FC_CHARSET, 0, &own);
    if (own) FcCharSetMerge(characters.get(), own, nullptr);
  }
  FcConfigDestroy(config);  // the process keeps its own reference
  return characters;
}

/// Null when there are no fonts.
const FcCharSet* knownCharacters() {
  static const CharacterSet known = useFonts();
  return known.get();
}

Object<PangoFontMap> makeFontMap() {
  if (!knownCharacters()) {
    throw std::runtime_error(
        "no fonts to write with: install the packages fonts-noto-core, fonts-noto-color-emoji and "
        "fonts-droid-fallback");
  }
  return Object<PangoFontMap>(pango_cairo_font_map_new_for_font_type(CAIRO_FONT_TYPE_FT));
}

/// The text without the characters that would be boxes since no font has them.
std::string writable(std::string_view text) {
  const std::string safe = printable(text.substr(0, BytesLaidOut));
  std::string known;
  for (const char* at = safe.c_str(); *at;) {
    const char* next = g_utf8_next_char(at);
    const gunichar character = g_utf8_get_char(at);
    if (g_unichar_iszerowidth(character) || FcCharSetHasChar(knownCharacters(), character)) {
      known.append(at, next);
    }
    at = next;
  }
  return known;
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
    const std::string known = writable(text);
    const Description font(pango_font_description_from_string(Family));
    pango_font_description_set_absolute_size(font.get(), size * PANGO_SCALE);
    pango_layout_set_font_description(layout.get(), font.get());
    pango_layout_set_single_paragraph_mode(layout.get(), TRUE);
    pango_layout_set_text(layout.get(), known.data(), static_cast<int>(known.size()));
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
