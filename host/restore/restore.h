#pragma once

#include <map>
#include <optional>
#include <set>
#include <string>

#include "host/library/library.h"
#include "host/phone/sync_host.h"
#include "host/restore/restore_handover.h"
#include "host/restore/restore_list.h"
#include "host/restore/restore_settlement.h"
#include "host/transfer/visit.h"

namespace appsync::host {

struct RestoreInput {
  Backup backup;
  RestoreList list;                  ///< the backup's
  std::optional<Library> packages;   ///< what the host itself brings
  std::optional<Library> catalogue;  ///< the store's
  bool overwriteData = false;        ///< of applications that have data of their own too
  bool installingAllowed = true;     ///< by the phone's policy; else only placeholders come
};

/// One restore of a backup: what the phone is given, the client's calls in their order, and the
/// packages that the host or the store brings. It does what is missing on the phone, so that
/// another restore of the same backup carries on wherever this one ended, and changes nothing once
/// all is there. Borrows everything; used once, by one thread.
class Restore : Visit {
 public:
  Restore(SyncClient& client, HostProcess& host, Phone phone, Reporter& reporter,
          Interruption& interruption);

  SyncResult run(const RestoreInput& input);

 private:
  void overwriteData(const RestoreInput& input);
  [[nodiscard]] bool callClient(const RestoreInput& input);
  void transfer(const RestoreInput& input);
  /// For the placeholders of a restore that are not demoted or left out, on a phone that does not
  /// coordinate installs. The client installs such a package at once, or, when data waits for its
  /// application, remembers it until the data is delivered too; one that an interrupted restore
  /// left remembered is not sent again. The installs end with the client's transfers.
  void bringPackages(const RestoreList& list, const Library& library);
  void bringFromStore(const RestoreInput& input);
  void reportPlaceholders(const RestoreList& list);
  /// The applications that nothing must be brought to.
  std::set<std::string> leftOut(const RestoreList& list, const ApplicationsPresent& present) const;
  /// Why a placeholder has no package.
  void explainPlaceholders(const RestoreInput& input, RestoreEnd& end);
  Summary settle(const RestoreInput& input);

  Handover handover_;
  std::map<std::string, InstalledData> installedData_;
};

}  // namespace appsync::host
