#include "bench/memory.h"

#include <malloc.h>

#include <algorithm>
#include <atomic>
#include <cstdlib>
#include <new>

namespace appsync::bench {
namespace {

std::atomic<std::size_t> held = 0;
std::atomic<std::size_t> mostHeld = 0;

}  // namespace

MemoryMeter::MemoryMeter() : before_(held) { mostHeld = before_; }
std::size_t MemoryMeter::most() const { return mostHeld - before_; }

}  // namespace appsync::bench

void* operator new(std::size_t size) {
  using namespace appsync::bench;
  void* memory = std::malloc(size);
  if (!memory) throw std::bad_alloc();
  const std::size_t now = held += malloc_usable_size(memory);
  mostHeld = std::max<std::size_t>(mostHeld, now);  // a rare race costs a figure some bytes
  return memory;
}

void operator delete(void* memory) noexcept {
  appsync::bench::held -= malloc_usable_size(memory);
  std::free(memory);
}

void operator delete(void* memory, std::size_t) noexcept { operator delete(memory); }
