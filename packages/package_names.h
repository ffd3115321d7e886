#pragma once

#include <string>
#include <string_view>

namespace appsync {

/// Whether people could not see what the name really is: a control character (C0, DEL, C1), a line
/// or paragraph separator, or a mark that turns the reading direction of what follows. `name` is
/// UTF-8.
bool holdsInvisibleControls(std::string_view name);

/// The name with case taken away, so that two names which a file system that ignores case takes
/// for the same become equal. Folds single letters of ASCII, Latin-1, Latin Extended-A, Greek,
/// Cyrillic, Armenian and full-width Latin, and the Kelvin and Angstrom signs and the long s; not
/// letters that fold into several ("ß") and no composed against decomposed forms. `name` is UTF-8.
std::string foldCase(std::string_view name);

/// The name as an error message may show it: controls and bytes that are no UTF-8 as "\xHH", cut
/// off after 120 bytes.
std::string shown(std::string_view name);

}  // namespace appsync
