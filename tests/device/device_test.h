#pragma once

#include <gtest/gtest.h>

#include <filesystem>
#include <functional>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "device/embedded_device.h"
#include "tests/device/package_archive.h"
#include "tests/fakes/call_trace.h"
#include "tests/fakes/fake_sync_host.h"
#include "tests/fakes/other_process.h"
#include "tests/fakes/temporary_folder.h"

namespace appsync::device {

using fakes::inOtherProcess;
using fakes::TemporaryFolder;

/// A new device in a temporary folder, open for writing.
class DeviceTest : public ::testing::Test {
 protected:
  DeviceTest();

  /// Closes the device and opens it anew.
  void reopen(Access access = Access::Write);
  Platform platform() { return device->platform(host_); }

  /// Where an item of the phone lies on this machine.
  std::filesystem::path onDisk(std::string_view phonePath) const;
  void putFile(std::string_view phonePath, std::string_view text);
  std::string textAt(std::string_view phonePath);

  /// Puts a package into the staging area.
  FileLocation stage(const PackageArchive& archive);
  bool installPackage(const PackageArchive& archive, std::string_view identifier);
  bool installPackage(std::string_view identifier, std::string_view version = "1.0");
  /// `more` are further options.
  bool installPlaceholder(std::string_view identifier, std::string_view version = "1.0",
                          PropertyList::Dictionary more = {});
  bool installRestorePlaceholder(std::string_view identifier);

  std::optional<AppRecord> record(std::string_view identifier, bool placeholder = false);
  std::string version(std::string_view identifier);
  /// "identifier version" of all records, " (placeholder)" behind those of placeholders.
  std::vector<std::string> registry();
  /// The containers on disk, whether the registry names them or not.
  std::size_t containerCount() const;
  /// "event origin identifier version<replaced: reason" of each entry.
  std::vector<std::string> history();
  /// The texts of the device's own log lines.
  std::vector<std::string> logTexts();

  fakes::TemporaryFolder temporary;
  std::filesystem::path folder = temporary.path() / "device";
  std::unique_ptr<EmbeddedDevice> device;
  std::optional<Error> error;

 private:
  fakes::CallTrace trace_;
  fakes::FakeSyncHost host_{trace_};
};

}  // namespace appsync::device
