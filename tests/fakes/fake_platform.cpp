#include "tests/fakes/fake_platform.h"

namespace appsync::fakes {

// Here, so that all the fakes' code is compiled once and not in each test.
FakePlatform::FakePlatform() = default;
FakePlatform::~FakePlatform() = default;

Platform FakePlatform::platform() {
  return {log,          faultyFiles, faultyRegistry, installCoordination, installerService,
          backup,       policy,      homeScreen,     iconRenderer,        imageEncoders,
          transactions, notifier,    host,           backgroundQueue};
}

}  // namespace appsync::fakes
