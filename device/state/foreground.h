#pragma once

#include <filesystem>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "base/file_descriptor.h"
#include "platform/error.h"
#include "platform/home_screen_service.h"

namespace appsync::device {

/// Which applications run in the foreground and which are kept from it. Kept in a directory of its
/// own, for several processes at once: "<identifier>.running" stands while the application runs;
/// "<identifier>.held" is locked by whoever keeps it from running, so that a killed process keeps
/// nothing back. Identifiers must be usable. Thread-safe.
class Foreground {
 public:
  explicit Foreground(std::filesystem::path directory) : directory_(std::move(directory)) {}

  std::vector<std::string> running() const;

  /// Brings the application to the foreground if `objection`, asked while nobody else can change
  /// anything here, has none.
  [[nodiscard]] bool launch(const std::string& identifier,
                            const std::function<std::optional<Error>()>& objection,
                            std::optional<Error>* error) const;
  /// Ending an application that does not run is no failure.
  [[nodiscard]] bool quit(const std::string& identifier, std::optional<Error>* error) const;

  struct HoldResult {
    std::unique_ptr<TerminationAssertion> hold;  ///< nullptr when it runs or on failure
    bool isRunning = false;
  };
  /// Keeps the application from running for as long as the hold lives.
  HoldResult hold(const std::string& identifier) const;

  /// Removes what killed processes left.
  void sweep() const;

 private:
  std::filesystem::path directory_;
};

}  // namespace appsync::device
