#pragma once

#include "platform/platform.h"
#include "tests/fakes/fake_app_registry.h"
#include "tests/fakes/fake_background_queue.h"
#include "tests/fakes/fake_backup_manager.h"
#include "tests/fakes/fake_device_policy.h"
#include "tests/fakes/fake_home_screen.h"
#include "tests/fakes/fake_icon_renderer.h"
#include "tests/fakes/fake_install_coordination.h"
#include "tests/fakes/fake_log.h"
#include "tests/fakes/fake_sync_host.h"
#include "tests/fakes/fake_system_notifier.h"
#include "tests/fakes/fake_transaction_log.h"
#include "tests/fakes/faulty_app_registry.h"
#include "tests/fakes/faulty_file_manager.h"

namespace appsync::fakes {

/// A whole phone in memory. A test prepares and examines the fakes; the client gets `platform()`,
/// in which planned faults of `faults` strike.
struct FakePlatform {
  FakePlatform();
  ~FakePlatform();
  FakePlatform(const FakePlatform&) = delete;
  FakePlatform& operator=(const FakePlatform&) = delete;

  Platform platform();

  CallTrace trace;
  FakeClock clock;
  FaultPlan faults{trace};
  FakeLog log{trace};
  FakeFileManager files{trace, clock};
  FakeInstallerService installerService{trace};
  FakeAppRegistry appRegistry{trace, files, installerService};
  FakeInstallCoordination installCoordination{trace, faults, appRegistry};
  FakeBackupManager backup{trace};
  FakeDevicePolicy policy{trace};
  FakeHomeScreen homeScreen{trace};
  FakeIconRenderer iconRenderer{trace, files};
  FakeImageEncoderService imageEncoders{trace};
  FakeTransactionLog transactions{trace};
  FakeSystemNotifier notifier{trace};
  FakeSyncHost host{trace};
  FakeBackgroundQueue backgroundQueue{trace, clock};
  FaultyFileManager faultyFiles{files, faults};
  FaultyAppRegistry faultyRegistry{appRegistry, faults};
};

}  // namespace appsync::fakes
