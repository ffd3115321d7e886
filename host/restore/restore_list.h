#pragma once

#include <optional>
#include <set>
#include <string>
#include <vector>

#include "host/backup/backup_folder.h"
#include "platform/error.h"
#include "platform/property_list.h"

namespace appsync::host {

/// An application as a backup describes it.
struct BackedUpApplication {
  std::string identifier;
  std::string version;  ///< empty when the backup tells none
  std::string name;     ///< the identifier when the backup tells none
  /// What keeps a phone from making a placeholder of it; empty when nothing is known to.
  std::string flaw;
};

/// The applications of a backup.
class RestoreList {
 public:
  /// nullopt, with one line for people, when the backup's list is none.
  [[nodiscard]] static std::optional<RestoreList> of(const Backup& backup, std::string& problem);

  /// Keeps only these. False, with one line for people, when the backup lacks one of them.
  [[nodiscard]] bool keepOnly(const std::set<std::string>& identifiers, std::string& problem);
  /// Whether that was done: what concerns the phone as a whole stays as it is.
  bool isPart() const { return isPart_; }
  bool names(const std::string& identifier) const { return entries_.contains(identifier); }

  /// Sorted by identifier.
  const std::vector<BackedUpApplication>& applications() const { return applications_; }

  /// The list that the phone gets: only these applications, as the backup holds them.
  [[nodiscard]] std::optional<Bytes> only(const std::set<std::string>& identifiers,
                                          std::optional<Error>* error) const;

 private:
  PropertyList::Dictionary entries_;
  std::vector<BackedUpApplication> applications_;
  bool isPart_ = false;
};

}  // namespace appsync::host
