#pragma once

namespace appsync {

/// What of a file that has been written survives.
enum class Durability {
  Cached,  ///< a crash of the machine may lose it
  Durable  ///< on disk before the call returns
};

}  // namespace appsync
