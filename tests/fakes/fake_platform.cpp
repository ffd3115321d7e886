#include "tests/fakes/fake_platform.h"

namespace appsync::fakes {

// Here, so that all the fakes' code is compiled once and not in each test.
FakePlatform::FakePlatform() = default;
FakePlatform::~FakePlatform() = default;

Platform FakePlatform::platform() {
  return {.log = log,
          .files = faultyFiles,
          .appRegistry = faultyRegistry,
          .installCoordination = installCoordination,
          .installerService = installerService,
          .backupManager = backup,
          .devicePolicy = policy,
          .homeScreen = homeScreen,
          .iconRenderer = iconRenderer,
          .imageEncoders = imageEncoders,
          .transactionLog = transactions,
          .systemNotifier = notifier,
          .syncHost = host,
          .backgroundQueue = backgroundQueue};
}

}  // namespace appsync::fakes
