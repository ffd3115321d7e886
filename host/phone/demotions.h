#pragma once

#include <optional>
#include <set>
#include <string>

#include "platform/app_registry.h"
#include "platform/file_manager.h"

namespace appsync::host {

/// The applications of a phone that are to stay placeholders until a person asks for them.
class Demotions {
 public:
  /// As the phone's own file lists them; none when there is no such file or it holds no list.
  explicit Demotions(FileManager& files);

  /// Why the file could not be looked at, for people. Then every placeholder that may be demoted is
  /// held back.
  const std::optional<std::string>& problem() const { return problem_; }

  /// A placeholder that was asked for has another install type than a restore's.
  bool holdBack(const AppRecord& placeholder) const;

 private:
  std::set<std::string, std::less<>> named_;
  std::optional<std::string> problem_;
};

}  // namespace appsync::host
