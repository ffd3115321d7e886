#pragma once

#include "host/restore/restore.h"
#include "platform/property_list_codec.h"
#include "tests/host/session_fixture.h"

namespace appsync::host::testing {

/// A client that also does what a host sees of a real one's restores: it makes placeholders of the
/// restore list (with coordination, coordinators that leave their package to the store), and keeps
/// a package in mind whose data waits until that data is delivered.
class RestoringClient : public RecordingClient {
 public:
  RestoringClient(fakes::FakePlatform& phone, SyncHost& syncHost, const FakePhone::Texts& waiting,
                  const bool& coordination)
      : RecordingClient(phone, syncHost),
        fake_(phone),
        waiting_(waiting),
        coordination_(coordination) {}

  bool reconcileRestoreOfType(std::int32_t type, std::optional<Error>* error) noexcept override;
  void assetTransferSucceeded(const SyncAssetPtr& asset, bool succeeded,
                              const std::optional<Error>& error) noexcept override;

  std::set<std::string> unwilling;  ///< it makes no placeholders of these
  std::function<void()> onReconcile;

 private:
  void makePlaceholder(const std::string& identifier, const PropertyList& entry);

  fakes::FakePlatform& fake_;
  const FakePhone::Texts& waiting_;
  const bool& coordination_;
};

/// Restores of real backup folders to a fake phone.
class RestoreTest : public SessionTest {
 protected:
  RestoreTest();

  /// What goes into the backup. Demoted: intentionally.
  void backUp(const std::string& identifier, const std::string& data = {}, bool demoted = false);
  /// The backup so far, read from its folder.
  Backup backup();
  /// A whole restore; the summary as text.
  std::string restore();

  /// In the fake phone: the placeholder of a restore, with its coordinator if there are any.
  void seedRestoring(const std::string& identifier, InstallType installType = InstallType::Restore);
  void putRemembered(const std::string& identifier, const std::string& path);
  std::vector<std::string> namesOnList() const;

  PropertyList::Dictionary entries;  ///< of the restore list
  PropertyList::Array intentional;
  std::map<std::string, std::string> data;
  RestoringClient client{phone, host, waiting, coordination};
  bool packages = false;  ///< from `folder`
  bool store = false;     ///< from `folder`
  bool overwriteData = false;
  std::set<std::string> only;                   ///< none: all
  std::map<std::string, Error> refusedByPhone;  ///< coordinated installs
  Folder backups;

 private:
  void settleCoordinated(const std::string& identifier);
};

PropertyList::Dictionary metadataOf(std::string_view identifier, std::string_view version = "1.0");

}  // namespace appsync::host::testing
