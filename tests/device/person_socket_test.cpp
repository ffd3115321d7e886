#include "device/person_socket.h"

#include <fmt/format.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>

#include "platform/sync_files.h"
#include "tests/device/coordination_test.h"

namespace appsync::device {
namespace {

using Lines = std::vector<std::string>;
constexpr std::string_view Id = "com.example.a";
constexpr std::string_view BadRequest =
    "error the request is no line, is too long or took too long\n";

FileDescriptor listenAnew(const std::filesystem::path& folder) {
  FileDescriptor listener(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  (folder / "person").native().copy(address.sun_path, sizeof address.sun_path - 1);
  const auto* where = reinterpret_cast<const sockaddr*>(&address);
  if (bind(listener.get(), where, sizeof address) != 0) listener.reset();
  return listener;
}

/// A device that coordinates, open for writing, with an install that waits for its package.
class PersonSocketTest : public CoordinationTest {
 protected:
  PersonSocketTest() { prepare(Id); }

  /// What the function gives: 0 done, 1 refused, 2 the device is unusable.
  int outcomeOf(bool (*gesture)(const std::filesystem::path&, std::string_view, DeviceError&,
                                std::optional<Error>*),
                std::string_view identifier) {
    DeviceError problem;
    std::optional<Error> refusal;
    if (gesture(folder, identifier, problem, &refusal)) return 0;
    return refusal ? 1 : 2;
  }

  /// Sends bytes as they are and gives all that comes back.
  std::string answerTo(std::string_view bytes, bool endThere = false) {
    const FileDescriptor connection(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    (folder / "person").native().copy(address.sun_path, sizeof address.sun_path - 1);
    const auto* where = reinterpret_cast<const sockaddr*>(&address);
    if (connect(connection.get(), where, sizeof address) != 0) return "no connection";
    send(connection.get(), bytes.data(), bytes.size(), MSG_NOSIGNAL);
    if (endThere) shutdown(connection.get(), SHUT_WR);
    std::string answer;
    char piece[256];
    for (ssize_t count = 0; (count = recv(connection.get(), piece, sizeof piece, 0)) > 0;) {
      answer.append(piece, static_cast<std::size_t>(count));
    }
    return answer;
  }

  std::filesystem::path socketPath() const { return folder / "person"; }
};

TEST_F(PersonSocketTest, ATapReachesTheInstallsClientThroughTheWriter) {
  EXPECT_EQ(outcomeOf(&EmbeddedDevice::tap, Id), 0);
  EXPECT_TRUE(recorder.waitFor("prioritize com.example.a"));
}

TEST_F(PersonSocketTest, ACancellationReachesTheInstallThroughTheWriter) {
  EXPECT_EQ(outcomeOf(&EmbeddedDevice::cancel, Id), 0);
  EXPECT_TRUE(recorder.waitFor("canceled com.example.a by"));
  waitUntilIdle(Id);
  EXPECT_EQ(registry(), Lines());
  EXPECT_EQ(outcomeOf(&EmbeddedDevice::cancel, Id), 1);
}

TEST_F(PersonSocketTest, WhatIsNotBeingInstalledIsRefusedWithTheReason) {
  DeviceError problem;
  for (const std::string_view identifier : {"com.example.other", "../x", "", "a\ncancel b"}) {
    error.reset();
    EXPECT_FALSE(EmbeddedDevice::tap(folder, identifier, problem, &error));
    EXPECT_EQ(error->localizedDescription(), fmt::format("{} is not being installed", identifier));
  }
  EXPECT_EQ(recorder.count("prioritize"), 0U);
}

TEST_F(PersonSocketTest, OnlyItsOwnerMayEnterAndItGoesWithTheWriter) {
  struct stat status {};
  ASSERT_EQ(lstat(socketPath().c_str(), &status), 0);
  EXPECT_TRUE(S_ISSOCK(status.st_mode));
  EXPECT_EQ(status.st_mode & 07777U, 0600U);
  EXPECT_EQ(status.st_uid, geteuid());
  device.reset();
  EXPECT_NE(lstat(socketPath().c_str(), &status), 0);
}

TEST_F(PersonSocketTest, HostileRequestsAreAnsweredAndHarmNothing) {
  EXPECT_EQ(answerTo("\n"), "error the request names no application\n");
  EXPECT_EQ(answerTo("tap\n"), "error the request names no application\n");
  EXPECT_EQ(answerTo("rob com.example.a\n"), "error the request is neither to tap nor to cancel\n");
  const std::string unusable = "error no application can have this identifier\n";
  for (const std::string_view line :
       {"tap \n", "cancel ../../etc\n", "tap com.example.a \n", "cancel com.example.a\r\n"}) {
    EXPECT_EQ(answerTo(line), unusable) << line;
  }
  EXPECT_EQ(answerTo(std::string("tap com\0.a\n", 11)), unusable);
  EXPECT_EQ(answerTo("tap com.example.b\n"), "error com.example.b is not being installed\n");
  EXPECT_EQ(answerTo("cancel com.example.a", true), BadRequest);
  EXPECT_EQ(answerTo("", true), BadRequest);
  EXPECT_EQ(answerTo("tap " + std::string(300, 'a')), BadRequest);
  EXPECT_EQ(answerTo("tap com.example.a\n"), "ok\n");
  EXPECT_TRUE(recorder.waitFor("prioritize com.example.a"));
  EXPECT_EQ(recorder.count("canceled"), 0U);
}

TEST_F(PersonSocketTest, AnAskerThatSaysNothingIsSentAwayAndKeepsNobodyFromClosing) {
  EXPECT_EQ(answerTo("tap com."), BadRequest);
  const FileDescriptor silent(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  socketPath().native().copy(address.sun_path, sizeof address.sun_path - 1);
  ASSERT_EQ(connect(silent.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
  device.reset();
}

TEST_F(PersonSocketTest, ASocketThatAKilledWriterLeftIsNobodysAndIsReplaced) {
  device.reset();
  listenAnew(folder);
  ASSERT_TRUE(std::filesystem::exists(socketPath()));
  DeviceError problem;
  EXPECT_EQ(askWriter(DevicePaths(folder), PersonWish::Tap, Id, &error), WishOutcome::NobodyThere);
  reopen();
  EXPECT_EQ(outcomeOf(&EmbeddedDevice::tap, Id), 0);
}

TEST_F(PersonSocketTest, WithoutAWriterTheWishIsCarriedOutAtOnce) {
  device.reset();
  DeviceError problem;
  EXPECT_TRUE(EmbeddedDevice::tap(folder, Id, problem, &error));
  EXPECT_TRUE(EmbeddedDevice::cancel(folder, Id, problem, &error));
  EXPECT_FALSE(EmbeddedDevice::cancel(folder, Id, problem, &error));
  reopen();
  EXPECT_FALSE(live(Id));
  EXPECT_EQ(registry(), Lines());
}

TEST_F(PersonSocketTest, ADeviceOnALongPathTakesWishesToo) {
  const std::filesystem::path deep =
      temporary.path() / std::string(120, 'd') / std::string(120, 'e');
  std::filesystem::create_directories(deep.parent_path());
  device.reset();
  std::filesystem::rename(folder, deep);
  folder = deep;
  reopen();
  EXPECT_EQ(outcomeOf(&EmbeddedDevice::tap, Id), 0);
}

TEST_F(PersonSocketTest, SomethingElseOfItsNameIsLeftAloneAndTheDeviceOpensAllTheSame) {
  device.reset();
  std::filesystem::create_directory(socketPath());
  reopen();
  EXPECT_TRUE(std::filesystem::is_directory(socketPath()));
  EXPECT_TRUE(logMentions("nobody can tap or cancel an install meanwhile"));
  EXPECT_EQ(outcomeOf(&EmbeddedDevice::tap, Id), 2);
}

class UncoordinatedTest : public DeviceTest {
 protected:
  static constexpr std::string_view OwnNotes = "/var/mobile/Containers/Data/com.example.a/notes";
  static constexpr std::string_view WaitingNotes =
      "/var/mobile/Media/HalvoRestore/Data/com.example.a/notes";
  bool demote(InstallType demotion) {
    return installPlaceholder(
        Id, "1.0", {{std::string(SWInstallTypeKey), static_cast<std::uint64_t>(demotion)}});
  }
  using Wish = bool (*)(const std::filesystem::path&, std::string_view, DeviceError&,
                        std::optional<Error>*);
  std::string refusal(Wish wish) {
    DeviceError problem;
    std::optional<Error> why;
    return wish(folder, Id, problem, &why) || !why ? "none" : why->localizedDescription();
  }
  InstallType placeholderType() {
    const auto placeholder = record(Id, true);
    return placeholder ? placeholder->installType : InstallType::None;
  }
};

TEST_F(UncoordinatedTest, NoInstallCanBeTappedOrCancelledAndTheReasonSaysWhetherThereIsOne) {
  ASSERT_TRUE(installPlaceholder("com.example.a"));
  EXPECT_EQ(refusal(&EmbeddedDevice::tap),
            "com.example.a is just being installed, and this phone brings packages in their order");
  EXPECT_EQ(refusal(&EmbeddedDevice::cancel),
            "com.example.a is just being installed, too late to cancel");
  reopen();  // the sync that began it is gone
  EXPECT_EQ(refusal(&EmbeddedDevice::tap), "com.example.a is not being installed");
  EXPECT_EQ(refusal(&EmbeddedDevice::cancel), "com.example.a is not being installed");
  ASSERT_TRUE(installPackage(Id, "1.0"));
  EXPECT_EQ(refusal(&EmbeddedDevice::tap), "com.example.a is not being installed");
  DeviceError problem;
  EXPECT_FALSE(EmbeddedDevice::tap(folder / "nowhere", Id, problem, nullptr));
  EXPECT_EQ(problem.problem, DeviceProblem::Missing);
}

TEST_F(UncoordinatedTest, ADemotedOrRestoredApplicationThatIsTappedIsAskedForOnceAndForAll) {
  for (const InstallType demotion :
       {InstallType::Downgrade, InstallType::IntentionalDowngrade, InstallType::Restore}) {
    ASSERT_TRUE(demote(demotion));
    DeviceError problem;
    for (int tap = 0; tap < 2; ++tap) {
      EXPECT_TRUE(EmbeddedDevice::tap(folder, Id, problem, nullptr));
      EXPECT_EQ(placeholderType(), InstallType::StoreDownload);
    }
  }
}

TEST_F(UncoordinatedTest, ARestoredApplicationThatWaitsIsGoneWithItsDataWhenItIsCancelled) {
  putFile("/var/mobile/Media/HalvoRestore/Data/com.example.a/saved", "old");
  ASSERT_TRUE(demote(InstallType::Restore));
  EXPECT_EQ(refusal(&EmbeddedDevice::cancel), "none");
  EXPECT_EQ(registry(), std::vector<std::string>{});
  EXPECT_FALSE(device->files().fileExists("/var/mobile/Media/HalvoRestore/Data/com.example.a"));
  EXPECT_EQ(refusal(&EmbeddedDevice::cancel), "com.example.a is not being installed");
}

TEST_F(UncoordinatedTest, ADemotedApplicationIsNotBeingInstalled) {
  ASSERT_TRUE(demote(InstallType::IntentionalDowngrade));
  EXPECT_EQ(refusal(&EmbeddedDevice::cancel), "com.example.a is not being installed");
  EXPECT_EQ(placeholderType(), InstallType::IntentionalDowngrade);
}

TEST_F(UncoordinatedTest, WhatWasTappedIsAsItWasBeforeWhenItIsCancelled) {
  for (const InstallType demotion : {InstallType::Downgrade, InstallType::IntentionalDowngrade}) {
    ASSERT_TRUE(demote(demotion));
    putFile(OwnNotes, "mine");
    for (int tap = 0; tap < 2; ++tap) EXPECT_EQ(refusal(&EmbeddedDevice::tap), "none");
    EXPECT_EQ(refusal(&EmbeddedDevice::cancel), "none");
    EXPECT_EQ(placeholderType(), demotion);
    EXPECT_EQ(textAt(OwnNotes), "mine");
    EXPECT_EQ(refusal(&EmbeddedDevice::cancel), "com.example.a is not being installed");
  }
}

TEST_F(UncoordinatedTest, ARestoredApplicationThatIsListedAsDemotedIsNoMoreThanDemoted) {
  putFile(WaitingNotes, "old");
  ASSERT_TRUE(demote(InstallType::Restore));
  putFile(exchange::DemotedApplications,
          xml(PropertyList::Dictionary{
              {"AutomaticDowngrades", PropertyList::Array{PropertyList(Id)}}}));
  EXPECT_EQ(refusal(&EmbeddedDevice::cancel), "com.example.a is not being installed");
  EXPECT_EQ(refusal(&EmbeddedDevice::tap), "none");
  EXPECT_EQ(refusal(&EmbeddedDevice::cancel), "none");
  EXPECT_EQ(placeholderType(), InstallType::Restore);
  EXPECT_EQ(textAt(WaitingNotes), "old");
}

TEST_F(UncoordinatedTest, NothingIsCancelledWhileItCannotBeSeenWhatIsDemoted) {
  putFile(WaitingNotes, "old");
  ASSERT_TRUE(demote(InstallType::Restore));
  std::filesystem::create_directories(onDisk(exchange::DemotedApplications));
  EXPECT_NE(refusal(&EmbeddedDevice::cancel), "none");
  EXPECT_EQ(placeholderType(), InstallType::Restore);
  EXPECT_EQ(textAt(WaitingNotes), "old");
}

TEST_F(UncoordinatedTest, ARestoredApplicationThatWasTappedIsGoneWithItsDataWhenItIsCancelled) {
  putFile(WaitingNotes, "old");
  ASSERT_TRUE(demote(InstallType::Restore));
  EXPECT_EQ(refusal(&EmbeddedDevice::tap), "none");
  EXPECT_EQ(refusal(&EmbeddedDevice::cancel), "none");
  EXPECT_EQ(registry(), std::vector<std::string>{});
  EXPECT_FALSE(device->files().fileExists(WaitingNotes));
}

TEST_F(UncoordinatedTest, WhatWasTappedAndIsComingIsTooLateToCancel) {
  ASSERT_TRUE(demote(InstallType::IntentionalDowngrade));
  EXPECT_EQ(refusal(&EmbeddedDevice::tap), "none");
  device->appRegistry()
      .installProgressSync(*record(Id, true))
      ->setInstallState(InstallState::Active);
  EXPECT_EQ(refusal(&EmbeddedDevice::cancel),
            "com.example.a is just being installed, too late to cancel");
  EXPECT_EQ(placeholderType(), InstallType::StoreDownload);
}

TEST_F(UncoordinatedTest, ATapWithoutAWriterStaysOnTheDevice) {
  ASSERT_TRUE(demote(InstallType::IntentionalDowngrade));
  device.reset();
  DeviceError problem;
  EXPECT_TRUE(EmbeddedDevice::tap(folder, Id, problem, nullptr));
  reopen();
  EXPECT_EQ(placeholderType(), InstallType::StoreDownload);
}

}  // namespace
}  // namespace appsync::device
