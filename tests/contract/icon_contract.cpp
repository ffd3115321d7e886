// IconRenderer and ImageEncoder.
#include "tests/contract/phone.h"

namespace appsync::contract {
namespace {

class IconContract : public ServiceContract {
 protected:
  static Image picture(std::uint32_t size) {
    return {size, size, Bytes(std::size_t{4} * size * size, std::byte{200})};
  }
  std::optional<Bytes> encoded(const Image& image) {
    Bytes buffer;
    const auto encoder = platform.imageEncoders.create(buffer, "public.png", 1);
    if (!encoder) return std::nullopt;
    encoder->addImage(image);
    return encoder->finalize() ? std::optional(buffer) : std::nullopt;
  }
  /// A bundle with this icon file.
  std::optional<Bundle> bundleWithIcon(std::string_view identifier, std::string_view icon) {
    const std::string path = placeholderBundle(identifier, "1.0");
    putFile(joinPath(path, "Icon.png"), icon);
    return Bundle::open(platform.files, FileLocation::directory(path));
  }
};

SERVICE_CONTRACT_OF(IconContract);

TEST_P(IconContract, DrawsIconsOfAnySizeInTheDevicesSize) {
  std::vector<std::uint32_t> widths;
  for (const std::uint32_t size : {8U, 100U}) {
    const std::optional<Bytes> icon = encoded(picture(size));
    ASSERT_TRUE(icon);
    const auto bundle = bundleWithIcon("com.a", asText(*icon));
    ASSERT_TRUE(bundle);
    const std::optional<Image> image = platform.iconRenderer.renderHomeScreenIcon(*bundle);
    ASSERT_TRUE(image);
    EXPECT_GT(image->width, 0U);
    EXPECT_EQ(image->width, image->height);
    EXPECT_EQ(image->pixels.size(), std::size_t{4} * image->width * image->height);
    widths.push_back(image->width);
  }
  EXPECT_EQ(widths.front(), widths.back());
}

TEST_P(IconContract, ABundleWithoutAnIconThatCanBeDrawnHasNone) {
  const std::string path = placeholderBundle("com.a", "1.0");
  const auto without = Bundle::open(platform.files, FileLocation::directory(path));
  ASSERT_TRUE(without);
  EXPECT_FALSE(platform.iconRenderer.renderHomeScreenIcon(*without));
  const auto withEmpty = bundleWithIcon("com.a", "");
  ASSERT_TRUE(withEmpty);
  EXPECT_FALSE(platform.iconRenderer.renderHomeScreenIcon(*withEmpty));
  putFile("/tmp/bare/file", "text");
  const auto bare = Bundle::open(platform.files, FileLocation::directory("/tmp/bare"));
  ASSERT_TRUE(bare);
  EXPECT_FALSE(platform.iconRenderer.renderHomeScreenIcon(*bare));
}

TEST_P(IconContract, AppendsTheEncodedPictureToTheBuffer) {
  Bytes buffer = toBytes("before");
  const Image image = picture(8);
  const auto encoder = platform.imageEncoders.create(buffer, "public.png", 1);
  ASSERT_TRUE(encoder);
  encoder->addImage(image);
  EXPECT_TRUE(encoder->finalize());
  EXPECT_TRUE(asText(buffer).starts_with("before"));
  const std::optional<Bytes> alone = encoded(image);
  ASSERT_TRUE(alone);
  EXPECT_EQ(asText(buffer).substr(6), asText(*alone));
}

TEST_P(IconContract, FinalizingFailsWhenPicturesAreMissingOrCannotBeEncoded) {
  Bytes buffer;
  const auto missing = platform.imageEncoders.create(buffer, "public.png", 1);
  ASSERT_TRUE(missing);
  EXPECT_FALSE(missing->finalize());
  Image torn = picture(8);
  torn.pixels.pop_back();
  EXPECT_FALSE(encoded(torn));
}

TEST_P(IconContract, AnUnknownTypeHasNoEncoder) {
  Bytes buffer;
  EXPECT_FALSE(platform.imageEncoders.create(buffer, "public.unknown", 1));
  EXPECT_FALSE(platform.imageEncoders.create(buffer, "", 1));
  EXPECT_TRUE(buffer.empty());
}

}  // namespace
}  // namespace appsync::contract
