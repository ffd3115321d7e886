#pragma once

#include <optional>
#include <set>
#include <span>
#include <string>
#include <string_view>

#include "transfer/transfer_candidates.h"

namespace appsync {

/// What the rules weigh a candidate against; the same for all candidates of one call.
struct TransferContext {
  bool installationAllowed = true;
  bool useInstallCoordinator = false;
  const std::set<std::string>& qlpAppsToIgnore;
  const std::set<std::string>& systemAppPlaceholders;
  const std::set<std::string>& wanted;
};

/// What a rule says of a candidate, with the line to log.
struct TransferVerdict {
  bool skip = true;
  std::string line;
};

/// A named, pure rule; none: it has nothing to say of this candidate.
struct TransferRule {
  std::string_view name;
  std::optional<TransferVerdict> (*judge)(const TransferCandidate& candidate,
                                          const TransferContext& context);
};

/// The rules in the order in which they apply; the first one that skips a candidate ends its way.
std::span<const TransferRule> transferRules();

/// Applies the rules and logs what they say. True when the candidate's package is to be asked for.
bool isWanted(const TransferCandidate& candidate, const TransferContext& context,
              const ClientLog& log);

}  // namespace appsync
