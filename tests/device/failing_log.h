#pragma once

namespace appsync::device {

/// Lets a flush of the databases' write-ahead logs fail. Databases that are to be hit must be
/// opened after `prepare`.
class FailingLog {
 public:
  enum class Disk {
    Falters,  ///< only the next flush fails
    IsFull    ///< nor can anything be written after it, for as long as this lives
  };

  static void prepare();

  explicit FailingLog(Disk disk);
  ~FailingLog();
  FailingLog(const FailingLog&) = delete;
  FailingLog& operator=(const FailingLog&) = delete;
};

}  // namespace appsync::device
