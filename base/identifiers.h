#pragma once

#include <string_view>

namespace appsync {

/// Whether a bundle identifier from outside may become the name of a file or directory: letters,
/// digits, '.', '_' and '-', at least one of them a letter or digit, at most 200 bytes, and no
/// temporary name, which is swept.
bool isUsableIdentifier(std::string_view identifier);

/// Whether an application of this identifier can be sent: the phone takes it, and it is no hidden
/// name nor one that the exchange with the phone keeps for itself.
bool isSendableIdentifier(std::string_view identifier);

}  // namespace appsync
