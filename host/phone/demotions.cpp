#include "host/phone/demotions.h"

#include "host/phone/phone_state.h"
#include "platform/sync_files.h"

namespace appsync::host {

Demotions::Demotions(FileManager& files) {
  std::optional<Error> error;
  const auto lists = readDictionary(files, exchange::DemotedApplications, &error);
  if (error) {
    problem_ = withReason("the phone's list of demoted applications could not be looked at", error);
  }
  for (const std::string_view key :
       {exchange::AutomaticDowngradesKey, exchange::IntentionalDowngradesKey}) {
    if (!lists) break;
    const std::vector<std::string> names = findStrings(*lists, key);
    named_.insert(names.begin(), names.end());
  }
}

bool Demotions::holdBack(const AppRecord& placeholder) const {
  switch (placeholder.installType) {
    case InstallType::Downgrade:
    case InstallType::IntentionalDowngrade:
      return true;
    case InstallType::Restore:
      // Without coordination the phone makes every placeholder of a restore alike.
      return problem_ || named_.contains(placeholder.applicationIdentifier);
    default:
      return false;
  }
}

}  // namespace appsync::host
