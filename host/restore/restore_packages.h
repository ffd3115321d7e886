#pragma once

#include <map>
#include <set>
#include <string>
#include <vector>

#include "host/library/library.h"
#include "host/phone/sync_host.h"
#include "host/transfer/package_sender.h"

namespace appsync::host {

/// Brings the packages of restored applications to a phone that does not coordinate installs.
///
/// The client installs such a package at once, or, when data waits for its application, remembers
/// it until the data is delivered too; a package that an interrupted restore left remembered is not
/// sent again. Borrows everything; used by one thread.
class RestorePackages {
 public:
  RestorePackages(SyncClient& client, HostProcess& host, const RestorePhone& phone,
                  Reporter& reporter, const Interruption& interruption, const Library& library)
      : client_(client),
        host_(host),
        phone_(phone),
        interruption_(interruption),
        library_(library),
        sender_(host.transfers(), phone, reporter, interruption) {}

  /// For those of the applications present that are placeholders of a restore and not demoted, but
  /// `except`. The installs end with the client's transfers.
  void deliver(const ApplicationsPresent& present, const std::set<std::string>& except);

  /// Reason by identifier.
  const std::map<std::string, std::string>& failures() const { return failures_; }

 private:
  void fail(const std::vector<AppRecord>& records, const std::string& reason);
  std::vector<AppRecord> wanted(const ApplicationsPresent& present,
                                const std::set<std::string>& except) const;
  SyncAssetPtr makeAsset(const AppRecord& record, std::uint32_t parts) const;

  SyncClient& client_;
  HostProcess& host_;
  const RestorePhone& phone_;
  const Interruption& interruption_;
  const Library& library_;
  PackageSender sender_;
  std::map<std::string, std::string> failures_;
};

}  // namespace appsync::host
