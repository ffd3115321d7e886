#include "icons/image_encoder.h"

#include <gtest/gtest.h>
#include <png.h>

namespace appsync {
namespace {

Image gradient(std::uint32_t width, std::uint32_t height) {
  Image image{width, height, Bytes(std::size_t{width} * height * 4)};
  for (std::size_t i = 0; i < image.pixels.size(); ++i)
    image.pixels[i] = static_cast<std::byte>(i * 37 >> 3);
  return image;
}

using Compression = PngEncoderService::Compression;

std::optional<Bytes> encoded(const Image& image, Compression compression = Compression::Small) {
  Bytes buffer;
  const auto encoder = PngEncoderService(compression).create(buffer, "public.png", 1);
  encoder->addImage(image);
  if (!encoder->finalize()) return std::nullopt;
  return buffer;
}

/// Read back by the library's own reader of whole files.
Image decoded(ByteView file) {
  png_image png{};
  png.version = PNG_IMAGE_VERSION;
  Image image;
  if (!png_image_begin_read_from_memory(&png, file.data(), file.size())) return image;
  png.format = PNG_FORMAT_RGBA;
  image = {png.width, png.height, Bytes(PNG_IMAGE_SIZE(png))};
  png_image_finish_read(&png, nullptr, image.pixels.data(), 0, nullptr);
  return image;
}

TEST(PngEncoder, WritesEveryPixelAsItIs) {
  for (const auto& [width, height] :
       {std::pair{1u, 1u}, std::pair{180u, 180u}, std::pair{7u, 300u}}) {
    const Image image = gradient(width, height);
    const auto file = encoded(image);
    ASSERT_TRUE(file);
    const Image back = decoded(*file);
    EXPECT_EQ(back.width, width);
    EXPECT_EQ(back.height, height);
    EXPECT_EQ(back.pixels, image.pixels);
  }
}

TEST(PngEncoder, WritesTheSamePixelsQuicklyInOtherBytes) {
  const Image image = gradient(180, 180);
  const auto quick = encoded(image, Compression::Quick);
  ASSERT_TRUE(quick);
  EXPECT_EQ(decoded(*quick).pixels, image.pixels);
  EXPECT_NE(quick, encoded(image));
}

TEST(PngEncoder, AppendsToTheBuffer) {
  Bytes buffer = toBytes("before");
  const Image image = gradient(3, 2);
  const auto encoder = PngEncoderService().create(buffer, "public.png", 1);
  encoder->addImage(image);
  EXPECT_TRUE(encoder->finalize());
  EXPECT_TRUE(asText(buffer).starts_with("before\x89PNG"));
  EXPECT_EQ(decoded(ByteView(buffer).subspan(6)).pixels, image.pixels);
}

TEST(PngEncoder, KnowsOnePictureOfOneTypeOnly) {
  Bytes buffer;
  PngEncoderService service;
  EXPECT_EQ(service.create(buffer, "public.jpeg", 1), nullptr);
  EXPECT_EQ(service.create(buffer, "", 1), nullptr);
  EXPECT_EQ(service.create(buffer, "public.png", 0), nullptr);
  EXPECT_EQ(service.create(buffer, "public.png", 2), nullptr);
}

TEST(PngEncoder, RefusesAnythingButOneWholePicture) {
  const Image whole = gradient(4, 4);
  Image shortOfPixels = whole, withoutWidth = whole, huge;
  shortOfPixels.pixels.pop_back();
  withoutWidth.width = 0;
  huge.width = huge.height = 0x80000000;
  EXPECT_EQ(encoded(shortOfPixels), std::nullopt);
  EXPECT_EQ(encoded(withoutWidth), std::nullopt);
  EXPECT_EQ(encoded(huge), std::nullopt);
  EXPECT_EQ(encoded(Image{}), std::nullopt);

  Bytes buffer = toBytes("before");
  PngEncoderService service;
  EXPECT_FALSE(service.create(buffer, "public.png", 1)->finalize());
  const auto encoder = service.create(buffer, "public.png", 1);
  encoder->addImage(whole);
  encoder->addImage(whole);
  EXPECT_FALSE(encoder->finalize());
  EXPECT_EQ(asText(buffer), "before");
}

TEST(PngEncoder, WritesItsFileOnce) {
  Bytes buffer;
  const Image image = gradient(4, 4);
  const auto encoder = PngEncoderService().create(buffer, "public.png", 1);
  encoder->addImage(image);
  EXPECT_TRUE(encoder->finalize());
  const std::size_t size = buffer.size();
  EXPECT_FALSE(encoder->finalize());
  EXPECT_EQ(buffer.size(), size);
}

}  // namespace
}  // namespace appsync
