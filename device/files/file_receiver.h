#pragma once

#include <memory>
#include <optional>
#include <string_view>

#include "device/base/device_types.h"
#include "device/files/file_manager.h"

namespace appsync::device {

/// Begins a file at a path of the phone; missing parents are made. The bytes arrive under a
/// temporary name beside the target and take its place, on disk, in one step when it is finished.
/// nullptr with an error when it cannot begin. The receiver does not need `files` to live on.
std::unique_ptr<FileReceiver> receiveInto(ConfinedFileManager& files, std::string_view path,
                                          std::optional<Error>* error) noexcept;

}  // namespace appsync::device
