#pragma once

namespace appsync::device {

/// Lets one of the calls that the device makes to the system fail: one that opens something with
/// "too many open files", any other with "input/output error". Calls of this thread only; those of
/// the database's own library are not among them.
class FailingCalls {
 public:
  /// Counts calls from now on and lets the one of this number, from 0, fail.
  explicit FailingCalls(int number);
  ~FailingCalls();
  FailingCalls(const FailingCalls&) = delete;
  FailingCalls& operator=(const FailingCalls&) = delete;

  /// Whether that call was made.
  bool struck() const;
};

}  // namespace appsync::device
