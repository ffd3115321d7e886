#include <cerrno>

#include "tests/contract/phone.h"
#include "tests/fakes/fake_platform.h"

namespace appsync::contract {

namespace {

/// Who cancels in the person's name.
constexpr CoordinationClientId PersonClientID = 15;

class FakePhone : public Phone {
 public:
  explicit FakePhone(const PhoneOptions& options) {
    fakes_.installCoordination.setEnabled(options.coordination);
  }

  Platform platform() override { return fakes_.platform(); }
  void putPackage(std::string_view path, std::string_view identifier,
                  std::string_view version) override {
    fakes_.files.putFile(path, "package");
    fakes_.appRegistry.whenPackageInstalled(path, {std::string(identifier), std::string(version),
                                                   "Name of " + std::string(identifier)});
  }
  void uninstall(std::string_view identifier) override { fakes_.appRegistry.removeAll(identifier); }
  void setPolicy(PolicySetting setting, PolicyValue value) override {
    fakes_.policy.set(setting, value);
  }
  bool launch(std::string_view identifier) override { return fakes_.homeScreen.launch(identifier); }
  void quit(std::string_view identifier) override { fakes_.homeScreen.quit(identifier); }
  void addRestoreData(std::string_view identifier) override {
    fakes_.backup.addRestoreData(identifier);
  }
  void setTimes(std::string_view path, double seconds) override {
    fakes_.files.setModificationTime(path, seconds);
  }
  double now() override { return fakes_.clock.seconds(); }
  std::vector<KeptRecord> records() override {
    std::vector<KeptRecord> kept;
    for (const auto& record : fakes_.transactions.records()) {
      kept.push_back({record.scenario, record.step, record.party, record.phase, record.success,
                      record.bundleId, record.description});
    }
    return kept;
  }
  std::vector<KeptLine> logLines() override {
    std::vector<KeptLine> kept;
    for (const auto& line : fakes_.log.lines())
      kept.push_back({line.channel, line.level, line.text});
    return kept;
  }
  void passTime(std::chrono::milliseconds time) override { fakes_.backgroundQueue.advance(time); }
  bool tap(std::string_view identifier) override {
    const auto live = fakes_.installCoordination.liveCoordinator(identifier);
    if (live) fakes_.installCoordination.fireShouldPrioritize(*live);
    return live != nullptr;
  }
  bool cancelInstall(std::string_view identifier) override {
    const auto live = fakes_.installCoordination.liveCoordinator(identifier);
    return live && live->cancel(Error::posix(ECANCELED), PersonClientID);
  }
  void settle(std::string_view identifier) override {
    fakes_.installCoordination.carryOn(identifier);
    fakes_.installCoordination.waitForEvents();
  }

 private:
  fakes::FakePlatform fakes_;
};

}  // namespace

std::unique_ptr<Phone> makeFakePhone(const PhoneOptions& options) {
  return std::make_unique<FakePhone>(options);
}

}  // namespace appsync::contract
