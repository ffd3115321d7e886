// Backups come back to new phones, with the real client, in both ways of installing.

#include <atomic>

#include "platform/property_list_codec.h"
#include "tests/scenarios/restore_phone.h"
#include "tests/test_pch.h"

namespace appsync::host {
namespace {

using namespace testing;
using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;
using Demotion = SampleBackup::Demotion;

class Restores : public ::testing::Test {
 protected:
  explicit Restores(bool coordination) : phone(coordination) {
    backup.add("com.a", "notes of a");
    backup.add("com.b");
    backup.add("com.c", "notes of c", Demotion::Automatic);
    backup.add("com.d", "notes of d", Demotion::Intentional);
  }

  std::string restore() { return phone.restore(backup.read()); }
  std::string restoreWithStore() {
    RestoreInput input = backup.read();
    input.catalogue = shelf.library();
    return phone.restore(input);
  }
  InstallType typeOf(std::string_view identifier) {
    const auto record = phone.device().appRegistry().recordForIdentifier(identifier, true);
    return record ? record->installType : InstallType::None;
  }
  void offerAll() {
    for (const char* identifier : {"com.a", "com.b", "com.c", "com.d"}) shelf.add(identifier);
  }

  SampleBackup backup;
  Shelf shelf;
  RestoringPhone phone;
};

/// In both ways of installing.
class RestoreScenario : public Restores, public ::testing::WithParamInterface<bool> {
 protected:
  RestoreScenario() : Restores(GetParam()) {}
  bool coordination() const { return GetParam(); }
};

class CoordinatedRestoreScenario : public Restores {
 protected:
  CoordinatedRestoreScenario() : Restores(true) {}
};

constexpr const char* Waits = ": waits for its package";
constexpr const char* Demoted = ": stays a placeholder until it is asked for";

TEST_P(RestoreScenario, ApplicationsComeBackAsPlaceholdersWithTheirDataWaiting) {
  EXPECT_EQ(restore(), std::string("skipped com.a") + Waits + "; skipped com.b" + Waits +
                           "; skipped com.c" + Demoted + "; skipped com.d" + Demoted);
  EXPECT_THAT(phone.applications(),
              ElementsAre("com.a 1.0?", "com.b 1.0?", "com.c 1.0?", "com.d 1.0?"));
  EXPECT_THAT(phone.placeholdersTold,
              ElementsAre("Title of com.a", "Title of com.b", "demoted Title of com.c",
                          "demoted Title of com.d"));
  EXPECT_THAT(phone.device().homeScreenOrder(), ElementsAre("com.d", "com.c", "com.b", "com.a"));
  EXPECT_EQ(phone.notes("com.a"), "notes of a");
  EXPECT_EQ(phone.notes("com.b"), "");
  EXPECT_EQ(phone.notes("com.d"), "notes of d");
  EXPECT_EQ(typeOf("com.a"), InstallType::Restore);
  EXPECT_EQ(typeOf("com.c"), coordination() ? InstallType::Downgrade : InstallType::Restore);
  EXPECT_EQ(typeOf("com.d"),
            coordination() ? InstallType::IntentionalDowngrade : InstallType::Restore);
}

TEST_P(RestoreScenario, StoreBringsThePackagesAndDataReturns) {
  offerAll();
  EXPECT_EQ(restoreWithStore(), std::string("installed com.a; installed com.b; skipped com.c") +
                                    Demoted + "; skipped com.d" + Demoted);
  EXPECT_THAT(phone.applications(),
              ElementsAre("com.a 1.0", "com.b 1.0", "com.c 1.0?", "com.d 1.0?"));
  const auto own = phone.device().files().contentsAtPath("/var/mobile/Containers/Data/com.a/notes");
  ASSERT_TRUE(own);
  EXPECT_EQ(asText(*own), "notes of a");
  EXPECT_THAT(phone.device().homeScreenOrder(), ElementsAre("com.d", "com.c", "com.b", "com.a"));
  EXPECT_FALSE(phone.device().files().fileExists("/var/mobile/Media/Downloads/com.a.tar"));
}

TEST_P(RestoreScenario, AnotherRestoreChangesNothing) {
  offerAll();
  restoreWithStore();
  const auto before = phone.picture();
  EXPECT_EQ(restoreWithStore(), std::string("skipped com.a: ") + LeftAsItIs +
                                    "; skipped com.b: " + LeftAsItIs + "; skipped com.c" + Demoted +
                                    "; skipped com.d" + Demoted);
  EXPECT_EQ(phone.picture(), before);
  EXPECT_FALSE(phone.device().files().fileExists(exchange::RestoreList));
}

TEST_P(RestoreScenario, StoreMayComeLaterAndWithPartOfThePackages) {
  restore();
  shelf.add("com.a");
  EXPECT_EQ(restoreWithStore(),
            std::string("installed com.a; skipped com.b: the store does not have it; skipped "
                        "com.c") +
                Demoted + "; skipped com.d" + Demoted);
  offerAll();
  phone.open();
  EXPECT_THAT(restoreWithStore(), HasSubstr("installed com.b; skipped com.a: is installed"));
  EXPECT_EQ(phone.notes("com.a"), "notes of a");
}

TEST_F(CoordinatedRestoreScenario, DemotedApplicationComesWhenItIsAskedFor) {
  offerAll();
  restoreWithStore();
  device::DeviceError problem;
  std::optional<Error> error;
  ASSERT_TRUE(device::EmbeddedDevice::tap(phone.folder(), "com.c", problem, &error));
  EXPECT_THAT(restoreWithStore(), HasSubstr("installed com.c"));
  EXPECT_EQ(phone.notes("com.c"), "notes of c");
  EXPECT_THAT(phone.applications(),
              ElementsAre("com.a 1.0", "com.b 1.0", "com.c 1.0", "com.d 1.0?"));
}

TEST_P(RestoreScenario, PackageThatTheStoreHasDamagedComesWithTheNextRestore) {
  shelf.addTruncated("com.a");
  shelf.add("com.b");
  EXPECT_THAT(restoreWithStore(), HasSubstr("installed com.b; failed com.a: "));
  offerAll();
  EXPECT_THAT(restoreWithStore(), HasSubstr("installed com.a"));
  EXPECT_EQ(phone.notes("com.a"), "notes of a");
}

TEST_P(RestoreScenario, DamagedDataKeepsOnlyItsApplicationBack) {
  backup.read();
  const auto archive = backup.folder() / "Data/com.a.tar";
  const std::string whole = fileText(archive);
  std::string damaged = whole;
  damaged[600] = 'X';
  putFile(archive, damaged);
  offerAll();
  EXPECT_EQ(restoreWithStore(),
            std::string("installed com.b; failed com.a: its data in the backup is damaged: "
                        "com.a.tar does not match its digest; skipped com.c") +
                Demoted + "; skipped com.d" + Demoted);
  EXPECT_EQ(phone.notes("com.a"), "");
  putFile(archive, whole);
  EXPECT_THAT(restoreWithStore(), HasSubstr("installed com.a"));
  EXPECT_EQ(phone.notes("com.a"), "notes of a");
}

TEST_P(RestoreScenario, BrokenEntriesFailAloneAndSayWhy) {
  const auto data = [](const PropertyList& value) {
    return PropertyList::Dictionary{
        {"HalvoMetadata", serializePropertyList(value, PropertyListFormat::Xml).value()}};
  };
  SampleBackup broken;
  broken.add("com.good");
  broken.addEntry("com.no-metadata", PropertyList::Dictionary{{"PlaceholderIcon", Bytes(3)}});
  broken.addEntry("com.no-name", data(PropertyList::Dictionary{{"bundleVersion", "1"}}));
  broken.addEntry("com.no-version", data(PropertyList::Dictionary{{"title", "A"}}));
  broken.addEntry("com.text", "text");
  broken.addEntry("com.unreadable", PropertyList::Dictionary{{"HalvoMetadata", Bytes(3)}});
  broken.addEntry("com.x/../y", data(PropertyList::Dictionary{{"title", "A"}}));
  const std::string summary = phone.restore(broken.read());
  const std::string nameless = coordination()
                                   ? ""
                                   : "failed com.no-name: its metadata tells no name; "
                                     "failed com.no-version: its metadata tells no version; ";
  EXPECT_THAT(summary,
              ::testing::StartsWith("failed com.no-metadata: the backup holds no metadata of it; " +
                                    nameless +
                                    "failed com.text: the backup holds no metadata of it; "
                                    "failed com.unreadable: its metadata cannot be read; "
                                    "failed com.x/../y: no application can have this identifier; "
                                    "skipped com.good: waits for its package"));
}

TEST_P(RestoreScenario, RestoreOverAnotherBackupsLeavesNoneOfItsData) {
  backup.add("com.e", "notes of e");
  restore();
  SampleBackup newer;
  newer.add("com.a", "newer notes of a");
  newer.add("com.e");
  phone.restore(newer.read());
  EXPECT_EQ(phone.notes("com.a"), "newer notes of a");
  EXPECT_EQ(phone.notes("com.e"), "");
}

TEST_P(RestoreScenario, WhatWasMadeSinceIsLeftAlone) {
  offerAll();
  restoreWithStore();
  const std::string notes = "/var/mobile/Containers/Data/com.a/notes";
  ASSERT_TRUE(phone.device().files().createFile(notes, toBytes("made since"), {}));
  restoreWithStore();
  EXPECT_EQ(phone.notes("com.a"), "made since");
}

TEST_P(RestoreScenario, DataOfAnApplicationThatWasDemotedSinceIsLeftAlone) {
  offerAll();
  restoreWithStore();
  const std::string notes = "/var/mobile/Containers/Data/com.a/notes";
  ASSERT_TRUE(phone.device().files().createFile(notes, toBytes("made since"), {}));
  std::optional<Error> error;
  ASSERT_TRUE(phone.device().demote("com.a", &error)) << error->localizedDescription();
  EXPECT_THAT(restoreWithStore(), HasSubstr(std::string("skipped com.a") + Demoted));
  device::DeviceError problem;
  ASSERT_TRUE(device::EmbeddedDevice::tap(phone.folder(), "com.a", problem, &error));
  EXPECT_THAT(restoreWithStore(), HasSubstr("installed com.a"));
  EXPECT_EQ(phone.notes("com.a"), "made since");
}

TEST_P(RestoreScenario, DataOfADemotedApplicationIsOverwrittenWhenAsked) {
  offerAll();
  restoreWithStore();
  const std::string notes = "/var/mobile/Containers/Data/com.a/notes";
  ASSERT_TRUE(phone.device().files().createFile(notes, toBytes("made since"), {}));
  ASSERT_TRUE(phone.device().demote("com.a", nullptr));
  RestoreInput input = backup.read();
  input.overwriteData = true;
  EXPECT_THAT(phone.restore(input), ::testing::StartsWith("data restored com.a; "));
  input.catalogue = shelf.library();
  EXPECT_THAT(phone.restore(input), HasSubstr(std::string("skipped com.a") + Demoted));
  device::DeviceError problem;
  ASSERT_TRUE(device::EmbeddedDevice::tap(phone.folder(), "com.a", problem, nullptr));
  EXPECT_THAT(phone.restore(input), HasSubstr("installed com.a"));
  EXPECT_EQ(phone.notes("com.a"), "notes of a");
  EXPECT_THAT(phone.device().namesIn("/var/mobile/Containers/Data", nullptr).value(),
              ElementsAre("com.a", "com.b"));
}

TEST_P(RestoreScenario, NoPackageIsInstalledWhileThatIsForbidden) {
  offerAll();
  restore();
  const auto before = phone.picture();
  RestoreInput input = backup.read();
  input.catalogue = shelf.library();
  input.installingAllowed = false;
  const std::string forbidden = ": " + std::string(InstallingForbidden);
  EXPECT_EQ(phone.restore(input), "skipped com.a" + forbidden + "; skipped com.b" + forbidden +
                                      "; skipped com.c" + Demoted + "; skipped com.d" + Demoted);
  EXPECT_EQ(phone.picture(), before);
}

TEST_P(RestoreScenario, InterruptionAnywhereIsMadeGood) {
  offerAll();
  RestoringPhone undisturbed(coordination());
  RestoreInput input = backup.read();
  input.catalogue = shelf.library();
  undisturbed.restore(input);
  for (int events = 0;; ++events) {
    RestoringPhone disturbed(coordination());
    std::atomic<int> left = events;  // events come on the phone's threads too
    std::atomic<bool> interrupted = false;
    disturbed.onEvent = [&](const Event&, Interruption& interruption) {
      if (left-- != 0) return;
      interrupted = true;
      interruption.request();
    };
    disturbed.restore(input);
    if (!interrupted) break;
    disturbed.onEvent = {};
    disturbed.restore(input);
    EXPECT_EQ(disturbed.picture(), undisturbed.picture()) << "after " << events << " events";
  }
}

INSTANTIATE_TEST_SUITE_P(Modes, RestoreScenario, ::testing::Bool(), [](const auto& instance) {
  return instance.param ? "Coordinated" : "Plain";
});

}  // namespace
}  // namespace appsync::host
