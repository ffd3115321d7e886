#pragma once

#include <thread>

namespace appsync {

/// Whether something happens while the other threads get many turns: for what must not happen and
/// would happen at once if nothing held it back.
template <typename Seen>
bool seenInTurns(Seen seen) {
  for (int turn = 0; turn < 2000; ++turn) {
    if (seen()) return true;
    std::this_thread::yield();
  }
  return seen();
}

}  // namespace appsync
