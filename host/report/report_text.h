#pragma once

#include <map>
#include <set>
#include <string>

#include "host/report/report.h"
#include "host/report/status_line.h"

namespace appsync::host {

/// Lines for people; on a terminal with colour and a progress bar. Used by one thread at a time.
class TextReporter : public Reporter {
 public:
  TextReporter(Output& output, Output& errorOutput, const ReportOptions& options, bool terminal,
               bool colour);
  void report(const Event& event) override;

 private:
  /// How a word is shown on a terminal that can do so.
  struct Style {
    static constexpr std::string_view Plain = "";
    static constexpr std::string_view Good = "\x1b[32m";
    static constexpr std::string_view Bad = "\x1b[31m";
    static constexpr std::string_view Warning = "\x1b[33m";
    static constexpr std::string_view Dim = "\x1b[2m";
  };

  void tell(const PackageProblem& event);
  void tell(const PlannedEntry& event);
  void tell(const PlaceholderSwept& event);
  void tell(const DeletedOnPhone& event);
  void tell(const TransferProgress& event);
  void tell(const TransferEnded& event);
  void tell(const DataProgress& event);
  void tell(const DataEnded& event);
  void tell(const SavingProgress& event);
  void tell(const ApplicationSaved& event);
  void tell(const PlaceholderStands& event);
  void tell(const Notice& event);
  void tell(const InstallWaiting& event);
  void tell(const InstallEnded& event);
  void tell(const ClientLogLine& event);
  void tell(const Interrupted& event);
  void tell(const SyncBroken& event);
  void tell(const Summary& event);
  void tell(const BackupSummary& event);
  void tellCounts(const Summary& event);

  /// "word       rest", the word in the style's colour.
  void print(std::string_view style, std::string_view word, const std::string& rest);
  void printError(std::string_view word, const std::string& rest);
  /// Name, version and identifier as far as the plan told them.
  std::string subject(const std::string& identifier) const;
  void showInstalling();
  void showBytes(const std::string& what, std::uint64_t bytes, std::uint64_t total);

  Output& errorOutput_;
  const ReportOptions options_;
  const bool colour_;
  StatusLine status_;
  std::map<std::string, PlannedEntry> planned_;
  std::set<std::string> installing_;
};

}  // namespace appsync::host
