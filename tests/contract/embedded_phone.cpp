#include <fcntl.h>
#include <sys/stat.h>

#include <array>
#include <cmath>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <stdexcept>
#include <thread>

#include "device/embedded_device.h"
#include "platform/property_list_codec.h"
#include "tests/contract/phone.h"
#include "tests/fakes/call_trace.h"

namespace appsync::contract {

namespace {

namespace fs = std::filesystem;

/// One member of a tar archive: a header block, the contents, and padding.
std::string tarEntry(const std::string& name, std::string_view contents, unsigned mode) {
  std::array<char, 512> block{};
  std::snprintf(block.data(), 100, "%s", name.c_str());
  std::snprintf(block.data() + 100, 8, "%07o", mode);
  std::snprintf(block.data() + 108, 8, "%07o", 0U);
  std::snprintf(block.data() + 116, 8, "%07o", 0U);
  std::snprintf(block.data() + 124, 12, "%011zo", contents.size());
  std::snprintf(block.data() + 136, 12, "%011o", 0U);
  std::memset(block.data() + 148, ' ', 8);
  block[156] = name.ends_with('/') ? '5' : '0';
  std::memcpy(block.data() + 257, "ustar\00000", 8);
  unsigned sum = 0;
  for (const char byte : block) sum += static_cast<unsigned char>(byte);
  std::snprintf(block.data() + 148, 8, "%06o", sum);
  std::string entry(block.data(), block.size());
  entry += contents;
  entry.append((512 - contents.size() % 512) % 512, '\0');
  return entry;
}

std::string package(std::string_view identifier, std::string_view version) {
  const PropertyList::Dictionary info = {
      {std::string(KBBundleIdentifier), identifier},
      {std::string(KBBundleVersion), version},
      {std::string(KBBundleDisplayName), "Name of " + std::string(identifier)},
      {std::string(KBBundleExecutable), "main"},
  };
  const Bytes plist = serializePropertyList(info, PropertyListFormat::Binary).value();
  return tarEntry("App.app/", "", 0755) + tarEntry("App.app/Info.plist", asText(plist), 0644) +
         tarEntry("App.app/main", "#!/bin/sh\n", 0755) + std::string(1024, '\0');
}

class EmbeddedPhone : public Phone {
 public:
  explicit EmbeddedPhone(const PhoneOptions& options) {
    std::string pattern = (fs::temp_directory_path() / "contract-XXXXXX").string();
    if (!mkdtemp(pattern.data())) throw std::runtime_error("no temporary folder");
    folder_ = pattern;
    device::DeviceError error;
    if (device::EmbeddedDevice::initialize(folder_, {options.coordination}, error)) {
      device_ = device::EmbeddedDevice::open(folder_, device::Access::Write, error);
    }
    if (!device_) throw std::runtime_error(error.message);
  }
  ~EmbeddedPhone() override {
    device_.reset();
    std::error_code ignored;
    fs::remove_all(folder_, ignored);
  }

  Platform platform() override { return device_->platform(host_); }
  void putPackage(std::string_view path, std::string_view identifier,
                  std::string_view version) override {
    const std::string bytes = package(identifier, version);
    device_->files().writeAtomically(path, asBytes(bytes));
  }
  void uninstall(std::string_view identifier) override { device_->uninstall(identifier, nullptr); }
  void setPolicy(PolicySetting setting, PolicyValue value) override {
    device_->setPolicy(setting, value, nullptr);
  }
  bool launch(std::string_view identifier) override {
    device::DeviceError problem;
    return device::EmbeddedDevice::launch(folder_, identifier, problem, nullptr);
  }
  void quit(std::string_view identifier) override {
    device::DeviceError problem;
    device::EmbeddedDevice::quit(folder_, identifier, problem, nullptr);
  }
  void addRestoreData(std::string_view identifier) override {
    const std::string folder = joinPath("/var/mobile/Media/HalvoRestore/Data", identifier);
    device_->files().createDirectory(folder, true, {});
    device_->files().writeAtomically(joinPath(folder, "saved"), asBytes("data"));
  }
  void setTimes(std::string_view path, double seconds) override {
    timespec time{};
    time.tv_sec = static_cast<time_t>(std::floor(seconds));
    const std::array times = {time, time};
    utimensat(AT_FDCWD, (folder_ / "root" / path.substr(1)).c_str(), times.data(), 0);
  }
  double now() override {
    using Seconds = std::chrono::duration<double>;
    return Seconds(std::chrono::system_clock::now().time_since_epoch()).count();
  }
  std::vector<KeptRecord> records() override {
    std::vector<KeptRecord> kept;
    for (const auto& record : device_->transactions()) {
      kept.push_back({record.scenario, record.step, record.party, record.phase, record.success,
                      record.bundleId, record.description});
    }
    return kept;
  }
  std::vector<KeptLine> logLines() override {
    std::vector<KeptLine> kept;
    device_->readLog([&](const device::LogLine& line) {
      kept.push_back({line.channel, line.level, line.text});
    });
    return kept;
  }
  void passTime(std::chrono::milliseconds) override {}
  bool tap(std::string_view identifier) override {
    device::DeviceError problem;
    return device::EmbeddedDevice::tap(folder_, identifier, problem, nullptr);
  }
  bool cancelInstall(std::string_view identifier) override {
    device::DeviceError problem;
    return device::EmbeddedDevice::cancel(folder_, identifier, problem, nullptr);
  }
  void settle(std::string_view identifier) override {
    while (!device_->busyAmong({std::string(identifier)}).empty()) std::this_thread::yield();
  }

 private:
  fs::path folder_;
  fakes::CallTrace trace_;
  fakes::FakeSyncHost host_{trace_};
  std::unique_ptr<device::EmbeddedDevice> device_;
};

}  // namespace

std::unique_ptr<Phone> makeEmbeddedPhone(const PhoneOptions& options) {
  return std::make_unique<EmbeddedPhone>(options);
}

}  // namespace appsync::contract
