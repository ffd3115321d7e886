#include "tests/scenarios/restore_phone.h"

#include <sys/wait.h>
#include <unistd.h>

#include "client/apps_client.h"
#include "host/backup/backup_folder.h"
#include "host/phone/installed_applications.h"
#include "host/sync/session.h"
#include "platform/property_list_codec.h"
#include "tests/fakes/stepping_file_manager.h"
#include "tests/test_pch.h"

namespace appsync::host::testing {
namespace {

constexpr std::string_view DataDirectory = "/var/mobile/Containers/Data";
constexpr int Died = 77;

Bytes serialized(const PropertyList& value) {
  return serializePropertyList(value, PropertyListFormat::Xml).value();
}

/// An archive as a phone makes it of an application whose data is this one file.
Bytes archiveOf(device::EmbeddedDevice& device, const std::string& identifier,
                const std::string& notes) {
  const std::string directory = joinPath(DataDirectory, identifier);
  EXPECT_TRUE(device.files().createDirectory(directory, true, {}));
  EXPECT_TRUE(device.files().createFile(joinPath(directory, "notes"), toBytes(notes), {}));
  Bytes archive;
  const auto collect = [&](ByteView bytes) {
    archive.insert(archive.end(), bytes.begin(), bytes.end());
    return true;
  };
  EXPECT_TRUE(device.saveData(identifier, collect, nullptr));
  return archive;
}

std::unique_ptr<device::EmbeddedDevice> openDevice(const std::filesystem::path& folder) {
  device::DeviceError error;
  auto device = device::EmbeddedDevice::open(folder, device::Access::Write, error);
  if (!device) throw std::runtime_error(error.message);
  return device;
}

std::string text(const Summary& summary) {
  std::string result;
  const auto add = [&](std::string_view what, const std::string& entry) {
    result += (result.empty() ? "" : "; ") + std::string(what) + " " + entry;
  };
  for (const auto& identifier : summary.installed) add("installed", identifier);
  for (const auto& identifier : summary.updated) add("updated", identifier);
  for (const auto& identifier : summary.deleted) add("deleted", identifier);
  for (const auto& identifier : summary.dataRestored) add("data restored", identifier);
  for (const auto& entry : summary.failed) add("failed", entry.identifier + ": " + entry.reason);
  for (const auto& entry : summary.skipped) add("skipped", entry.identifier + ": " + entry.reason);
  return result;
}

class StepLog : public Log {
 public:
  StepLog(Log& log, const RestoringPhone::Step& step) : log_(log), step_(step) {}
  void write(LogChannel channel, LogLevel level, std::string_view line) noexcept override {
    log_.write(channel, level, line);
    step_();
  }

 private:
  Log& log_;
  const RestoringPhone::Step& step_;
};

class StepReporter : public Reporter {
 public:
  explicit StepReporter(std::function<void(const Event&)> step) : step_(std::move(step)) {}
  void report(const Event& event) override { step_(event); }

 private:
  const std::function<void(const Event&)> step_;
};

/// A step before each piece of data and each package that the host gives to a phone.
class SteppingPhone final : public IncomingFiles, public ApplicationData {
 public:
  SteppingPhone(const Phone& phone, const RestoringPhone::Step& step)
      : phone_(phone), step_(step) {}

  Phone phone(FileManager& files) {
    return {.files = files,
            .apps = phone_.apps,
            .homeScreen = phone_.homeScreen,
            .iconRenderer = phone_.iconRenderer,
            .imageEncoders = phone_.imageEncoders,
            .incoming = *this,
            .data = *this,
            .activity = phone_.activity,
            .coordination = phone_.coordination};
  }

  std::unique_ptr<FileReceiver> receiveFile(std::string_view path,
                                            std::optional<Error>* error) noexcept override {
    step_();
    return phone_.incoming.receiveFile(path, error);
  }
  std::optional<std::vector<std::string>> namesIn(std::string_view directory,
                                                  std::optional<Error>* error) noexcept override {
    return phone_.incoming.namesIn(directory, error);
  }
  std::vector<AppRecord> applications(std::optional<Error>* error) noexcept override {
    return phone_.data.applications(error);
  }
  std::optional<Bytes> opaqueBlob(std::string_view identifier,
                                  std::optional<Error>* error) noexcept override {
    return phone_.data.opaqueBlob(identifier, error);
  }
  bool saveData(std::string_view identifier, const DataSink& sink,
                std::optional<Error>* error) noexcept override {
    return phone_.data.saveData(identifier, sink, error);
  }
  bool restoreData(std::string_view identifier, const DataSource& source,
                   std::optional<Error>* error) noexcept override {
    const auto stepped = [&](std::uint8_t* bytes, std::size_t size) {
      step_();
      return source(bytes, size);
    };
    return phone_.data.restoreData(identifier, stepped, error);
  }
  bool overwriteData(std::string_view identifier, const DataSource& source,
                     std::optional<Error>* error) noexcept override {
    return phone_.data.overwriteData(identifier, source, error);
  }

 private:
  const Phone phone_;
  const RestoringPhone::Step& step_;
};

}  // namespace

void SampleBackup::add(const std::string& identifier, const std::string& notes, Demotion demotion) {
  const PropertyList::Dictionary metadata{
      {"title", "Title of " + identifier}, {"bundleVersion", "1.0"}, {"itemId", 7}};
  addEntry(identifier, PropertyList::Dictionary{{"HalvoMetadata", serialized(metadata)},
                                                {"ApplicationSINF", toBytes("blob")},
                                                {"PlaceholderIcon", toBytes("icon")}});
  if (!notes.empty()) notes_[identifier] = notes;
  if (demotion == Demotion::Automatic) automatic_.emplace_back(identifier);
  if (demotion == Demotion::Intentional) intentional_.emplace_back(identifier);
}

void SampleBackup::addEntry(const std::string& identifier, PropertyList entry) {
  entries_[identifier] = std::move(entry);
}

void SampleBackup::write() {
  const Folder elsewhere{fakes::memoryFolder()};
  device::DeviceError error;
  EXPECT_TRUE(device::EmbeddedDevice::initialize(elsewhere / "phone", {}, error));
  const auto device = openDevice(elsewhere / "phone");
  BackupProblem problem;
  const auto writer = BackupWriter::open(folder(), problem);
  ASSERT_TRUE(writer) << problem.text;
  PropertyList::Array layout;
  for (auto entry = entries_.rbegin(); entry != entries_.rend(); ++entry) {
    layout.emplace_back(entry->first);
  }
  const PropertyList::Dictionary demotions{{"AutomaticDowngrades", automatic_},
                                           {"IntentionalDowngrades", intentional_}};
  bool good = writer->addFile(BackupApplicationsFile, serialized(entries_)) &&
              writer->addFile(BackupDemotionsFile, serialized(demotions)) &&
              writer->addFile(BackupIconLayoutFile, serialized(layout));
  for (const auto& [identifier, notes] : notes_) {
    good = good && writer->beginData(identifier) &&
           writer->append(archiveOf(*device, identifier, notes)) && writer->endData();
  }
  ASSERT_TRUE(good && writer->finish()) << writer->problem();
}

RestoreInput SampleBackup::read() {
  if (!std::filesystem::exists(folder())) write();
  std::string problem;
  Backup backup = readBackup(folder(), problem).value();
  RestoreList list = RestoreList::of(backup, problem).value();
  return {std::move(backup), std::move(list), {}, {}, false};
}

void Shelf::add(const std::string& identifier, const std::string& version, std::size_t bodySize) {
  packSample(folder_ / (identifier + ".tar"), identifier, version, bodySize);
}

void Shelf::addTruncated(const std::string& identifier) {
  add(identifier, "1.0", 20'000);
  std::filesystem::resize_file(folder_ / (identifier + ".tar"), 12'000);
}

Library Shelf::library() const {
  std::string problem;
  return readLibrary(folder_.path(), problem).value();
}

RestoringPhone::RestoringPhone(bool coordination) {
  device::DeviceError error;
  EXPECT_TRUE(device::EmbeddedDevice::initialize(folder(), {coordination}, error));
  open();
}

void RestoringPhone::open() {
  close();
  device_ = openDevice(folder());
}

std::string RestoringPhone::restore(const RestoreInput& input, const Step& step) {
  const Step every = step ? step : [] {};
  placeholdersTold.clear();
  Interruption interruption;
  StepReporter reporter([&](const Event& event) {
    if (const auto* told = std::get_if<PlaceholderStands>(&event)) {
      placeholdersTold.push_back((told->demoted ? "demoted " : "") + told->name);
    }
    if (onEvent) onEvent(event, interruption);
    every();
  });
  HostProcess host(SyncHostBundleIdentifier, "com.corvane.twc.AppsClient", interruption);
  StepLog log(device_->log(), every);
  fakes::SteppingFileManager files(device_->files(), every);
  AppsClient client(with(with(device_->platform(host), files), log));
  announceStartUp(device_->systemNotifier());
  SteppingPhone phone(device_->phone(), every);
  Restore restore(client, host, phone.phone(files), reporter, interruption);
  return text(restore.run(input).summary);
}

std::string RestoringPhone::sync(const Library& library, const PlanOptions& options) {
  Interruption interruption;
  StepReporter reporter([&](const Event& event) {
    if (onEvent) onEvent(event, interruption);
  });
  std::string problem;
  SyncInput input{library, {}, {}, "NEW"};
  input.plan =
      makePlan(library, installedApplications(device_->phone(), problem).value(), options, problem)
          .value();
  HostProcess host(SyncHostBundleIdentifier, "com.corvane.twc.AppsClient", interruption);
  AppsClient client(device_->platform(host));
  announceStartUp(device_->systemNotifier());
  Session session(client, host, device_->phone(), reporter, interruption);
  return text(session.run(input).summary);
}

bool RestoringPhone::restoreAndDie(const RestoreInput& input, int step) {
  close();
  const pid_t child = ::fork();
  if (child == 0) {
    std::atomic<int> left = step;
    open();
    restore(input, [&] {
      if (left-- == 0) _exit(Died);
    });
    close();
    _exit(0);
  }
  int status = 0;
  ::waitpid(child, &status, 0);
  open();
  EXPECT_TRUE(WIFEXITED(status));
  return WEXITSTATUS(status) == Died;
}

std::vector<std::string> RestoringPhone::applications() {
  std::vector<std::string> lines;
  for (const AppRecord& record : device_->applications()) {
    lines.push_back(record.applicationIdentifier + " " + record.bundleVersion.value_or("none") +
                    (record.isPlaceholder ? "?" : ""));
  }
  return lines;
}

std::string RestoringPhone::notes(const std::string& identifier) {
  for (const std::string_view directory :
       {DataDirectory, std::string_view("/var/mobile/Media/HalvoRestore/Data")}) {
    const auto bytes =
        device_->files().contentsAtPath(joinPath(joinPath(directory, identifier), "notes"));
    if (bytes) return std::string(asText(*bytes));
  }
  return {};
}

std::vector<std::string> RestoringPhone::picture() {
  std::vector<std::string> lines;
  for (const AppRecord& record : device_->applications()) {
    const std::string& identifier = record.applicationIdentifier;
    std::string data;
    device_->saveData(
        identifier,
        [&](ByteView bytes) {
          data += asText(bytes);
          return true;
        },
        nullptr);
    lines.push_back(description(record) + " " + record.bundleVersion.value_or("none") + " " +
                    record.displayName + " type " +
                    std::to_string(static_cast<int>(record.installType)) + " blob " +
                    std::string(asText(device_->opaqueBlob(identifier).value_or(Bytes{}))) +
                    " notes " + notes(identifier) + " data " + data);
  }
  for (const auto& identifier : device_->homeScreenOrder()) lines.push_back("icon " + identifier);
  for (const auto& identifier : device_->packagesOwedBy(KQClientKiosk)) {
    lines.push_back("owed " + identifier);
  }
  return lines;
}

}  // namespace appsync::host::testing
