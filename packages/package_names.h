#pragma once

#include <string>
#include <string_view>

namespace appsync {

/// What two names have in common that some file system takes for one, because it ignores case or
/// the form in which Unicode writes a letter ("é" as one character or two). Unicode calls that the
/// canonical caseless match; letters that merely look or mean alike stay different. `name` is
/// UTF-8.
std::string comparableName(std::string_view name);

}  // namespace appsync
