#pragma once

#include <string>

#include "base/interruption.h"
#include "host/phone/transfer_queue.h"
#include "platform/sync_host.h"
#include "platform/system_notifier.h"

namespace appsync::host {

/// Main bundle identifier of a program that loads the plug-in only to ask it something.
inline constexpr std::string_view QueryToolBundleIdentifier = "com.corvane.appsync";

/// This process as the plug-in sees it.
class HostProcess : public SyncHost {
 public:
  /// Borrows the interruption for its life.
  HostProcess(std::string_view mainBundleIdentifier, std::string pluginBundleIdentifier,
              const Interruption& interruption);

  std::string mainBundleIdentifier() noexcept override { return mainBundleIdentifier_; }
  std::string pluginBundleIdentifier() noexcept override { return pluginBundleIdentifier_; }
  SyncAssetPtr makeDownload(std::string_view identifier, std::string_view dataclass,
                            const std::optional<std::string>& prettyName) noexcept override;
  /// True for lost connections, interruptions, a full disk and "try again"; while the host is being
  /// interrupted also for the error of an install that could not wait any longer.
  bool TWIsRecoverableError(const Error& error) noexcept override;
  SyncHostService& service() noexcept override { return transfers_; }

  TransferQueue& transfers() { return transfers_; }

 private:
  const std::string mainBundleIdentifier_;
  const std::string pluginBundleIdentifier_;
  const Interruption& interruption_;
  TransferQueue transfers_;
};

/// Tells the plug-in's clients that the sync host is ready, and returns when they have heard of it:
/// only then do they get the events that a killed sync left over, and only then can the phone be
/// seen to have some for them.
void announceStartUp(SystemNotifier& notifier);

}  // namespace appsync::host
