#include "tests/client/allocations.h"

#include <dlfcn.h>

#include <new>

namespace appsync {

thread_local unsigned allocationsLeft = EndlessAllocations;
thread_local std::size_t allocatedBytes = 0;

}  // namespace appsync

// Stands in front of the one that everything here uses, the plug-in's object too.
void* operator new(std::size_t size) {
  using appsync::allocationsLeft;
  static auto* const next = reinterpret_cast<void* (*)(std::size_t)>(dlsym(RTLD_NEXT, "_Znwm"));
  if (allocationsLeft == 0) throw std::bad_alloc();
  if (allocationsLeft != appsync::EndlessAllocations) --allocationsLeft;
  appsync::allocatedBytes += size;
  return next(size);
}
