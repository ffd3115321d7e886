#include "host/phone/sync_host.h"

#include <algorithm>
#include <cerrno>
#include <future>

namespace appsync::host {
namespace {

constexpr int Recoverable[] = {
    ECONNABORTED, ECONNREFUSED, ECONNRESET, EHOSTDOWN, EHOSTUNREACH, ENETDOWN, ENETRESET,
    ENETUNREACH,  ENOTCONN,     EPIPE,      ETIMEDOUT, ECANCELED,    EINTR,    EDQUOT,
    ENOSPC,       EAGAIN,       EBUSY,      EIO,       EMFILE,       ENFILE,   ENOMEM};

}  // namespace

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
  if (error.code == EINVAL) return interruption_.requested();
  return std::ranges::find(Recoverable, error.code) != std::end(Recoverable);
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
