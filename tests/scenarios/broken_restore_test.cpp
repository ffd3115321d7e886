// A phone comes back from a backup of 500 applications, every tenth broken in another way: those
// that can be shown are there, each of the others tells why it is not, and nothing else is touched.

#include <thread>

#include "client/apps_client.h"
#include "device/embedded_device.h"
#include "host/phone/sync_host.h"
#include "platform/property_list_codec.h"
#include "tests/host/host_files.h"
#include "tests/test_pch.h"

namespace appsync::host {
namespace {

using fakes::memoryFolder;
using testing::Folder;
using Dictionary = PropertyList::Dictionary;

constexpr std::size_t ManyApplications = 500;
constexpr std::size_t EachBreakOnce = 200;

Bytes plist(const PropertyList& value) {
  return serializePropertyList(value, PropertyListFormat::Xml).value();
}

Dictionary goodMetadata(const std::string& identifier) {
  return {{"bundleVersion", "1.0"}, {"title", "Name of " + identifier}};
}

Dictionary goodEntry(const std::string& identifier) {
  return {{"HalvoMetadata", plist(goodMetadata(identifier))},
          {"ApplicationSINF", toBytes("blob of " + identifier)},
          {"PlaceholderIcon", toBytes("icon of " + identifier)}};
}

PropertyList withMetadata(const std::string& identifier, const PropertyList& metadata) {
  Dictionary entry = goodEntry(identifier);
  entry.insert_or_assign("HalvoMetadata", plist(metadata));
  return entry;
}

PropertyList withMetadataKey(const std::string& identifier, const char* key,
                             const std::optional<PropertyList>& value) {
  Dictionary metadata = goodMetadata(identifier);
  metadata.erase(key);
  if (value) metadata.emplace(key, *value);
  return withMetadata(identifier, metadata);
}

PropertyList with(const std::string& identifier, const char* key,
                  const std::optional<PropertyList>& value) {
  Dictionary entry = goodEntry(identifier);
  entry.erase(key);
  if (value) entry.emplace(key, *value);
  return entry;
}

/// One way of being broken, what becomes of it without and with coordinators, and what the log says
/// where it is not shown ("%" stands for the identifier).
struct Break {
  const char* name;
  PropertyList (*entry)(const std::string& identifier);
  bool shown;
  bool shownWhenCoordinated;
  const char* said;
};

constexpr char NoMetadata[] = "no HalvoMetadata for '%' - ignoring";
constexpr char NotParsed[] = "failed to parse halvo metadata for '%'";
constexpr char NoInfo[] = "failed to process app restore info for '%'";
constexpr char NoEntry[] = "no halvo restore info for '%' - skipping";

using Id = const std::string&;
const Break Breaks[] = {
    {"no-metadata", [](Id id) { return with(id, "HalvoMetadata", {}); }, false, false, NoMetadata},
    {"metadata-is-text", [](Id id) { return with(id, "HalvoMetadata", "text"); }, false, false,
     NoMetadata},
    {"metadata-does-not-parse",
     [](Id id) { return with(id, "HalvoMetadata", toBytes("bplist00 and no more")); }, false, false,
     NotParsed},
    {"metadata-is-a-list", [](Id id) { return withMetadata(id, PropertyList::Array{"title"}); },
     false, false, NotParsed},
    {"metadata-is-empty", [](Id id) { return withMetadata(id, Dictionary{}); }, false, true,
     NoInfo},
    {"no-version", [](Id id) { return withMetadataKey(id, "bundleVersion", {}); }, false, true,
     NoInfo},
    {"version-is-a-number", [](Id id) { return withMetadataKey(id, "bundleVersion", 3); }, true,
     true, ""},
    {"version-is-true", [](Id id) { return withMetadataKey(id, "bundleVersion", true); }, false,
     true, NoInfo},
    {"no-name", [](Id id) { return withMetadataKey(id, "title", {}); }, false, true, NoInfo},
    {"name-is-a-list",
     [](Id id) {
       return withMetadataKey(id, "title", PropertyList::Array{"a", "b"});
     },
     false, true, NoInfo},
    {"launch-flag-is-text",
     [](Id id) { return withMetadataKey(id, "launchProhibited", "perhaps"); }, true, true, ""},
    {"no-icon", [](Id id) { return with(id, "PlaceholderIcon", {}); }, true, true, ""},
    {"icon-is-no-picture", [](Id id) { return with(id, "PlaceholderIcon", toBytes("no picture")); },
     true, true, ""},
    {"icon-is-a-number", [](Id id) { return with(id, "PlaceholderIcon", 7); }, true, true, ""},
    {"no-blob", [](Id id) { return with(id, "ApplicationSINF", {}); }, true, true, ""},
    {"blob-is-true", [](Id id) { return with(id, "ApplicationSINF", true); }, true, true, ""},
    {"entry-is-text", [](Id) -> PropertyList { return "restore me"; }, false, false, NoEntry},
    {"entry-is-empty", [](Id) -> PropertyList { return Dictionary{}; }, false, false, NoMetadata},
    {"../../escape", [](Id id) -> PropertyList { return goodEntry(id); }, false, false,
     "Ignoring invalid path: %"},
    {"a/../../../../escape", [](Id id) -> PropertyList { return goodEntry(id); }, false, false,
     "Ignoring invalid path: %"},
};

struct Restored {
  std::string identifier;
  const Break* broken = nullptr;  ///< nullptr: it is whole
};

std::vector<Restored> applications(std::size_t count) {
  std::vector<Restored> list;
  std::size_t next = 0;
  for (std::size_t number = 0; number < count; ++number) {
    const std::string ending = std::to_string(1000 + number);
    if (number % 10 != 9) {
      list.push_back({"org.example.app" + ending});
    } else {
      const Break& broken = Breaks[next++ % std::size(Breaks)];
      list.push_back({broken.name + ending, &broken});
    }
  }
  return list;
}

class BrokenRestoreTest : public ::testing::TestWithParam<bool> {
 protected:
  BrokenRestoreTest() {
    device::DeviceError error;
    EXPECT_TRUE(device::EmbeddedDevice::initialize(folder_ / "phone", {GetParam()}, error));
    device_ = device::EmbeddedDevice::open(folder_ / "phone", device::Access::Write, error);
    if (!device_) throw std::runtime_error(error.message);
  }

  void put(const std::vector<Restored>& list) {
    Dictionary entries;
    for (const Restored& each : list) {
      entries.emplace(each.identifier, each.broken ? each.broken->entry(each.identifier)
                                                   : PropertyList(goodEntry(each.identifier)));
    }
    constexpr char Directory[] = "/var/mobile/Media/HalvoRestore";
    ASSERT_TRUE(device_->files().createDirectory(Directory, true, {}));
    ASSERT_TRUE(device_->files().createFile(joinPath(Directory, "RestoreApplications.plist"),
                                            plist(entries), {}));
  }

  /// The client's own answer.
  bool restore(const std::vector<Restored>& list) {
    Interruption interruption;
    HostProcess host(SyncHostBundleIdentifier, "com.corvane.twc.AppsClient", interruption);
    AppsClient client(device_->platform(host));
    device_->systemNotifier().post(TWStartupCompleteNotification);
    std::optional<Error> error;
    const bool done = client.reconcileRestoreOfType(2, &error);
    for (const Restored& each : list) {
      while (!device_->busyAmong({each.identifier}).empty()) std::this_thread::yield();
    }
    client.outstandingAssetTransfers();
    client.assetTransferEndedWithSuccess(true);
    return done;
  }

  std::vector<std::string> placeholders() {
    std::vector<std::string> lines;
    for (const AppRecord& record : device_->applications()) {
      EXPECT_TRUE(record.isPlaceholder) << record.applicationIdentifier;
      EXPECT_EQ(record.installType, InstallType::Restore);
      lines.push_back(record.applicationIdentifier);
    }
    return lines;
  }

  std::string logged() {
    std::string all;
    device_->readLog([&](const device::LogLine& line) { all += line.text + "\n"; });
    return all;
  }

  /// Everything in the test's folder but the phone's own files.
  std::set<std::string> outsideOfRoot() {
    std::set<std::string> paths;
    for (auto each = std::filesystem::recursive_directory_iterator(folder_.path());
         each != std::filesystem::end(each); ++each) {
      if (each->path() == folder_ / "phone/root") each.disable_recursion_pending();
      paths.insert(each->path());
    }
    return paths;
  }

  const Folder folder_{fakes::memoryFolder()};
  std::unique_ptr<device::EmbeddedDevice> device_;
};

TEST_P(BrokenRestoreTest, EveryApplicationThatCanBeShownIsAndTheOthersSayWhyNot) {
  const std::vector<Restored> list = applications(ManyApplications);
  put(list);
  EXPECT_TRUE(restore(list));

  const std::string log = logged();
  std::vector<std::string> expected;
  for (const auto& [identifier, broken] : list) {
    const bool shown = !broken || (GetParam() ? broken->shownWhenCoordinated : broken->shown);
    if (shown) {
      expected.push_back(identifier);
    } else {
      std::string said = broken->said;
      said.replace(said.find('%'), 1, identifier);
      EXPECT_THAT(log, ::testing::HasSubstr(said));
    }
  }
  std::sort(expected.begin(), expected.end());
  EXPECT_EQ(placeholders(), expected);
  EXPECT_GT(expected.size(), ManyApplications * 9 / 10);
}

TEST_P(BrokenRestoreTest, NoIdentifierLeadsOutOfThePhonesFiles) {
  const std::set<std::string> before = outsideOfRoot();
  const std::vector<Restored> list = applications(EachBreakOnce);
  put(list);
  restore(list);
  EXPECT_EQ(outsideOfRoot(), before);
  for (const AppRecord& record : device_->applications()) {
    EXPECT_EQ(record.applicationIdentifier.find("escape"), std::string::npos);
  }
}

TEST_P(BrokenRestoreTest, TheSameListOnceMoreChangesNothing) {
  const std::vector<Restored> list = applications(EachBreakOnce);
  put(list);
  restore(list);
  const std::vector<std::string> before = placeholders();
  put(list);
  restore(list);
  EXPECT_EQ(placeholders(), before);
}

INSTANTIATE_TEST_SUITE_P(BothModes, BrokenRestoreTest, ::testing::Bool(), [](const auto& given) {
  return given.param ? "Coordinated" : "Uncoordinated";
});

}  // namespace
}  // namespace appsync::host
