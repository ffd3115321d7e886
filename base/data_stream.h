#pragma once

#include <cstdint>
#include <functional>

#include "platform/bytes.h"

namespace appsync {

/// Takes the next bytes; false to end with the sink's own reason.
using DataSink = std::function<bool(ByteView bytes)>;

/// Fills in the next bytes and gives their number; 0 at the end, -1 when there is no going on.
using DataSource = std::function<std::int64_t(std::uint8_t* bytes, std::size_t size)>;

}  // namespace appsync
