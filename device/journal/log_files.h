#pragma once

#include <cstdint>
#include <filesystem>
#include <functional>
#include <string>

#include "base/file_descriptor.h"
#include "device/journal/records.h"
#include "platform/log.h"
#include "platform/mutex.h"

namespace appsync::device {

/// The device's log: a folder of text files, one line per record (UTC time, level, channel, text,
/// separated by tabs; control characters and backslashes of the text escaped). "device.log" is the
/// newest; full files move on to "device.log.1" up to "device.log.3" and are then dropped. One
/// object of all processes writes; any number may read meanwhile.
class LogFiles final : public Log {
 public:
  static constexpr std::uint64_t FileSize = std::uint64_t{8} << 20;
  static constexpr int OldFiles = 3;

  /// Makes the folder if it is missing and to be written. A record that cannot be kept is dropped;
  /// without `writable` all are. `fileSize` is where a file counts as full.
  LogFiles(const std::filesystem::path& folder, bool writable,
           std::uint64_t fileSize = FileSize) noexcept;

  void write(LogChannel channel, LogLevel level, std::string_view text) noexcept override;

  /// Visits the records kept when the call began, oldest first, on the calling thread. Lines that
  /// are no whole record (a crash tears the last one) are passed over. The visitor may write.
  void read(const std::function<void(const LogLine&)>& visitor) noexcept;

 private:
  void openNewest() noexcept APPSYNC_REQUIRES(mutex_);
  void moveOn() noexcept APPSYNC_REQUIRES(mutex_);
  std::string fileName(int age) const;

  FileDescriptor folder_;
  const bool writable_;
  const std::uint64_t fileSize_;
  Mutex mutex_;
  FileDescriptor newest_ APPSYNC_GUARDED_BY(mutex_);
  std::uint64_t size_ APPSYNC_GUARDED_BY(mutex_) = 0;
  bool torn_ APPSYNC_GUARDED_BY(mutex_) =
      false;  ///< the newest file does not end with a whole line
};

}  // namespace appsync::device
