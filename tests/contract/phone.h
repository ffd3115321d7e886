#pragma once

#include <gtest/gtest.h>

#include <chrono>
#include <memory>
#include <ostream>
#include <string>
#include <vector>

#include "platform/bundle.h"
#include "platform/platform.h"
#include "tests/fakes/fake_sync_host.h"

namespace appsync::contract {

/// What a transaction log kept of one call.
struct KeptRecord {
  std::string scenario;
  std::optional<std::uint32_t> step;
  std::uint32_t party = 0;
  std::uint32_t phase = 0;
  bool success = false;
  std::string bundleId;
  std::string description;
  bool operator==(const KeptRecord&) const = default;
};

struct KeptLine {
  LogChannel channel;
  LogLevel level;
  std::string text;
  bool operator==(const KeptLine&) const = default;
};

/// A phone whose services are held to their contract: the fakes, or an embedded device in a folder
/// of its own. The operations below the services are what a contract suite cannot reach through
/// them: a person's doings, and looking at what was kept.
class Phone {
 public:
  virtual ~Phone() = default;

  virtual Platform platform() = 0;
  /// Puts a package of the application there, so that installing it succeeds.
  virtual void putPackage(std::string_view path, std::string_view identifier,
                          std::string_view version) = 0;
  virtual void uninstall(std::string_view identifier) = 0;
  virtual void setPolicy(PolicySetting setting, PolicyValue value) = 0;
  /// Brings an installed application to the foreground.
  virtual bool launch(std::string_view identifier) = 0;
  virtual void quit(std::string_view identifier) = 0;
  virtual void addRestoreData(std::string_view identifier) = 0;
  /// Makes both times of an item this old.
  virtual void setTimes(std::string_view path, double seconds) = 0;
  /// Now, as the phone's file system sees it.
  virtual double now() = 0;
  virtual std::vector<KeptRecord> records() = 0;
  virtual std::vector<KeptLine> logLines() = 0;
  /// Lets the time of the background queue pass, where it does not pass by itself.
  virtual void passTime(std::chrono::milliseconds time) = 0;

  // The person taps the application's placeholder or cancels its install; false when no coordinated
  // install of it is on its way.
  virtual bool tap(std::string_view identifier) = 0;
  virtual bool cancelInstall(std::string_view identifier) = 0;
  /// Until the coordination service has nothing left to do for the application by itself: all that
  /// could be installed is, and whoever is there has been told.
  virtual void settle(std::string_view identifier) = 0;
};

struct PhoneOptions {
  bool coordination = false;
};

std::unique_ptr<Phone> makeFakePhone(const PhoneOptions& options);
std::unique_ptr<Phone> makeEmbeddedPhone(const PhoneOptions& options);

struct PhoneKind {
  const char* name;
  std::unique_ptr<Phone> (*make)(const PhoneOptions& options);

  friend void PrintTo(const PhoneKind& kind, std::ostream* out) { *out << kind.name; }
};

/// A suite that runs against every phone.
class ServiceContract : public testing::TestWithParam<PhoneKind> {
 protected:
  explicit ServiceContract(const PhoneOptions& options = {}) : phone(GetParam().make(options)) {}

  // Conveniences on top of the services.
  void putFile(std::string_view path, std::string_view text);
  std::optional<std::string> textAt(std::string_view path);
  /// Puts a placeholder bundle in the temporary directory and installs it.
  bool installPlaceholder(std::string_view identifier, std::string_view version = "1.0",
                          InstallType type = InstallType::Sync,
                          std::optional<Error>* error = nullptr);
  /// Puts a package in the temporary directory and installs it.
  bool installPackage(std::string_view identifier, std::string_view version = "1.0",
                      std::optional<Error>* error = nullptr);
  std::string placeholderBundle(std::string_view identifier, std::string_view version);

  const std::unique_ptr<Phone> phone;
  Platform platform = phone->platform();
};

PropertyList::Dictionary packageOptions(std::string_view identifier);

/// Runs a suite, a class made from ServiceContract, against the fakes and the embedded device.
#define SERVICE_CONTRACT_OF(Suite)                                                               \
  INSTANTIATE_TEST_SUITE_P(                                                                      \
      Phones, Suite,                                                                             \
      testing::Values(                                                                           \
          appsync::contract::PhoneKind{"Fakes", appsync::contract::makeFakePhone},               \
          appsync::contract::PhoneKind{"EmbeddedDevice", appsync::contract::makeEmbeddedPhone}), \
      [](const auto& kind) { return kind.param.name; })

/// The same of a suite that needs nothing more than ServiceContract.
#define SERVICE_CONTRACT(Suite)                               \
  class Suite : public appsync::contract::ServiceContract {}; \
  SERVICE_CONTRACT_OF(Suite)

}  // namespace appsync::contract
