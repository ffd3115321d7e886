#pragma once

#include <set>
#include <string>

#include "client/log_message.h"
#include "platform/app_registry.h"
#include "platform/file_manager.h"
#include "platform/property_list.h"

namespace appsync {

/// One application whose package may be wanted, as its candidate entry tells.
struct TransferCandidate {
  std::string identifier;
  std::optional<std::string> bundlePath;
  std::optional<std::string> container;
  std::optional<std::string> version;
  std::optional<std::string> displayName;    ///< from the bundle
  std::optional<std::string> nameFromHalvo;  ///< from the desktop
  std::string iconPath;                      ///< where its rendered icon is to lie
  bool isRestore = false;
  bool isAutoDemoted = false;
  bool isIntentionallyDemoted = false;
  bool isSystemApp = false;
};

/// The applications that a sync may ask for, keyed by identifier.
struct CandidateEntries {
  /// Placeholders that stood before this call, and a copy of them with the todo list's entries.
  PropertyList::Dictionary existingPlaceholders;
  PropertyList::Dictionary all;
  /// The identifiers that the desktop's todo list names.
  std::set<std::string> wanted;
};

/// The candidate entry of a placeholder.
PropertyList::Dictionary placeholderEntry(const AppRecord& record);

/// Adds what the todo list wants installed to `entries`; one that has a placeholder keeps its
/// entry.
void addTodoEntries(const PropertyList::Array& todoList, CandidateEntries& entries,
                    const ClientLog& log);

/// Reads an entry, and the display name of its bundle. nullopt for one without an identifier.
std::optional<TransferCandidate> readCandidate(const PropertyList& entry, FileManager& files);

}  // namespace appsync
