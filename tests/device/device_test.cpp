#include "tests/device/device_test.h"

#include <fmt/format.h>

#include <array>
#include <iterator>
#include <stdexcept>

#include "platform/bundle.h"

namespace appsync::device {

namespace fs = std::filesystem;

DeviceTest::DeviceTest() {
  DeviceError problem;
  if (!EmbeddedDevice::initialize(folder, {}, problem)) throw std::runtime_error(problem.message);
  reopen();
}

void DeviceTest::reopen(Access access) {
  device.reset();
  DeviceError problem;
  device = EmbeddedDevice::open(folder, access, problem);
  if (!device) throw std::runtime_error(problem.message);
}

fs::path DeviceTest::onDisk(std::string_view phonePath) const {
  return folder / "root" / fs::path(phonePath).relative_path();
}

void DeviceTest::putFile(std::string_view phonePath, std::string_view text) {
  fakes::putFile(onDisk(phonePath), text);
}

std::string DeviceTest::textAt(std::string_view phonePath) {
  return fakes::fileText(onDisk(phonePath));
}

FileLocation DeviceTest::stage(const PackageArchive& archive) {
  static int number = 0;
  const std::string path =
      "/var/mobile/Media/PublicStaging/package-" + std::to_string(++number) + ".pkg";
  putFile(path, asText(archive.bytes()));
  return FileLocation::file(path);
}

bool DeviceTest::installPackage(const PackageArchive& archive, std::string_view identifier) {
  error.reset();
  return device->appRegistry().installApplication(
      stage(archive),
      {{std::string(SWPackageTypeKey), SWPackageTypeCustomer},
       {std::string(KBBundleIdentifier), identifier}},
      &error);
}

bool DeviceTest::installPackage(std::string_view identifier, std::string_view version) {
  return installPackage(PackageArchive().addApplication(identifier, version), identifier);
}

bool DeviceTest::installPlaceholder(std::string_view identifier, std::string_view version,
                                    PropertyList::Dictionary options) {
  const std::string bundle = "/tmp/com.corvane.twc.Apps/" + std::string(identifier) + ".app";
  putFile(bundle + "/Info.plist", xml(infoOf(identifier, version)));
  putFile(bundle + "/Icon.png", "picture of " + std::string(identifier));
  options.emplace(SWPackageTypeKey, SWPackageTypePlaceholder);
  options.emplace(KBBundleIdentifier, identifier);
  options.emplace(SWInstallTypeKey, 4);
  error.reset();
  return device->appRegistry().installApplication(FileLocation::directory(bundle), options, &error);
}

bool DeviceTest::installRestorePlaceholder(std::string_view identifier) {
  return installPlaceholder(identifier, "1.0", {{std::string(SWInstallTypeKey), 2}});
}

std::optional<AppRecord> DeviceTest::record(std::string_view identifier, bool placeholder) {
  return device->appRegistry().recordForIdentifier(identifier, placeholder);
}

std::string DeviceTest::version(std::string_view identifier) {
  const auto found = record(identifier);
  return found && !found->isPlaceholder ? found->bundleVersion.value_or("none") : "not installed";
}

std::vector<std::string> DeviceTest::registry() {
  std::vector<std::string> lines;
  for (const AppRecord& each : device->applications()) {
    lines.push_back(each.applicationIdentifier + " " + each.bundleVersion.value_or("none") +
                    (each.isPlaceholder ? " (placeholder)" : ""));
  }
  return lines;
}

std::size_t DeviceTest::containerCount() const {
  const fs::directory_iterator entries(onDisk("/var/mobile/Containers/Applications"));
  return static_cast<std::size_t>(std::distance(entries, fs::directory_iterator()));
}

std::vector<std::string> DeviceTest::history() {
  constexpr std::array events{"installed", "failed",   "removed",
                              "demoted",   "restored", "data-overwritten"};
  constexpr std::array origins{"sync", "store", "person"};
  std::vector<std::string> lines;
  std::optional<Error> failure;
  for (const HistoryEntry& entry : device->history(&failure)) {
    EXPECT_GT(entry.time, 1e9);
    lines.push_back(fmt::format("{} {} {} {}{}{}", events.at(std::size_t(entry.event)),
                                origins.at(std::size_t(entry.origin)), entry.bundleId,
                                entry.version.value_or("-"),
                                entry.replaced ? "<" + *entry.replaced : "",
                                entry.reason.empty() ? "" : ": " + entry.reason));
  }
  EXPECT_FALSE(failure);
  return lines;
}

std::vector<std::string> DeviceTest::logTexts() {
  std::vector<std::string> texts;
  device->readLog([&](const LogLine& line) { texts.push_back(line.text); });
  return texts;
}

}  // namespace appsync::device
