#include "host/library/version.h"

#include <algorithm>
#include <compare>

namespace appsync::host {
namespace {

std::string_view takePart(std::string_view& rest) {
  const std::size_t dot = std::min(rest.find('.'), rest.size());
  const std::string_view part = rest.substr(0, dot);
  rest.remove_prefix(std::min(dot + 1, rest.size()));
  return part;
}

/// Takes the digits at the beginning, without leading zeros: their length tells the greater number
/// first, however long it is.
std::string_view takeNumber(std::string_view& part) {
  const std::size_t end = std::min(part.find_first_not_of("0123456789"), part.size());
  std::string_view digits = part.substr(0, end);
  part.remove_prefix(end);
  digits.remove_prefix(std::min(digits.find_first_not_of('0'), digits.size()));
  return digits;
}

std::weak_ordering compareParts(std::string_view left, std::string_view right) {
  const std::string_view leftNumber = takeNumber(left);
  const std::string_view rightNumber = takeNumber(right);
  if (const auto order = leftNumber.size() <=> rightNumber.size(); std::is_neq(order)) return order;
  if (const auto order = leftNumber <=> rightNumber; std::is_neq(order)) return order;
  return left <=> right;
}

}  // namespace

std::weak_ordering compareVersions(std::string_view left, std::string_view right) {
  if (left.empty() || right.empty()) return !left.empty() <=> !right.empty();
  while (!left.empty() || !right.empty()) {
    const auto order = compareParts(takePart(left), takePart(right));
    if (std::is_neq(order)) return order;
  }
  return std::weak_ordering::equivalent;
}

}  // namespace appsync::host
