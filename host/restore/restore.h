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
#include "host/sync/session.h"
#include "host/transfer/install_watch.h"

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
class Restore {
 public:
  Restore(SyncClient& client, HostProcess& host, RestorePhone phone, Reporter& reporter,
          Interruption& interruption);

  SyncResult run(const RestoreInput& input);

 private:
  void overwriteData(const RestoreInput& input);
  bool callClient(const RestoreInput& input);
  void transfer(const RestoreInput& input);
  void bringPackages(const RestoreList& list, const Library& library);
  void bringFromStore(const RestoreList& list, const Library& catalogue);
  void reportPlaceholders(const RestoreList& list);
  /// None when it cannot be told, which breaks the restore off.
  ApplicationsPresent applicationsNow();
  /// The applications that nothing must be brought to.
  std::set<std::string> leftOut(const RestoreList& list, const ApplicationsPresent& present) const;
  void note(const std::map<std::string, std::string>& failures);
  /// Why a placeholder has no package.
  void explainPlaceholders(const RestoreInput& input, RestoreEnd& end);
  Summary settle(const RestoreInput& input);
  /// Always false.
  bool broken(std::string_view what, const std::optional<Error>& error);

  SyncClient& client_;
  HostProcess& host_;
  const RestorePhone phone_;
  Reporter& reporter_;
  Interruption& interruption_;
  InstallWatch watch_;
  Handover handover_;
  std::map<std::string, InstalledData> installedData_;
  std::set<std::string> sent_;                   ///< what the client asked for
  std::map<std::string, std::string> failures_;  ///< reason by identifier
  std::optional<std::string> broken_;
};

}  // namespace appsync::host
