#include "tests/contract/phone.h"
#include "tests/fakes/fake_platform.h"

namespace appsync::contract {

namespace {

class FakePhone : public Phone {
 public:
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

 private:
  fakes::FakePlatform fakes_;
};

}  // namespace

std::unique_ptr<Phone> makeFakePhone() { return std::make_unique<FakePhone>(); }

}  // namespace appsync::contract
