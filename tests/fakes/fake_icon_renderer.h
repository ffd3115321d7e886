#pragma once

#include <atomic>

#include "platform/icon_renderer.h"
#include "tests/fakes/call_trace.h"
#include "tests/fakes/fake_file_manager.h"

namespace appsync::fakes {

/// Draws a 2x2 picture for a bundle whose KBBundleIconFile is there and not empty.
class FakeIconRenderer : public IconRenderer {
 public:
  FakeIconRenderer(CallTrace& trace, const FakeFileManager& files) : trace_(trace), files_(files) {}

  std::optional<Image> renderHomeScreenIcon(const Bundle& bundle) noexcept override;

 private:
  CallTrace& trace_;
  const FakeFileManager& files_;
};

/// Encodes pictures as text: "<type> 2x2" per picture.
class FakeImageEncoderService : public ImageEncoderService {
 public:
  explicit FakeImageEncoderService(CallTrace& trace) : trace_(trace) {}

  std::unique_ptr<ImageEncoder> create(Bytes& buffer, std::string_view type,
                                       std::size_t imageCount) noexcept override;

  void failCreate(bool fail) { failCreate_ = fail; }
  void failFinalize(bool fail) { failFinalize_ = fail; }

 private:
  CallTrace& trace_;
  std::atomic<bool> failCreate_ = false;
  std::atomic<bool> failFinalize_ = false;
};

}  // namespace appsync::fakes
