#pragma once

#include <functional>

namespace appsync::fakes {

/// Runs `body` in a forked process; its exit status, or 128 and the signal that ended it.
int inOtherProcess(const std::function<int()>& body);

}  // namespace appsync::fakes
