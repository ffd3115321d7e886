#pragma once

#include <compare>
#include <string_view>

namespace appsync::host {

/// Order of two bundle versions: part by part between the dots, each by its leading number and then
/// by the text behind it. A missing part counts as 0, so "1.0" and "1" are equivalent; an empty
/// version comes before all others.
std::weak_ordering compareVersions(std::string_view left, std::string_view right);

}  // namespace appsync::host
