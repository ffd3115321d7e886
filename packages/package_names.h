#pragma once

#include <string>
#include <string_view>

namespace appsync {

/// The name with case taken away, so that two names which a file system that ignores case takes
/// for the same become equal. Folds single letters of ASCII, Latin-1, Latin Extended-A, Greek,
/// Cyrillic, Armenian and full-width Latin, and the Kelvin and Angstrom signs and the long s; not
/// letters that fold into several ("ß") and no composed against decomposed forms. `name` is UTF-8.
std::string foldCase(std::string_view name);

}  // namespace appsync
