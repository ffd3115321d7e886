#pragma once

#include <memory>
#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <vector>

#include "base/data_stream.h"
#include "base/durability.h"
#include "platform/platform.h"

// What a host needs of a phone beside the client that runs on it. Whatever stands behind it, a
// folder or something at the other end of a connection, values go in and out, and a question about
// many applications is asked once. All may be called from any thread unless said otherwise; nothing
// throws.

namespace appsync {

/// A file that is being sent to the phone piece by piece. Destroying it before `finish` removes
/// what has arrived. Used by one thread.
class FileReceiver {
 public:
  virtual ~FileReceiver() = default;
  [[nodiscard]] virtual bool append(ByteView bytes, std::optional<Error>* error) noexcept = 0;
  /// The file is whole. False when it could not be completed.
  [[nodiscard]] virtual bool finish(Durability durability,
                                    std::optional<Error>* error) noexcept = 0;
};

/// Told of things that a person watching the phone would see, on the threads that bring them about
/// and before the call that does so returns. Must not replace the watcher.
class PhoneWatcher {
 public:
  virtual ~PhoneWatcher() = default;
  /// A termination assertion was denied because the application is in the foreground.
  virtual void assertionDenied(std::string_view bundleId) noexcept { (void)bundleId; }
  /// A package was installed (error none) or refused.
  virtual void installFinished(std::string_view bundleId,
                               const std::optional<Error>& error) noexcept {
    (void)bundleId, (void)error;
  }
};

/// Files that are sent to the phone.
class IncomingFiles {
 public:
  virtual ~IncomingFiles() = default;

  /// Begins to receive a file at a path of the phone; parents are made, an existing file is
  /// replaced when it is finished. nullptr (with an error) when that cannot be.
  [[nodiscard]] virtual std::unique_ptr<FileReceiver> receiveFile(
      std::string_view path, std::optional<Error>* error) noexcept = 0;

  /// The names in a directory of the phone, sorted; none of one that is not there. nullopt (with an
  /// error) when they could not be read.
  [[nodiscard]] virtual std::optional<std::vector<std::string>> namesIn(
      std::string_view directory, std::optional<Error>* error) noexcept = 0;
};

/// What a backup saves of the applications beside their files, and a restore gives back.
class ApplicationData {
 public:
  virtual ~ApplicationData() = default;

  /// One record per registry entry (BundleKind::All), sorted by identifier, placeholders last.
  /// None, with an error, when the registry cannot be read.
  [[nodiscard]] virtual std::vector<AppRecord> applications(
      std::optional<Error>* error = nullptr) noexcept = 0;

  /// The opaque blob that came with the application or its placeholder; nullopt for none, and with
  /// an error when that cannot be read.
  [[nodiscard]] virtual std::optional<Bytes> opaqueBlob(
      std::string_view bundleId, std::optional<Error>* error = nullptr) noexcept = 0;

  /// Gives an application's own data, or for a placeholder what a restore has still to give back to
  /// it, as a tar archive whose bytes depend only on the data. Empty data gives no bytes at all.
  /// False (with an error) when it could not be read or the sink ended it (POSIX 125).
  [[nodiscard]] virtual bool saveData(std::string_view bundleId, const DataSink& sink,
                                      std::optional<Error>* error) noexcept = 0;

  /// Takes such an archive and lays the data out where it waits for the application, in one step
  /// and on the disk; what waited there before is gone. False (with an error, POSIX 125 for the
  /// source's own failure) when it is no archive, holds what no data may hold, or cannot be stored;
  /// nothing has changed then.
  [[nodiscard]] virtual bool restoreData(std::string_view bundleId, const DataSource& source,
                                         std::optional<Error>* error) noexcept = 0;

  /// Takes such an archive and gives it to an installed application in the place of its data, in
  /// one step and on the disk; no bytes at all leave it without any. Until then the old data is
  /// whole. False (with an error, POSIX 2 when it is not installed, 16 when it is open or being
  /// updated) as above; nothing has changed then. It cannot be brought to the foreground meanwhile.
  [[nodiscard]] virtual bool overwriteData(std::string_view bundleId, const DataSource& source,
                                           std::optional<Error>* error) noexcept = 0;
};

/// What the phone does by itself.
class PhoneActivity {
 public:
  virtual ~PhoneActivity() = default;

  /// At most one watcher; nullptr for none. No call to the old one runs after this has returned.
  virtual void setWatcher(PhoneWatcher* watcher) noexcept = 0;

  /// The host wants to end: termination assertions are refused from now on with an unknown error
  /// (3) and pending delays of the background queue run at once, so that waiting installs come to
  /// an end.
  virtual void expedite() noexcept = 0;

  /// Those of the applications for which the phone has something left to do: an install or a
  /// removal through coordination, or telling a client that is there. Not an install that waits for
  /// its client; none without coordination, where calls return when all is done.
  virtual std::set<std::string> busyAmong(const std::set<std::string>& bundleIds) noexcept = 0;

  /// The applications whose coordinators named this client to bring the package, and still wait for
  /// it.
  virtual std::set<std::string> packagesOwedBy(CoordinationClientId client) noexcept = 0;
};

/// A phone as a host sees it. All outlive its users.
struct Phone {
  FileManager& files;
  AppRegistry& apps;
  HomeScreenService& homeScreen;
  IconRenderer& iconRenderer;
  ImageEncoderService& imageEncoders;
  IncomingFiles& incoming;
  ApplicationData& data;
  PhoneActivity& activity;
  /// nullptr when installs are not driven through coordinators.
  InstallCoordination* coordination = nullptr;
};

}  // namespace appsync
