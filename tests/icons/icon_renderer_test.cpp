#include "icons/icon_renderer.h"

#include <gtest/gtest.h>

#include "tests/fakes/fake_file_manager.h"
#include "tests/icons/icon_files.h"

namespace appsync {
namespace {

constexpr std::string_view BundlePath = "/var/mobile/Media/Chess.app";

class IconRendererTest : public testing::Test {
 protected:
  IconRendererTest() { files_.putDirectory(BundlePath); }

  void putFile(std::string_view name, Bytes bytes) {
    files_.putFile(joinPath(BundlePath, name), std::move(bytes));
  }
  void setIconName(const PropertyList& name) {
    files_.putPlist(joinPath(BundlePath, "Info.plist"),
                    PropertyList::Dictionary{{std::string(KBBundleIconFile), name}});
  }
  std::optional<Image> render(std::uint32_t side) {
    DeviceIconRenderer renderer(files_, side);
    return renderer.renderHomeScreenIcon(
        *Bundle::open(files_, FileLocation::directory(std::string(BundlePath))));
  }
  std::optional<Image> renderFile(Bytes bytes, std::uint32_t side) {
    putFile("Icon.png", std::move(bytes));
    return render(side);
  }

  fakes::CallTrace trace_;
  fakes::FakeClock clock_;
  fakes::FakeFileManager files_{trace_, clock_};
};

TEST_F(IconRendererTest, DrawsInTheDevicesSizeWithRoundCorners) {
  putFile("Icon.png", pngFile(64, 64, plain(Red)));
  DeviceIconRenderer renderer(files_);
  const auto icon = renderer.renderHomeScreenIcon(
      *Bundle::open(files_, FileLocation::directory(std::string(BundlePath))));
  ASSERT_TRUE(icon);
  EXPECT_EQ(icon->width, 180u);
  EXPECT_EQ(icon->height, 180u);
  EXPECT_EQ(icon->pixels.size(), 180u * 180u * 4u);
  EXPECT_EQ(pixelAt(*icon, 90, 90), Red);
  EXPECT_EQ(pixelAt(*icon, 90, 0), Red);
  for (const std::uint32_t x : {0u, 179u})
    for (const std::uint32_t y : {0u, 179u}) EXPECT_EQ(pixelAt(*icon, x, y)[3], 0);
  // The corner fades in over the pixels that its edge crosses.
  int halfway = 0;
  for (std::uint32_t i = 0; i < 41 * 41; ++i)
    halfway += pixelAt(*icon, i % 41, i / 41)[3] % 255 != 0;
  EXPECT_GE(halfway, 41);
}

TEST_F(IconRendererTest, AveragesWhatOnePixelCovers) {
  const auto icon = renderFile(pngFile(8, 8, checker(Black, White)), 4);
  ASSERT_TRUE(icon);
  EXPECT_EQ(pixelAt(*icon, 1, 1), (Pixel{128, 128, 128, 255}));
  EXPECT_EQ(pixelAt(*icon, 2, 3), (Pixel{128, 128, 128, 255}));
}

TEST_F(IconRendererTest, WeighsPixelsThatAreCoveredInPart) {
  // A target pixel covers one and a half columns.
  const Drawing columns = [](std::uint32_t x, std::uint32_t) {
    return Pixel{std::uint8_t(x * 20), 0, 0, 255};
  };
  const auto icon = renderFile(pngFile(9, 9, columns), 6);
  ASSERT_TRUE(icon);
  EXPECT_EQ(pixelAt(*icon, 2, 3)[0], 67);  // (60 + 80 / 2) / 1.5
  EXPECT_EQ(pixelAt(*icon, 3, 3)[0], 93);  // (80 / 2 + 100) / 1.5
}

TEST_F(IconRendererTest, HiddenColoursDoNotBleed) {
  const Pixel hiddenGreen{0, 255, 0, 0};
  const auto icon = renderFile(pngFile(8, 8, checker(Red, hiddenGreen)), 4);
  ASSERT_TRUE(icon);
  EXPECT_EQ(pixelAt(*icon, 1, 1), (Pixel{255, 0, 0, 128}));
  const auto invisible = renderFile(pngFile(8, 8, plain(hiddenGreen)), 4);
  EXPECT_EQ(invisible->pixels, Bytes(4 * 4 * 4));
}

TEST_F(IconRendererTest, FitsOblongPicturesAndLeavesTheRestTransparent) {
  const auto wide = renderFile(pngFile(8, 4, plain(Red)), 8);
  ASSERT_TRUE(wide);
  EXPECT_EQ(pixelAt(*wide, 4, 1)[3], 0);
  EXPECT_EQ(pixelAt(*wide, 4, 2), Red);
  EXPECT_EQ(pixelAt(*wide, 4, 5), Red);
  EXPECT_EQ(pixelAt(*wide, 4, 6)[3], 0);
  const auto thin = renderFile(pngFile(1, 4000, plain(Red)), 9);
  ASSERT_TRUE(thin);
  EXPECT_EQ(pixelAt(*thin, 3, 4)[3], 0);
  EXPECT_EQ(pixelAt(*thin, 4, 4), Red);
  EXPECT_EQ(pixelAt(*thin, 5, 4)[3], 0);
}

TEST_F(IconRendererTest, EnlargesSmallPictures) {
  const auto icon = renderFile(pngFile(2, 2, checker(Black, White)), 8);
  ASSERT_TRUE(icon);
  EXPECT_EQ(pixelAt(*icon, 3, 3), Black);
  EXPECT_EQ(pixelAt(*icon, 4, 3), White);
  EXPECT_EQ(pixelAt(*icon, 4, 4), Black);
}

TEST_F(IconRendererTest, EveryFormOfPngGivesTheSamePicture) {
  const auto expected = renderFile(pngFile(37, 37, checker(Black, White)), 16);
  ASSERT_TRUE(expected);
  for (const PngForm form : {PngForm::Rgb, PngForm::Rgba16, PngForm::Gray, PngForm::GrayAlpha,
                             PngForm::Palette, PngForm::OneBit}) {
    const auto icon = renderFile(pngFile(37, 37, checker(Black, White), form), 16);
    ASSERT_TRUE(icon);
    EXPECT_EQ(icon->pixels, expected->pixels) << int(form);
  }
  const auto clear =
      renderFile(pngFile(8, 8, checker(Black, White), PngForm::PaletteTransparent), 4);
  EXPECT_EQ(pixelAt(*clear, 1, 1), (Pixel{0, 0, 0, 128}));
}

TEST_F(IconRendererTest, InterlacedPngGivesTheSamePicture) {
  const Drawing drawing = [](std::uint32_t x, std::uint32_t y) {
    return Pixel{std::uint8_t(x * 31), std::uint8_t(y * 17), std::uint8_t(x * y),
                 std::uint8_t(x + y * 9)};
  };
  for (std::uint32_t width = 1; width <= 10; ++width) {
    for (std::uint32_t height = 1; height <= 10; ++height) {
      const auto rows = renderFile(pngFile(width, height, drawing), 5);
      const auto passes = renderFile(pngFile(width, height, drawing, PngForm::Rgba, true), 5);
      ASSERT_TRUE(rows && passes);
      EXPECT_EQ(rows->pixels, passes->pixels) << width << "x" << height;
    }
  }
}

void expectNear(const Pixel& a, const Pixel& b) {
  for (std::size_t i = 0; i < 4; ++i) EXPECT_NEAR(a[i], b[i], 3) << "channel " << i;
}

TEST_F(IconRendererTest, DrawsEveryFormOfJpeg) {
  const Pixel colour{200, 100, 50, 255};
  for (const JpegForm form : {JpegForm::Rgb, JpegForm::Cmyk, JpegForm::Progressive}) {
    const auto icon = renderFile(jpegFile(50, 50, plain(colour), form), 20);
    ASSERT_TRUE(icon);
    expectNear(pixelAt(*icon, 10, 10), colour);
  }
  const auto gray = renderFile(jpegFile(50, 50, plain(colour), JpegForm::Gray), 20);
  ASSERT_TRUE(gray);
  expectNear(pixelAt(*gray, 10, 10), {200, 200, 200, 255});
}

TEST_F(IconRendererTest, DrawsJpegsMuchLargerThanTheIcon) {
  const Drawing halves = [](std::uint32_t x, std::uint32_t) { return x < 600 ? Black : White; };
  const auto icon = renderFile(jpegFile(1200, 600, halves), 20);
  ASSERT_TRUE(icon);
  expectNear(pixelAt(*icon, 5, 10), Black);
  expectNear(pixelAt(*icon, 15, 10), White);
  EXPECT_EQ(pixelAt(*icon, 10, 2)[3], 0);
}

TEST_F(IconRendererTest, TakesTheIconThatTheBundleNames) {
  putFile("Icon.png", pngFile(4, 4, plain(Black)));
  putFile("App.png", pngFile(4, 4, plain(Red)));
  putFile("App.jpg", jpegFile(8, 8, plain(White)));
  const auto centre = [&] { return pixelAt(*render(8), 4, 4); };
  EXPECT_EQ(centre(), Black);
  setIconName("App");
  EXPECT_EQ(centre(), Red);
  setIconName("App.png");
  EXPECT_EQ(centre(), Red);
  setIconName("App.jpg");
  EXPECT_EQ(centre(), White);
  setIconName("");
  EXPECT_EQ(centre(), Black);
  setIconName(5);
  EXPECT_EQ(centre(), Black);
}

TEST_F(IconRendererTest, RefusesNamesThatLeadOutOfTheBundle) {
  files_.putFile("/var/mobile/Media/Icon.png", pngFile(4, 4, plain(Red)));
  putFile("sub/Icon.png", pngFile(4, 4, plain(Red)));
  for (const char* name :
       {"../Icon.png", "sub/Icon.png", "/var/mobile/Media/Icon.png", ".", ".."}) {
    setIconName(name);
    EXPECT_EQ(render(8), std::nullopt) << name;
  }
}

TEST_F(IconRendererTest, HasNoIconWhereThereIsNone) {
  EXPECT_EQ(render(8), std::nullopt);
  files_.putDirectory(joinPath(BundlePath, "Icon.png"));
  EXPECT_EQ(render(8), std::nullopt);
  files_.erase(joinPath(BundlePath, "Icon.png"));
  for (const char* text : {"", "x", "GIF89a", "\x89PNG\r\n\x1a\n", "\xff\xd8\xff"})
    EXPECT_EQ(renderFile(toBytes(text), 8), std::nullopt) << text;
}

TEST_F(IconRendererTest, RefusesFilesThatAreTooLarge) {
  Bytes file = pngFile(4, 4, plain(Red));
  ASSERT_TRUE(renderFile(file, 8));
  file.resize((std::size_t{32} << 20) + 1);
  EXPECT_EQ(renderFile(std::move(file), 8), std::nullopt);
}

TEST_F(IconRendererTest, RefusesSidesThatNoDeviceHas) {
  putFile("Icon.png", pngFile(4, 4, plain(Red)));
  EXPECT_EQ(render(0), std::nullopt);
  EXPECT_EQ(render(1025), std::nullopt);
  EXPECT_TRUE(render(1));
  EXPECT_TRUE(render(1024));
}

TEST_F(IconRendererTest, RefusesPicturesOfHugeSizes) {
  for (const auto& [width, height] :
       {std::pair{8193u, 4u}, std::pair{4u, 8193u}, std::pair{100'000u, 100'000u},
        std::pair{0x7fffffffu, 0x7fffffffu}, std::pair{0u, 4u}}) {
    Bytes file = pngFile(4, 4, plain(Red));
    setPngSize(file, width, height);
    EXPECT_EQ(renderFile(std::move(file), 8), std::nullopt) << width << "x" << height;
  }
  EXPECT_EQ(renderFile(jpegFile(8200, 1, plain(Red)), 8), std::nullopt);
  EXPECT_TRUE(renderFile(pngFile(8192, 1, plain(Red)), 8));
}

TEST_F(IconRendererTest, RefusesAPictureThatIsLargerThanItsData) {
  Bytes file = pngFile(4, 4, plain(Red));
  setPngSize(file, 8192, 8192);
  EXPECT_EQ(renderFile(std::move(file), 8), std::nullopt);
}

TEST_F(IconRendererTest, PassesOverTextThatWouldUnpackToFarMore) {
  const auto icon = renderFile(pngFile(4, 4, plain(Red), PngForm::Rgba, false, 32 << 20), 8);
  ASSERT_TRUE(icon);
  EXPECT_EQ(pixelAt(*icon, 4, 4), Red);
}

TEST_F(IconRendererTest, RefusesAChunkThatSaysItIsLargerThanTheFile) {
  Bytes file = pngFile(4, 4, plain(Red), PngForm::Rgba, false, 100);
  const std::size_t text = asText(file).find("zTXt");
  ASSERT_NE(text, std::string_view::npos);
  file[text - 4] = std::byte{0x35};  // the highest byte of its length
  EXPECT_EQ(renderFile(std::move(file), 8), std::nullopt);
}

class DamagedIcon : public IconRendererTest {
 protected:
  static Bytes picture(int kind) {
    const Drawing drawing = [](std::uint32_t x, std::uint32_t y) {
      return Pixel{std::uint8_t(x * 13), std::uint8_t(y * 7), std::uint8_t(x * y), 255};
    };
    if (kind == 0) return pngFile(40, 40, drawing);
    if (kind == 1) return pngFile(40, 40, drawing, PngForm::Rgba, true);
    return jpegFile(40, 40, drawing, kind == 2 ? JpegForm::Rgb : JpegForm::Progressive);
  }
};

TEST_F(DamagedIcon, IsRefusedWhereverItIsCutOff) {
  for (int kind = 0; kind < 4; ++kind) {
    const Bytes whole = picture(kind);
    ASSERT_TRUE(renderFile(whole, 8));
    for (std::size_t size = 0; size < whole.size(); size += size < 64 ? 1 : 7) {
      const Bytes part(whole.begin(), whole.begin() + std::ptrdiff_t(size));
      EXPECT_EQ(renderFile(part, 8), std::nullopt) << "kind " << kind << ", " << size << " bytes";
    }
    EXPECT_EQ(renderFile(Bytes(whole.begin(), whole.end() - 1), 8), std::nullopt);
  }
}

TEST_F(DamagedIcon, NeverCrashesAndPngNoticesEveryChange) {
  for (int kind = 0; kind < 4; ++kind) {
    const Bytes whole = picture(kind);
    for (std::size_t at = 0; at < whole.size(); at += 3) {
      Bytes changed = whole;
      changed[at] ^= std::byte{0x24};
      const auto icon = renderFile(changed, 8);
      if (kind < 2) {
        EXPECT_EQ(icon, std::nullopt) << at;
      }
    }
  }
}

}  // namespace

}  // namespace appsync
