#pragma once

#include <concepts>

#include "platform/app_registry.h"
#include "platform/background_queue.h"
#include "platform/backup_manager.h"
#include "platform/device_policy.h"
#include "platform/file_manager.h"
#include "platform/home_screen_service.h"
#include "platform/icon_renderer.h"
#include "platform/install_coordination.h"
#include "platform/installer_service.h"
#include "platform/log.h"
#include "platform/sync_host.h"
#include "platform/system_notifier.h"
#include "platform/transaction_log.h"

namespace appsync {

/// Every service that the client uses. All outlive the client.
struct Platform {
  Log& log;
  FileManager& files;
  AppRegistry& appRegistry;
  InstallCoordination& installCoordination;
  InstallerService& installerService;
  BackupManager& backupManager;
  DevicePolicy& devicePolicy;
  HomeScreenService& homeScreen;
  IconRenderer& iconRenderer;
  ImageEncoderService& imageEncoders;
  TransactionLog& transactionLog;
  SystemNotifier& systemNotifier;
  SyncHost& syncHost;
  BackgroundQueue& backgroundQueue;
};

/// The same services, but for this one.
template <typename Service>
Platform with(const Platform& all, Service& other) {
  const auto pick = [&other]<typename Own>(Own& own) -> Own& {
    if constexpr (std::derived_from<Service, Own>) {
      return other;
    } else {
      return own;
    }
  };
  return {.log = pick(all.log),
          .files = pick(all.files),
          .appRegistry = pick(all.appRegistry),
          .installCoordination = pick(all.installCoordination),
          .installerService = pick(all.installerService),
          .backupManager = pick(all.backupManager),
          .devicePolicy = pick(all.devicePolicy),
          .homeScreen = pick(all.homeScreen),
          .iconRenderer = pick(all.iconRenderer),
          .imageEncoders = pick(all.imageEncoders),
          .transactionLog = pick(all.transactionLog),
          .systemNotifier = pick(all.systemNotifier),
          .syncHost = pick(all.syncHost),
          .backgroundQueue = pick(all.backgroundQueue)};
}

}  // namespace appsync
