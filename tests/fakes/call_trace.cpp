#include "tests/fakes/call_trace.h"

#include <algorithm>

namespace appsync::fakes {

std::string withoutPluginPrefix(std::string text) {
  if (const auto at = text.find(PluginLogPrefix); at != std::string::npos) {
    text.erase(at, PluginLogPrefix.size());
  }
  return text;
}

void CallTrace::add(TraceKinds kind, std::string line) {
  const std::scoped_lock lock(mutex_);
  lines_.push_back({kind, std::move(line)});
}

std::vector<std::string> CallTrace::lines(TraceKinds kinds) const {
  const std::scoped_lock lock(mutex_);
  std::vector<std::string> picked;
  for (const Line& line : lines_) {
    if (line.kind & kinds) picked.push_back(line.text);
  }
  return picked;
}

std::vector<std::string> CallTrace::readable(TraceKinds kinds) const {
  const std::scoped_lock lock(mutex_);
  std::vector<std::string> picked;
  for (const Line& line : lines_) {
    if (!(line.kind & kinds)) continue;
    picked.push_back(line.kind == TraceLog ? withoutPluginPrefix(line.text) : line.text);
  }
  return picked;
}

std::size_t CallTrace::count(std::string_view beginning) const {
  const std::scoped_lock lock(mutex_);
  return static_cast<std::size_t>(std::ranges::count_if(
      lines_, [&](const Line& line) { return line.text.starts_with(beginning); }));
}

void CallTrace::clear() {
  const std::scoped_lock lock(mutex_);
  lines_.clear();
}

}  // namespace appsync::fakes
