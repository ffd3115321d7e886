#include "host/phone/sync_host.h"

#include <cerrno>
#include <future>

namespace appsync::host {

HostProcess::HostProcess(std::string_view mainBundleIdentifier, std::string pluginBundleIdentifier,
                         const Interruption& interruption)
    : mainBundleIdentifier_(mainBundleIdentifier),
      pluginBundleIdentifier_(std::move(pluginBundleIdentifier)),
      interruption_(interruption) {}

SyncAssetPtr HostProcess::makeDownload(std::string_view identifier, std::string_view dataclass,
                                       const std::optional<std::string>& prettyName) noexcept {
  auto asset = std::make_shared<SyncAsset>();
  asset->identifier = identifier;
  asset->dataclass = dataclass;
  asset->prettyName = prettyName;
  asset->isDownload = true;
  asset->shortDescription = std::string(dataclass) + " " + asset->identifier;
  return asset;
}

bool HostProcess::TWIsRecoverableError(const Error& error) noexcept {
  if (error.domain != POSIXErrorDomain) return false;
  switch (error.code) {
    case ECONNABORTED:
    case ECONNREFUSED:
    case ECONNRESET:
    case EHOSTDOWN:
    case EHOSTUNREACH:
    case ENETDOWN:
    case ENETRESET:
    case ENETUNREACH:
    case ENOTCONN:
    case EPIPE:
    case ETIMEDOUT:
    case ECANCELED:
    case EINTR:
    case EDQUOT:
    case ENOSPC:
    case EAGAIN:
    case EBUSY:
    case EIO:
    case EMFILE:
    case ENFILE:
    case ENOMEM:
      return true;
    case EINVAL:
      return interruption_.requested();
    default:
      return false;
  }
}

void announceStartUp(SystemNotifier& notifier) {
  std::promise<void> heard;
  const auto hear = [](void* observer) noexcept {
    static_cast<std::promise<void>*>(observer)->set_value();
  };
  notifier.addObserver(&heard, TWStartupCompleteNotification, hear);
  notifier.post(TWStartupCompleteNotification);
  heard.get_future().wait();
  notifier.removeObserver(&heard, TWStartupCompleteNotification);
}

}  // namespace appsync::host
