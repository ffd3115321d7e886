#include "tests/fakes/fake_icon_renderer.h"

#include <string>
#include <vector>

namespace appsync::fakes {

namespace {

class FakeImageEncoder : public ImageEncoder {
 public:
  FakeImageEncoder(Bytes& buffer, std::string_view type, std::size_t imageCount, bool fails)
      : buffer_(buffer), type_(type), imageCount_(imageCount), fails_(fails) {}

  void addImage(const Image& image) noexcept override { images_.push_back(&image); }

  bool finalize() noexcept override {
    if (fails_ || images_.size() != imageCount_) return false;
    std::string text;
    for (const Image* image : images_) {
      if (image->pixels.size() != std::size_t{4} * image->width * image->height) return false;
      text += type_ + " " + std::to_string(image->width) + "x" + std::to_string(image->height);
    }
    const Bytes bytes = toBytes(text);
    buffer_.insert(buffer_.end(), bytes.begin(), bytes.end());
    return true;
  }

 private:
  Bytes& buffer_;
  std::string type_;
  std::size_t imageCount_;
  bool fails_;
  std::vector<const Image*> images_;
};

}  // namespace

std::optional<Image> FakeIconRenderer::renderHomeScreenIcon(const Bundle& bundle) noexcept {
  trace_.add(TraceQuery, callText("IconRenderer.renderHomeScreenIcon", bundle.path()));
  const std::string* icon = findString(bundle.infoDictionary(), KBBundleIconFile);
  if (!icon) return std::nullopt;
  const std::optional<Bytes> bytes = files_.bytesAt(joinPath(bundle.path(), *icon));
  if (!bytes || bytes->empty()) return std::nullopt;
  return Image{2, 2, Bytes(16, std::byte{255})};
}

std::unique_ptr<ImageEncoder> FakeImageEncoderService::create(Bytes& buffer, std::string_view type,
                                                              std::size_t imageCount) noexcept {
  trace_.add(TraceQuery, callText("ImageEncoder.create", type, imageCount));
  if (failCreate_ || type != "public.png" || imageCount != 1) return nullptr;
  return std::make_unique<FakeImageEncoder>(buffer, type, imageCount, failFinalize_);
}

}  // namespace appsync::fakes
