#include <gtest/gtest.h>

#include <algorithm>
#include <array>
#include <cmath>
#include <limits>
#include <map>
#include <set>

#include "host/drawing/home_screen_drawing.h"

namespace appsync::host {
namespace {

using State = ScreenIcon::State;
using Pixel = std::array<int, 4>;  ///< red, green, blue, alpha

constexpr Pixel Red{230, 20, 30, 255}, Green{20, 220, 40, 255}, Blue{10, 30, 240, 255};

Image plain(const Pixel& pixel, std::uint32_t side = 120) {
  Image image{side, side, {}};
  for (std::size_t i = 0; i < std::size_t{side} * side; ++i) {
    for (const int channel : pixel) image.pixels.push_back(static_cast<std::byte>(channel));
  }
  return image;
}

ScreenIcon icon(const Pixel& pixel, State state = State::Installed, double progress = 0) {
  return {"Name", plain(pixel), state, progress};
}

/// A picture of all pages that the icons need.
Image draw(const std::vector<ScreenIcon>& icons) {
  const std::size_t pages = pagesFor(icons.size());
  return drawHomeScreen({pages, 0, pages}, icons);
}

Pixel at(const Image& image, std::uint32_t x, std::uint32_t y) {
  const auto* rgba = reinterpret_cast<const std::uint8_t*>(image.pixels.data()) +
                     (std::size_t{y} * image.width + x) * 4;
  return {rgba[0], rgba[1], rgba[2], rgba[3]};
}

/// A part of a picture; the right and bottom edges are not in it.
struct Box {
  std::uint32_t left = std::numeric_limits<std::uint32_t>::max(), top = left, right = 0, bottom = 0;

  std::uint32_t width() const { return right - left; }
  std::uint32_t height() const { return bottom - top; }
  void add(std::uint32_t x, std::uint32_t y) {
    left = std::min(left, x), right = std::max(right, x + 1);
    top = std::min(top, y), bottom = std::max(bottom, y + 1);
  }
};

template <class Function>
void forEachPixel(const Image& image, Function function) {
  for (std::uint32_t y = 0; y < image.height; ++y) {
    for (std::uint32_t x = 0; x < image.width; ++x) function(x, y);
  }
}

/// The smallest box around all pixels of a colour.
Box boxOf(const Image& image, const Pixel& pixel) {
  Box box;
  forEachPixel(image, [&](auto x, auto y) {
    if (at(image, x, y) == pixel) box.add(x, y);
  });
  return box;
}

/// The smallest box around all pixels that differ.
Box difference(const Image& a, const Image& b) {
  EXPECT_EQ(a.width, b.width);
  EXPECT_EQ(a.height, b.height);
  Box box;
  forEachPixel(a, [&](auto x, auto y) {
    if (at(a, x, y) != at(b, x, y)) box.add(x, y);
  });
  return box;
}

Image part(const Image& image, const Box& box) {
  Image result{box.width(), box.height(), {}};
  for (std::uint32_t y = box.top; y < box.bottom; ++y) {
    const auto begin = image.pixels.begin() + (std::ptrdiff_t{y} * image.width + box.left) * 4;
    result.pixels.insert(result.pixels.end(), begin, begin + std::ptrdiff_t{box.width()} * 4);
  }
  return result;
}

/// What stands in the place of each icon, without the corners that show the background.
std::vector<Image> drawIcons(const std::vector<ScreenIcon>& icons) {
  const auto colour = [](std::size_t i) { return Pixel{int(i) * 10 + 3, 250, 7, 255}; };
  std::vector<ScreenIcon> places;
  for (std::size_t i = 0; i < icons.size(); ++i) {
    places.push_back({"", plain(colour(i), 4), State::Installed, 0});
  }
  std::map<Pixel, Box> boxes;
  const Image coloured = draw(places), drawn = draw(icons);
  forEachPixel(coloured, [&](auto x, auto y) {
    const Pixel pixel = at(coloured, x, y);
    if (pixel[1] == 250 && pixel[2] == 7) boxes[pixel].add(x, y);
  });
  std::vector<Image> images;
  for (std::size_t i = 0; i < icons.size(); ++i) {
    const Box& box = boxes.at(colour(i));
    images.push_back(part(drawn, {box.left + 10, box.top + 10, box.right - 10, box.bottom - 10}));
  }
  return images;
}

/// Tiles of applications with these names and no picture.
std::vector<Bytes> drawTiles(const std::vector<std::string>& names) {
  std::vector<ScreenIcon> icons;
  for (const std::string& name : names) {
    icons.push_back({name, std::nullopt, State::Installed, 0});
  }
  std::vector<Bytes> tiles;
  for (Image& image : drawIcons(icons)) tiles.push_back(std::move(image.pixels));
  return tiles;
}

int brightness(const Pixel& pixel) { return pixel[0] + pixel[1] + pixel[2]; }
double saturation(const Pixel& pixel) {
  const double greatest = std::max({pixel[0], pixel[1], pixel[2]});
  return (greatest - std::min({pixel[0], pixel[1], pixel[2]})) / greatest;
}

std::size_t whitePixels(const Image& image) {
  std::size_t count = 0;
  forEachPixel(image, [&](auto x, auto y) { count += brightness(at(image, x, y)) > 3 * 225; });
  return count;
}

TEST(HomeScreenPicture, IconsStandInReadingOrder) {
  std::vector<ScreenIcon> icons(6, icon({1, 1, 1, 255}));
  icons[0] = icon(Red), icons[1] = icon(Green), icons[4] = icon(Blue);
  const Image image = draw(icons);
  const Box first = boxOf(image, Red), second = boxOf(image, Green), fifth = boxOf(image, Blue);
  EXPECT_EQ(first.top, second.top);
  EXPECT_LT(first.right, second.left);
  EXPECT_EQ(first.left, fifth.left) << "four to a row";
  EXPECT_LT(first.bottom, fifth.top);
}

TEST(HomeScreenPicture, AnInstalledIconIsShownPixelForPixelWithRoundedCorners) {
  const ScreenView view;
  const Image image = drawHomeScreen(view, {icon(Red)});
  const Box box = boxOf(image, Red);
  EXPECT_EQ(box.width(), view.iconSide());
  EXPECT_EQ(box.height(), view.iconSide());
  EXPECT_EQ(at(image, box.left + box.width() / 2, box.top), Red);
  for (const auto x : {box.left, box.right - 1}) {
    for (const auto y : {box.top, box.bottom - 1}) EXPECT_NE(at(image, x, y), Red);
  }
}

TEST(HomeScreenPicture, AnIconOfAnotherSizeFillsItsPlace) {
  const Box box = boxOf(draw({{"", plain(Red, 64), State::Installed, 0}}), Red);
  EXPECT_EQ(box.width(), ScreenView().iconSide());
  EXPECT_EQ(box.height(), ScreenView().iconSide());
}

TEST(HomeScreenPicture, APlaceholderIsDarkerAndGreyerThanTheInstalledApplication) {
  const auto drawn = drawIcons({icon(Red), icon(Red, State::Waiting), icon(Red, State::Loading),
                                icon(Red, State::Paused), icon(Red, State::Away)});
  for (std::size_t i = 1; i < drawn.size(); ++i) {
    for (const std::uint32_t x : {2u, 50u, 98u}) {
      const Pixel before = at(drawn[0], x, 2), after = at(drawn[i], x, 2);
      EXPECT_LT(brightness(after), brightness(before) * 2 / 3);
      EXPECT_LT(saturation(after), saturation(before) * 0.8);
    }
  }
}

TEST(HomeScreenPicture, TheRingFillsWithProgress) {
  std::vector<ScreenIcon> icons;
  for (const double progress : {0.0, 0.1, 0.3, 0.5, 0.75, 0.99, 1.0}) {
    icons.push_back(icon(Blue, State::Loading, progress));
  }
  std::size_t last = 0;
  for (const Image& drawn : drawIcons(icons)) {
    EXPECT_GT(whitePixels(drawn), last);
    last = whitePixels(drawn);
  }
}

TEST(HomeScreenPicture, ProgressBeyondItsBoundsIsDrawnAsTheBound) {
  std::vector<ScreenIcon> icons;
  const double infinity = std::numeric_limits<double>::infinity();
  for (const double progress : {0.0, -3.0, -infinity, std::nan(""), 1.0, 1.5, infinity}) {
    icons.push_back(icon(Blue, State::Loading, progress));
  }
  const auto drawn = drawIcons(icons);
  for (const std::size_t i : {1U, 2U, 3U}) EXPECT_EQ(drawn[i].pixels, drawn[0].pixels) << i;
  for (const std::size_t i : {5U, 6U}) EXPECT_EQ(drawn[i].pixels, drawn[4].pixels) << i;
}

TEST(HomeScreenPicture, EveryStateLooksDifferent) {
  std::vector<ScreenIcon> icons;
  for (const State state :
       {State::Installed, State::Waiting, State::Loading, State::Paused, State::Away}) {
    icons.push_back(icon(Blue, state, 0.5));
  }
  std::set<Bytes> looks;
  for (const Image& drawn : drawIcons(icons)) looks.insert(drawn.pixels);
  EXPECT_EQ(looks.size(), icons.size());
}

TEST(HomeScreenPicture, WithoutAPictureATileShowsTheFirstLetter) {
  const auto tiles = drawTiles({"Tally", "Tower", "tally", "\x01 \xff-tally", "Nine", ""});
  for (const std::size_t i : {1U, 2U, 3U}) EXPECT_EQ(tiles[i], tiles[0]) << i;
  EXPECT_NE(tiles[4], tiles[0]);
  EXPECT_NE(tiles[5], tiles[0]);
}

TEST(HomeScreenPicture, ABrokenPictureGivesTheTile) {
  const Image tile = draw({{"Tally", std::nullopt, State::Installed, 0}});
  Image tooFewPixels = plain(Red);
  tooFewPixels.pixels.pop_back();
  for (const Image& broken : {Image{}, tooFewPixels, Image{0, 5, {}}, Image{1u << 31, 2, {}}}) {
    EXPECT_EQ(draw({{"Tally", broken, State::Installed, 0}}).pixels, tile.pixels);
  }
}

TEST(HomeScreenPicture, TheNameStandsUnderItsIcon) {
  const auto named = [](const char* name) {
    std::vector<ScreenIcon> icons(9, icon(Blue));
    icons[4] = {name, plain(Red), State::Installed, 0};
    return draw(icons);
  };
  const Image unnamed = named("");
  const Box above = boxOf(unnamed, Red), icons = boxOf(unnamed, Blue);
  const Box name = difference(unnamed, named("Tally"));
  EXPECT_GE(name.top, above.bottom);
  EXPECT_LT(name.bottom, icons.bottom);
  EXPECT_NEAR(double(name.left + name.right), double(above.left + above.right), 6) << "centred";
}

TEST(HomeScreenPicture, ALongNameIsCutWithAnEllipsis) {
  const auto named = [](const char* name) {
    return draw({{name, plain(Red), State::Installed, 0}}).pixels;
  };
  const Bytes cut = named("Stillwater Recordings");
  EXPECT_EQ(cut, named("Stillwater Recordings Professional"));
  EXPECT_NE(cut, named("Stillwater"));
  EXPECT_NE(cut, named("Stillwater Re"));
}

TEST(HomeScreenPicture, NoNameLeavesItsCell) {
  const auto named = [](const std::string& name) {
    std::vector<ScreenIcon> icons(11, icon(Blue));
    icons[5] = {name, plain(Red), State::Installed, 0};
    return draw(icons);
  };
  const Image unnamed = named("");
  const Box own = boxOf(unnamed, Red);
  std::string tower = "z";
  for (int i = 0; i < 60; ++i) tower += "\xcc\x82";
  std::string lines;
  for (int i = 0; i < 30; ++i) lines += "line\n\xe2\x80\xa8\r\v";
  for (const std::string& name :
       {std::string(300, 'W'), std::string(5'000'000, 'x'), tower, lines,
        std::string(2'000, '\xff'), std::string("nul\0nul", 7), std::string("\x1b[31mred\x07"),
        std::string("\xe2\x80\xae"
                    "exe.gpj"),
        std::string("\xd9\x85\xd8\xb1\xd8\xad\xd8\xa8\xd8\xa7 \xd8\xb9\xd8\xa7\xd9\x84\xd9\x85"),
        std::string("\xf3\xbf\xbf\xbf \xf0\x9f\x8e\xb2"), std::string("<b>&amp;</b> %s %n")}) {
    const Box changed = difference(unnamed, named(name));
    EXPECT_GE(changed.top, own.bottom) << name.substr(0, 40);
    EXPECT_LT(changed.bottom, own.bottom + own.height() / 2);
    EXPECT_GT(changed.left, own.left - own.width() / 4);
    EXPECT_LT(changed.right, own.right + own.width() / 4);
  }
}

TEST(HomeScreenPicture, NamesThatDifferOnlyInUnsafeCharactersLookTheSame) {
  const auto named = [](const char* name) {
    return draw({{name, plain(Red), State::Installed, 0}}).pixels;
  };
  EXPECT_EQ(named("a\x07z"), named("a\xef\xbf\xbdz"));
  EXPECT_EQ(named("a\xe2\x80\xaez"), named("a\xffz"));
  EXPECT_NE(named("a\x07z"), named("az"));
}

TEST(HomeScreenPicture, CommonScriptsHaveTheirLetters) {
  const std::vector<std::string> names = {"",       "\xf3\xb0\x80\x80",
                                          "Ärger",  "Ωμέγα",
                                          "Журнал", "שלום",
                                          "سلام",   "कलम",
                                          "বাংলা",  "தமிழ்",
                                          "กขค",    "日本",
                                          "한국",   "中文",
                                          "Հայ",    "ქართ"};
  const auto tiles = drawTiles(names);
  EXPECT_EQ(tiles[1], tiles[0]) << "a letter that no font has is left out";
  for (std::size_t i = 2; i < names.size(); ++i) EXPECT_NE(tiles[i], tiles[0]) << names[i];
}

TEST(HomeScreenPicture, EmojiAreDrawnInColourAndAsLargeAsTheLetters) {
  const auto colours = [](const std::string& name) {
    const Image image = draw({{name, plain({0, 0, 0, 255}), State::Installed, 0}});
    Box box;
    forEachPixel(image, [&](auto x, auto y) {
      const Pixel pixel = at(image, x, y);
      if (pixel[0] > 220 && pixel[1] > 120 && pixel[1] < 210 && pixel[2] < 90) box.add(x, y);
    });
    return box;
  };
  const std::string face = "\xf0\x9f\x98\x80";
  EXPECT_EQ(colours("Name").right, 0U);
  const Box drawn = colours(face);
  ASSERT_GT(drawn.right, 0U);
  EXPECT_LT(drawn.height(), 2 * ScreenView().iconSide() / 5);
  EXPECT_NEAR(colours(face + " Name").height(), drawn.height(), 1);
}

TEST(HomeScreenPicture, WhatNoFontHasIsLeftOutOfAName) {
  const auto named = [](const std::string& name) {
    return draw({{name, plain(Red), State::Installed, 0}}).pixels;
  };
  EXPECT_EQ(named("a\xf3\xb0\x80\x80z"), named("az"));
}

TEST(HomeScreenPicture, PagesAreNumberedByTheirIcons) {
  EXPECT_EQ(pagesFor(0), 1u);
  EXPECT_EQ(pagesFor(1), 1u);
  EXPECT_EQ(pagesFor(24), 1u);
  EXPECT_EQ(pagesFor(25), 2u);
  EXPECT_EQ(pagesFor(500), 21u);
}

TEST(HomeScreenPicture, AnEmptyHomeScreenIsAPageWithoutIcons) {
  const Image empty = draw({});
  EXPECT_EQ(at(empty, 0, 0)[3], 0) << "the corner is outside";
  for (std::uint32_t y = 0; y < empty.height; ++y) {
    EXPECT_EQ(at(empty, empty.width / 2, y), at(empty, empty.width / 2 - 100, y)) << y;
  }
}

TEST(HomeScreenPicture, ASinglePageLooksAsItDoesAmongAll) {
  std::vector<ScreenIcon> icons(30, icon(Red));
  for (std::size_t i = 24; i < icons.size(); ++i) icons[i] = icon(Green);
  const Image all = draw(icons);
  const Image second = drawHomeScreen({2, 1, 1}, {icons.begin() + 24, icons.end()});
  EXPECT_EQ(all.height, second.height);
  EXPECT_GT(all.width, 2 * second.width);
  const Box right{all.width - second.width, 0, all.width, all.height};
  EXPECT_EQ(part(all, right).pixels, second.pixels);
  EXPECT_NE(drawHomeScreen({3, 1, 1}, {}).pixels, drawHomeScreen({3, 2, 1}, {}).pixels)
      << "dots tell which page it is";
}

TEST(HomeScreenPicture, FiveHundredIconsAreAllThereInOrder) {
  const auto colour = [](int i) { return Pixel{i % 25 * 10 + 5, i / 25 * 12 + 5, 200, 255}; };
  std::vector<ScreenIcon> icons;
  for (int i = 0; i < 500; ++i) icons.push_back({"", plain(colour(i), 4), State::Installed, 0});
  const Image image = draw(icons);
  std::map<Pixel, Box> boxes;
  forEachPixel(image, [&](auto x, auto y) {
    const Pixel pixel = at(image, x, y);
    if (pixel[2] == 200 && pixel[0] % 10 == 5 && pixel[1] % 12 == 5) boxes[pixel].add(x, y);
  });
  const std::uint32_t side = ScreenView{21, 0, 21}.iconSide();
  for (int i = 0; i < 500; ++i) {
    const Box& box = boxes[colour(i)];
    ASSERT_EQ(box.width(), side) << i;
    if (i % 4 == 0) continue;
    EXPECT_EQ(box.top, boxes[colour(i - 1)].top) << i;
    EXPECT_LT(boxes[colour(i - 1)].right, box.left) << i;
  }
  EXPECT_LT(boxes[colour(0)].right, boxes[colour(24)].left) << "pages stand side by side";
}

TEST(HomeScreenPicture, VeryManyPagesAreDrawnSmaller) {
  const std::size_t pages = ScreenView::MaximumPages;
  const ScreenView all{pages, 0, pages};
  EXPECT_EQ(all.iconSide(), ScreenView().iconSide() / 2);
  std::vector<ScreenIcon> icons(pages * IconsPerPage);
  icons.back() = {"", plain(Green, 2), State::Installed, 0};
  const Image image = drawHomeScreen(all, icons);
  EXPECT_LT(std::size_t{image.width} * image.height, std::size_t{30'000'000});
  EXPECT_EQ(boxOf(image, Green).width(), all.iconSide());
}

TEST(HomeScreenPicture, TheSameIconsGiveTheSamePicture) {
  const std::vector<ScreenIcon> icons = {
      icon(Red),
      icon(Green, State::Loading, 0.4),
      icon(Blue, State::Away),
      {"Stillwater \xe6\x97\xa5\xe6\x9c\xac", std::nullopt, State::Paused, 0}};
  EXPECT_EQ(draw(icons).pixels, draw(icons).pixels);
}

}  // namespace
}  // namespace appsync::host
