// SPDX-License-Identifier: Apache-2.0
// Time and memory: an export of a beginning and a piece that comes again and again, each time with its number in the
// place of a '%'. With four times as many pieces the command may take some four times as much; what looks at each pair
// of them takes sixteen times, and is a find.
#include <sys/mman.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <ctime>
#include <vector>

#include "command_line.h"
#include "fuzz_input.h"

extern "C" int __sanitizer_install_malloc_and_free_hooks(void (*taken)(const volatile void*, size_t),
                                                         void (*released)(const volatile void*));

using namespace fuzz;

namespace {

constexpr size_t kFewTimes = 250;
constexpr size_t kManyTimes = 4 * kFewTimes;
constexpr double kMost = 8;                      // times as much; four is linear
constexpr double kFreeSeconds = 0.02;            // what a start takes, and the clock's steps
constexpr double kFreeBytes = double{16 << 20};  // buffers that are there for any input

std::atomic<size_t> takenBytes;

struct Spent {
  double seconds;
  double bytes;
};

class File {
 public:
  int descriptor() const { return descriptor_; }
  std::string path() const { return "/proc/self/fd/" + std::to_string(descriptor_); }
  void write(const std::string& content) const {
    const auto size = static_cast<off_t>(content.size());
    require(ftruncate(descriptor_, 0) == 0 && pwrite(descriptor_, content.data(), content.size(), 0) == size);
    require(lseek(descriptor_, 0, SEEK_SET) == 0);
  }

 private:
  int descriptor_ = memfd_create("fuzz", 0);
};

std::string repeated(std::string_view piece, size_t times) {
  std::string text;
  for (size_t i = 0; i < times; ++i) {
    for (const char c : piece) c == '%' ? text += std::to_string(i) : text += c;
  }
  return text;
}

Spent spend(std::vector<std::string> arguments) {
  std::vector<char*> pointers;
  for (std::string& argument : arguments) pointers.push_back(argument.data());
  pointers.push_back(nullptr);
  takenBytes = 0;
  const std::clock_t before = std::clock();
  tool::runCommand(static_cast<int>(arguments.size()), pointers.data());
  return {static_cast<double>(std::clock() - before) / CLOCKS_PER_SEC, static_cast<double>(takenBytes)};
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  static const File in;
  static const File batch;
  static const File out;
  static const bool isReady =
      dup2(out.descriptor(), STDOUT_FILENO) == STDOUT_FILENO &&
      __sanitizer_install_malloc_and_free_hooks([](const volatile void*, size_t bytes) { takenBytes += bytes; },
                                                [](const volatile void*) {}) != 0;
  static const std::vector<std::string> kRuns[] = {
      {"ldappw", "ldif", "--to", "sha", "--threads", "1", in.path()},
      {"ldappw", "ldif", "--to", "qveil", "--fix", "--changes", "--threads", "1", in.path()},
      {"ldappw", "audit", "--threads", "1", in.path()},
      {"ldappw", "audit", "--json", "--accept", "ssha", "--threads", "1", in.path()},
      {"ldappw", "ldif", "--audit", "--verbose", "--threads", "1", in.path()},
      {"ldappw", "verify", "--clear", "--ldif", in.path(), "--batch", batch.path()},
  };
  require(isReady);
  Input input(data, size);
  const std::vector<std::string>& run = kRuns[input.byte() % std::size(kRuns)];
  const std::string beginning(input.counted());
  const std::string line(input.counted());
  const std::string piece(input.rest());
  const auto cost = [&](size_t times) {
    in.write(beginning + repeated(piece, times));
    batch.write(repeated(line, times));
    out.write("");
    return spend(run);
  };
  // A clock can be late once, and is not always.
  for (int tries = 0; tries < 3; ++tries) {
    const Spent few = cost(kFewTimes);
    const Spent many = cost(kManyTimes);
    require(many.bytes <= kMost * few.bytes + kFreeBytes);
    if (many.seconds <= kMost * few.seconds + kFreeSeconds) return 0;
  }
  require(false);
  return 0;
}
