// SPDX-License-Identifier: Apache-2.0
#include "schemes/memory_budget.h"

#include <unistd.h>

#include <condition_variable>
#include <mutex>

namespace tool {
namespace {

std::uint64_t quarterOfMachine() noexcept {
  const long pages = sysconf(_SC_PHYS_PAGES);
  const long pageBytes = sysconf(_SC_PAGESIZE);
  constexpr std::uint64_t kUnknownMachine = std::uint64_t{1} << 30;
  if (pages <= 0 || pageBytes <= 0) return kUnknownMachine;
  return static_cast<std::uint64_t>(pages) * static_cast<std::uint64_t>(pageBytes) / 4;
}

struct Budget {
  std::mutex mutex;
  std::condition_variable freed;
  std::uint64_t most = quarterOfMachine();
  std::uint64_t used = 0;
};

Budget& budget() {
  static Budget one;
  return one;
}

}  // namespace

MemoryShare::MemoryShare(std::uint64_t bytes) : bytes_(bytes) {
  Budget& all = budget();
  std::unique_lock<std::mutex> lock(all.mutex);
  granted_ = bytes <= all.most;
  if (!granted_) return;
  all.freed.wait(lock, [&] { return all.used <= all.most - bytes; });
  all.used += bytes;
}

MemoryShare::~MemoryShare() {
  if (!granted_) return;
  Budget& all = budget();
  {
    const std::lock_guard<std::mutex> lock(all.mutex);
    all.used -= bytes_;
  }
  all.freed.notify_all();
}

void setMemoryLimit(std::uint64_t mebibytes) {
  const std::lock_guard<std::mutex> lock(budget().mutex);
  budget().most = mebibytes << 20;
}

}  // namespace tool
