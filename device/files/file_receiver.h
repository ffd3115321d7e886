#pragma once

#include <memory>
#include <optional>
#include <string_view>

#include "platform/bytes.h"
#include "platform/error.h"

namespace appsync::device {

class ConfinedFileManager;

/// A file that is being sent to the phone piece by piece. Destroying it before `finish` removes
/// what has arrived. Used by one thread.
class FileReceiver {
 public:
  virtual ~FileReceiver() = default;
  virtual bool append(ByteView bytes, std::optional<Error>* error) noexcept = 0;
  /// The file is whole. False when it could not be completed.
  virtual bool finish(std::optional<Error>* error) noexcept = 0;
};

/// Begins a file at a path of the phone; missing parents are made. The bytes arrive under a
/// temporary name beside the target and take its place, on disk, in one step when it is finished.
/// nullptr with an error when it cannot begin. The receiver does not need `files` to live on.
std::unique_ptr<FileReceiver> receiveInto(ConfinedFileManager& files, std::string_view path,
                                          std::optional<Error>* error) noexcept;

}  // namespace appsync::device
