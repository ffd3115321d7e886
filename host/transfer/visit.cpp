#include "host/transfer/visit.h"

#include <algorithm>

#include "host/transfer/shipments.h"

namespace appsync::host {

Visit::Visit(SyncClient& client, HostProcess& host, Phone phone, Reporter& reporter,
             Interruption& interruption)
    : client_(client),
      host_(host),
      phone_(std::move(phone)),
      reporter_(reporter),
      interruption_(interruption),
      watch_(phone_, reporter, interruption),
      sender_(makeSender()) {}

bool Visit::isServed() {
  const auto dataclasses = client_.supportedDataclasses();
  return std::ranges::find(dataclasses, ApplicationDataclass) != dataclasses.end() ||
         breakOff("the plug-in does not serve applications");
}

bool Visit::begin(std::string_view hostAnchor, std::string_view failure) {
  std::optional<Error> error;
  const auto ignoreProgress = [](double) {};
  return client_.prepareForSyncWithHostAnchor(hostAnchor, ignoreProgress, &error) ||
         breakOff(failure, error);
}

void Visit::sendToClient(const std::vector<SyncAssetPtr>& assets, const Library& library) {
  sender_.send(shipmentsTo(client_, assets, library), InterruptedTransfer);
}

void Visit::bringFromStore(const ApplicationsPresent& present, const Library& catalogue,
                           std::optional<InstallType> origin,
                           const std::set<std::string>& identifiers,
                           std::string_view ifInterrupted) {
  PackageSender sender = makeSender();
  sender.send(shipmentsFromStore(host_, phone_, present, catalogue, origin, identifiers),
              ifInterrupted);
  sender.settle();
  note(sender.outcome().failures);
}

std::optional<ApplicationsPresent> Visit::applicationsNow() {
  std::optional<Error> error;
  auto present = applicationsPresent(phone_, &error);
  if (!present) breakOff(CannotTellApplications, error);
  return present;
}

void Visit::endTransfers() {
  client_.assetTransferEndedWithSuccess(!broken_ && !interruption_.requested());
  // A coordinated install takes its package away itself, perhaps later.
  if (!phone_.coordination) sender_.removeSentPackages();
}

void Visit::note(const std::map<std::string, std::string>& failures) {
  failures_.insert(failures.begin(), failures.end());
}

bool Visit::breakOff(std::string_view what, const std::optional<Error>& error) {
  broken_ = withReason(what, error);
  reporter_.report(SyncBroken{*broken_});
  return false;
}

}  // namespace appsync::host
