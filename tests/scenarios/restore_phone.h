#pragma once

#include <functional>
#include <map>
#include <memory>
#include <string>
#include <vector>

#include "device/embedded_device.h"
#include "host/library/sync_plan.h"
#include "host/restore/restore.h"
#include "tests/host/host_files.h"

namespace appsync::host::testing {

/// A backup as a phone with these applications would have made it.
class SampleBackup {
 public:
  enum class Demotion { None, Automatic, Intentional };

  /// `notes` is the contents of the application's only file of data; empty: it has no data.
  void add(const std::string& identifier, const std::string& notes = {},
           Demotion demotion = Demotion::None);
  /// Anything else as entry of the restore list.
  void addEntry(const std::string& identifier, PropertyList entry);
  /// Written to its folder and read from there.
  RestoreInput read();
  std::filesystem::path folder() const { return folder_ / "backup"; }

 private:
  void write();

  const Folder folder_{fakes::memoryFolder()};
  PropertyList::Dictionary entries_;
  PropertyList::Array automatic_;
  PropertyList::Array intentional_;
  std::map<std::string, std::string> notes_;
};

/// The packages of a store or of the host's library.
class Shelf {
 public:
  void add(const std::string& identifier, const std::string& version = "1.0",
           std::size_t bodySize = 0);
  /// The package breaks off in its body.
  void addTruncated(const std::string& identifier);
  Library library() const;

 private:
  const Folder folder_{fakes::memoryFolder()};
};

/// A new device that lives through restores, each with a new host process and client.
class RestoringPhone {
 public:
  explicit RestoringPhone(bool coordination);

  /// `step` is called between any two things that the host or the client does.
  using Step = std::function<void()>;
  /// The summary as text.
  std::string restore(const RestoreInput& input, const Step& step = {});
  /// A whole desktop sync as the command plans it; the summary as text.
  std::string sync(const Library& library, const PlanOptions& options = {});
  /// A restore in a process that dies at the given step; false when it ended before.
  bool restoreAndDie(const RestoreInput& input, int step);

  /// All that a person would find, a line each: applications, their data, the home screen.
  std::vector<std::string> picture();
  /// "identifier version" of each, "?" behind those that are placeholders.
  std::vector<std::string> applications();
  /// An application's notes, be they its own already or still waiting; empty for none.
  std::string notes(const std::string& identifier);

  device::EmbeddedDevice& device() { return *device_; }
  void open();
  void close() { device_.reset(); }
  std::filesystem::path folder() const { return folder_ / "phone"; }

  std::function<void(const Event&, Interruption&)> onEvent;
  std::vector<std::string> placeholdersTold;  ///< in the last restore; "demoted" before such

 private:
  const Folder folder_{fakes::memoryFolder()};
  std::unique_ptr<device::EmbeddedDevice> device_;
};

}  // namespace appsync::host::testing
