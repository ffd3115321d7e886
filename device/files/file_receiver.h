#pragma once

#include <memory>
#include <optional>
#include <string_view>

#include "phone/phone.h"

namespace appsync::device {

class ConfinedFileManager;

/// Begins a file at a path of the phone; missing parents are made. The bytes arrive under a
/// temporary name beside the target and take its place, on disk, in one step when it is finished.
/// nullptr with an error when it cannot begin. The receiver does not need `files` to live on.
[[nodiscard]] std::unique_ptr<FileReceiver> receiveInto(ConfinedFileManager& files,
                                                        std::string_view path,
                                                        std::optional<Error>* error) noexcept;

}  // namespace appsync::device
