// SPDX-License-Identifier: Apache-2.0
// Failures as table rows: what is broken while a call runs, the code that it gives and the last lines that it traces.
#pragma once

#include <gtest/gtest.h>

#include <functional>
#include <string>
#include <type_traits>
#include <vector>

#include "crypto_provider.h"
#include "support.h"

namespace test {

using Lines = std::vector<std::string>;
using Body = std::function<void()>;
using Failure = std::function<void(const Body&)>;

// Runs the body with another value in the slot: a provider entry that fails, an argument that is null.
template <typename T>
Failure replacing(T& slot, std::common_type_t<T> value) {
  return [&slot, value](const Body& body) {
    const Replaced<T> guard(slot, value);
    body();
  };
}

inline Failure failingAllocation(long number) {
  return [number](const Body& body) {
    const AllocationWatch watch(number);
    body();
  };
}

// Runs an operation with each of its allocations failing in turn, and last with none.
inline void sweepAllocations(int good, int bad, const std::function<int()>& run) {
  bool failed = true;
  for (long n = 0; failed && n < 50; ++n) {
    SCOPED_TRACE("allocation " + std::to_string(n));
    const AllocationWatch watch(n);
    const int result = run();
    failed = watch.count() > n;
    EXPECT_EQ(result, failed ? bad : good);
  }
  EXPECT_FALSE(failed) << "never came to an end";
}

inline Failure both(const Failure& first, const Failure& second) {
  return [first, second](const Body& body) { first([&] { second(body); }); };
}

// No provider context, and no provider to make one of; the attempt clears the first entry.
inline Failure withoutProvider() {
  return both(both(replacing(qelCtxGlobal, nullptr), replacing(qelLoadGlobal, nullptr)),
              both(replacing(qelLibraryName, "not_there.so"), replacing(pQEL_GetStatus, nullptr)));
}

// What a call gives and the last line that it traces: without what is usual about it, and with its class unless it is
// of the error class.
inline std::string outcomeOf(const std::string& operation, const std::function<std::string()>& call) {
  const TraceCapture trace(TraceCapture::kLinesOnly);
  const std::string result = call();
  const Lines lines = trace.messages();
  std::string line = lines.empty() ? "" : lines.back();
  const std::string start = "Error - " + operation.substr(0, operation.find(',')) + ": ",
                    end = " rc = " + result + "\n";
  std::string lineClass;
  for (const Record& r : trace.records()) {
    EXPECT_EQ(r.kind, LDTR_LINE);
    if (r.text == line) lineClass = r.severity == LDTR_DEBUG ? "debug: " : "";
  }
  const bool isUsual = line.rfind(start, 0) == 0 && line.size() >= start.size() + end.size() &&
                       line.compare(line.size() - end.size(), end.size(), end) == 0;
  if (isUsual) line = line.substr(start.size(), line.size() - start.size() - end.size());
  return result + " " + lineClass + line;
}

// What a call gives while something is broken, as outcomeOf has it.
struct BrokenCase {
  std::string outcome;
  Failure failure;
};
inline void expectOutcomes(const std::string& operation, const std::vector<BrokenCase>& rows,
                           const std::function<int()>& call) {
  for (const BrokenCase& row : rows) {
    row.failure([&] { EXPECT_EQ(outcomeOf(operation, [&] { return std::to_string(call()); }), row.outcome); });
  }
}

// Digests that do nothing, for failures that lie behind thousands of rounds.
inline Failure withQuickDigests() {
  return both(replacing(pQEL_EVP_DigestInit, [](auto...) { return 1; }),
              both(replacing(pQEL_EVP_DigestUpdate, [](auto...) { return 1; }),
                   replacing(pQEL_EVP_DigestFinal, [](auto...) { return 1; })));
}

// That the lines of the error shape, and they alone, are of the error class.
inline void expectErrorClasses(const TraceCapture& trace) {
  for (const Record& r : trace.records()) {
    const bool isError = r.text.rfind("Error - ", 0) == 0;
    EXPECT_EQ(r.severity, isError ? LDTR_ERROR : LDTR_DEBUG) << r.text;
  }
}

// The trace as one text: entries and exits as > and <, lines whole, addresses as #.
inline std::string outlineOf(const TraceCapture& trace) {
  std::string outline;
  for (const Record& r : trace.records()) {
    std::string text = r.kind == LDTR_ENTRY ? ">" : r.kind == LDTR_EXIT ? "<" : r.text;
    for (size_t at = text.find("0x"); at != std::string::npos; at = text.find("0x", at)) {
      text.replace(at, text.find_first_not_of("0123456789abcdef", at + 2) - at, "#");
    }
    outline += text;
  }
  return outline;
}

}  // namespace test
