#include "host/phone/sync_host.h"

#include <cerrno>

#include "platform/installer_service.h"
#include "tests/test_pch.h"

namespace appsync::host {
namespace {

class HostProcessTest : public ::testing::Test {
 protected:
  bool recoverable(std::string_view domain, std::int64_t code) {
    return host.TWIsRecoverableError({std::string(domain), code, {}, nullptr});
  }

  Interruption interruption;
  HostProcess host{SyncHostBundleIdentifier, "com.plugin", interruption};
};

TEST_F(HostProcessTest, NamesItselfAndThePlugIn) {
  EXPECT_EQ(host.mainBundleIdentifier(), "com.corvane.twc");
  EXPECT_EQ(host.pluginBundleIdentifier(), "com.plugin");
}

TEST_F(HostProcessTest, MakesDownloads) {
  const auto asset = host.makeDownload("com.a", "Application", "Alpha");
  EXPECT_TRUE(asset->isDownload);
  EXPECT_EQ(asset->identifier, "com.a");
  EXPECT_EQ(asset->dataclass, "Application");
  EXPECT_EQ(asset->prettyName, "Alpha");
  EXPECT_EQ(asset->shortDescription, "Application com.a");
  EXPECT_FALSE(host.makeDownload("com.a", "Application", std::nullopt)->prettyName);
}

TEST_F(HostProcessTest, TakesWhatMayPassForRecoverable) {
  for (const int code : {ECONNRESET, ETIMEDOUT, EPIPE, EINTR, ECANCELED, ENOSPC, EDQUOT, EAGAIN,
                         EIO, EMFILE, ENFILE, ENOMEM}) {
    EXPECT_TRUE(recoverable(POSIXErrorDomain, code)) << code;
  }
  for (const int code : {ENOENT, EACCES, EINVAL, 0}) {
    EXPECT_FALSE(recoverable(POSIXErrorDomain, code)) << code;
  }
}

TEST_F(HostProcessTest, NeverTakesARefusedPackageForRecoverable) {
  interruption.request();
  for (std::int64_t code = 0; code < 200; ++code) {
    EXPECT_FALSE(recoverable(InstallerServiceErrorDomain, code));
    EXPECT_FALSE(recoverable(TWErrorDomain, code));
  }
}

TEST_F(HostProcessTest, LetsAnInstallBrokenOffByTheInterruptionBeTriedAgain) {
  EXPECT_FALSE(recoverable(POSIXErrorDomain, EINVAL));
  interruption.request();
  EXPECT_TRUE(recoverable(POSIXErrorDomain, EINVAL));
}

TEST(Interruptions, RunTheListenerOnceAndOnlyWhileItIsSet) {
  Interruption interruption;
  int runs = 0;
  interruption.setListener([&] { ++runs; });
  EXPECT_FALSE(interruption.requested());
  interruption.request();
  interruption.request();
  EXPECT_TRUE(interruption.requested());
  EXPECT_EQ(runs, 1);

  Interruption other;
  other.setListener([&] { ++runs; });
  other.setListener({});
  other.request();
  EXPECT_EQ(runs, 1);
}

TEST(Interruptions, ReachAListenerThatComesLate) {
  Interruption interruption;
  interruption.request();
  int runs = 0;
  interruption.setListener([&] { ++runs; });
  EXPECT_EQ(runs, 1);
}

}  // namespace
}  // namespace appsync::host
