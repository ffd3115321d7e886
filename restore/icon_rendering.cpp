#include "client/apps_client.h"
#include "platform/bundle.h"

namespace appsync {
namespace {

std::optional<FileLocation> directoryLocation(const std::string& path) {
  const bool usable = !path.empty() && path.find('\0') == std::string::npos;
  return usable ? std::optional(FileLocation::directory(path)) : std::nullopt;
}

}  // namespace

bool AppsClient::_makeIconFromBundlePath(const std::optional<std::string>& bundlePath,
                                         std::string_view saveTo) const {
  if (!bundlePath) {
    _log.error("missing bundlePath");
    return false;
  }
  const std::optional<FileLocation> location = directoryLocation(*bundlePath);
  if (!location) {
    _log.error("couldn't create URL");
    return false;
  }
  const std::optional<Bundle> bundle = Bundle::open(_platform.files, *location);
  if (!bundle) {
    _log.error("couldn't create bundle from URL");
    return false;
  }
  const std::optional<Image> icon = _platform.iconRenderer.renderHomeScreenIcon(*bundle);
  if (!icon) {
    _log.error("couldn't create DS icon from bundle");
    return false;
  }
  Bytes buffer;
  const std::unique_ptr<ImageEncoder> encoder =
      _platform.imageEncoders.create(buffer, "public.png", 1);
  if (!encoder) {
    _log.error("couldn't create image");
    return false;
  }
  encoder->addImage(*icon);
  if (!encoder->finalize()) {
    _log.error("Couldn't finalize image");
    return false;
  }
  if (!_platform.files.writeAtomically(saveTo, buffer)) {
    _log.error("Couldn't save image file to %{public}@", saveTo);
    return false;
  }
  return true;
}

}  // namespace appsync
