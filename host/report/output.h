#pragma once

#include <string_view>

#include "platform/mutex.h"

namespace appsync::host {

/// Standard output or standard error, written without a buffer so that lines of several threads and
/// of a killed process stay whole. Used from any thread.
class Output {
 public:
  explicit Output(int fd) : fd_(fd) {}
  Output(const Output&) = delete;
  Output& operator=(const Output&) = delete;

  /// Writes all of it. After a failure everything is dropped.
  void write(std::string_view text);
  void line(std::string_view text);

  /// The errno value of the failure that closed this output; 0 while all is well.
  int error() const;
  bool isTerminal() const;
  /// Columns of the terminal; 80 when it does not say.
  std::size_t width() const;

 private:
  const int fd_;
  mutable Mutex mutex_;
  int error_ APPSYNC_GUARDED_BY(mutex_) = 0;
};

/// Opens on /dev/null what this process was started without of standard input, output and error:
/// else the first files opened would take their places, and be written into. Called before anything
/// is opened. False when that cannot be done.
[[nodiscard]] bool openStandardDescriptors();

}  // namespace appsync::host
