#pragma once

#include <string>

#include "host/report/output.h"

namespace appsync::host {

/// The last line of a terminal, rewritten in place; nothing where there is no terminal. Used by one
/// thread at a time.
class StatusLine {
 public:
  StatusLine(Output& output, bool enabled);
  ~StatusLine();
  StatusLine(const StatusLine&) = delete;
  StatusLine& operator=(const StatusLine&) = delete;

  /// "label  ████░░░░  45%  tail", as wide as the terminal allows.
  void showBar(const std::string& label, double fraction, const std::string& tail);
  void showText(const std::string& text);
  /// Writes a line that stays, above the status.
  void print(const std::string& line);
  /// Takes the status away and shows the cursor again.
  void clear();

 private:
  void draw(std::string text);

  Output& output_;
  const bool enabled_;
  const bool unicode_;
  std::string shown_;
};

}  // namespace appsync::host
